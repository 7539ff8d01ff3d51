#include "platform/system/ReceivedFile.h"

#include <gtest/gtest.h>
#include <sys/stat.h>

#include <cerrno>
#include <filesystem>
#include <set>

#include "tests/platform/system/Expect.h"
#include "tests/support/ScratchFolder.h"

namespace telvane::testing {
namespace {

class ReceivedFileTest : public ::testing::Test {
 protected:
  std::string folder() const { return _scratch.at("a/folder"); }
  // The names in the folder, hidden ones included.
  std::set<std::string> listing() const {
    std::set<std::string> names;
    for (const auto& entry : std::filesystem::directory_iterator(folder())) names.insert(entry.path().filename());
    return names;
  }
  std::unique_ptr<ReceivedFile> received(std::string_view content) const {
    Result<std::unique_ptr<ReceivedFile>> file = ReceivedFile::begin(folder());
    EXPECT_TRUE(succeeds(file));
    EXPECT_TRUE(succeeds((*file)->append(content)));
    return std::move(*file);
  }
  ScratchFolder _scratch;
};

TEST_F(ReceivedFileTest, isThereUnderItsNameOnceItIsWhole) {
  auto file = received("one ");
  EXPECT_EQ(listing(), std::set<std::string>()) << "a killed process would leave it behind";
  EXPECT_TRUE(succeeds(file->append("two")));
  EXPECT_EQ(file->size(), 7u);
  EXPECT_EQ(*file->keepAs("log"), "log");
  file.reset();
  EXPECT_EQ(listing(), std::set<std::string>{"log"});
  EXPECT_EQ(_scratch.read("a/folder/log"), "one two");
  struct stat status {};
  ASSERT_EQ(::stat(_scratch.at("a/folder/log").c_str(), &status), 0);
  EXPECT_EQ(status.st_mode & 07777, 0600u);
}

TEST_F(ReceivedFileTest, leavesNothingBehindWhenItIsNotKept) {
  received("half of it").reset();
  EXPECT_EQ(listing(), std::set<std::string>());
}

TEST_F(ReceivedFileTest, overwritesNothing) {
  for (const char* content : {"1", "2", "3"}) EXPECT_TRUE(succeeds(received(content)->keepAs("log")));
  EXPECT_EQ(listing(), (std::set<std::string>{"log", "2-log", "3-log"}));
  EXPECT_EQ(_scratch.read("a/folder/log"), "1");
  EXPECT_EQ(_scratch.read("a/folder/2-log"), "2");
  EXPECT_EQ(_scratch.read("a/folder/3-log"), "3");
}

TEST_F(ReceivedFileTest, doesNotFollowALinkOfThatName) {
  auto file = received("x");
  std::filesystem::create_symlink(_scratch.at("elsewhere"), _scratch.at("a/folder/log"));
  EXPECT_EQ(*file->keepAs("log"), "2-log");
  EXPECT_FALSE(std::filesystem::exists(_scratch.at("elsewhere")));
}

TEST_F(ReceivedFileTest, isHiddenWhereThereAreNoFilesWithoutAName) {
  std::filesystem::create_directories(folder());
  for (const char* kept : {"log", "2-log"}) {
    auto file = ReceivedFile::beginUnderHiddenName(folder());
    ASSERT_TRUE(succeeds(file));
    EXPECT_TRUE(succeeds((*file)->append("text")));
    const std::set<std::string> before = listing();
    EXPECT_TRUE(before.begin()->starts_with(".receiving-")) << *before.begin();
    EXPECT_EQ(*(*file)->keepAs("log"), kept);
  }
  ReceivedFile::beginUnderHiddenName(folder()).value().reset();
  EXPECT_EQ(listing(), (std::set<std::string>{"log", "2-log"}));
  EXPECT_EQ(_scratch.read("a/folder/2-log"), "text");
}

TEST_F(ReceivedFileTest, saysWhenThereCanBeNone) {
  _scratch.write("a/folder", "a file in the folder's place");
  EXPECT_FALSE(ReceivedFile::begin(folder()).has_value());
  EXPECT_TRUE(failsWith(ReceivedFile::begin("/proc/nothing"), ENOENT));
}

}  // namespace
}  // namespace telvane::testing
