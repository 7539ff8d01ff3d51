#include "collector/StorebagFolder.h"

#include <gmock/gmock.h>
#include <gtest/gtest.h>

#include "platform/system/PosixFileSystem.h"
#include "tests/support/Matchers.h"
#include "tests/support/ScratchFolder.h"

namespace telvane::testing {
namespace {

class StorebagFolderTest : public ::testing::Test {
 protected:
  StorebagFolderTest() {
    _scratch.write("bags/media", "the bag");
    _scratch.write("secret", "not for the world");
  }
  HTTPServer::Response ask(std::string_view name, std::vector<HTTPServer::Header> headers = {}) {
    HTTPServer::Request request;
    request.method = "GET";
    request.target = "/storebags/" + std::string(name);
    request.headers = std::move(headers);
    return _folder.answer(name, request);
  }
  static std::string lastModified(const HTTPServer::Response& response) {
    for (const auto& header : response.headers) {
      if (header.name == "Last-Modified") return header.value;
    }
    return "";
  }

  ScratchFolder _scratch;
  PosixFileSystem _files{Paths{}};
  StorebagFolder _folder{_files, _scratch.at("bags"), std::chrono::seconds(600)};
};

TEST_F(StorebagFolderTest, servesABagAsItIsWithItsDateAndFreshness) {
  const auto response = ask("media");
  EXPECT_EQ(response.status, 200);
  EXPECT_EQ(response.body.view(), "the bag");
  EXPECT_THAT(response, HasHeader("Cache-Control", "max-age=600"));
  EXPECT_THAT(lastModified(response), ::testing::EndsWith(" GMT"));
}

TEST_F(StorebagFolderTest, answersNotModifiedToWhoKnowsTheDate) {
  const auto response = ask("media", {{"if-modified-since", lastModified(ask("media"))}});
  EXPECT_EQ(response.status, 304);
  EXPECT_TRUE(response.body.empty());
  EXPECT_THAT(response, HasHeader("Cache-Control", "max-age=600"));
}

TEST_F(StorebagFolderTest, servesTheBagToWhoKnowsAnotherDate) {
  for (const char* known : {"Thu, 01 Jan 1970 00:00:00 GMT", "garbage", ""}) {
    EXPECT_EQ(ask("media", {{"If-Modified-Since", known}}).status, 200) << known;
  }
}

TEST_F(StorebagFolderTest, readsTheBagAnewAtEachRequest) {
  EXPECT_EQ(ask("media").body.view(), "the bag");
  _scratch.write("bags/media", "a newer bag");
  EXPECT_EQ(ask("media").body.view(), "a newer bag");
}

TEST_F(StorebagFolderTest, hasNoBagThatIsNotThere) { EXPECT_EQ(ask("audio").status, 404); }

TEST_F(StorebagFolderTest, servesFilesOnly) {
  _scratch.write("bags/folder/inside", "x");
  EXPECT_EQ(ask("folder").status, 404);
}

TEST_F(StorebagFolderTest, letsNoNameLeadOutOfTheFolder) {
  const std::string null("media\0x", 7);
  const std::string names[] = {"",
                               ".",
                               "..",
                               "../secret",
                               "..%2fsecret",
                               "%2e%2e/secret",
                               "/etc/passwd",
                               "..\\secret",
                               ".hidden",
                               "media/../../secret",
                               "a/b",
                               null};
  for (const std::string& name : names) {
    const auto response = ask(name);
    EXPECT_EQ(response.status, 404) << name;
    EXPECT_EQ(response.body.view().find("not for the world"), std::string_view::npos) << name;
  }
  EXPECT_EQ(ask(std::string(100000, 'a')).status, 404);
}

}  // namespace
}  // namespace telvane::testing
