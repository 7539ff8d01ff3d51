#include "collector/UploadStore.h"

#include <gmock/gmock.h>
#include <gtest/gtest.h>

#include <filesystem>
#include <set>
#include <vector>

#include "tests/support/ScratchFolder.h"

namespace telvane::testing {
namespace {

using ::testing::ElementsAre;

class UploadStoreTest : public ::testing::Test {
 protected:
  // Takes an upload that comes in these pieces.
  HTTPServer::Response take(UploadStore::Kind kind, const std::string& target, const std::vector<std::string>& pieces) {
    HTTPServer::Request request;
    request.method = "POST";
    request.target = target;
    request.sink = _store.newSink();
    for (const std::string& piece : pieces) {
      EXPECT_EQ(request.sink->take(piece), 0);
    }
    return _store.take(kind, request);
  }
  std::set<std::string> listing() const {
    std::set<std::string> names;
    for (const auto& entry : std::filesystem::recursive_directory_iterator(_scratch.path())) {
      names.insert(entry.path().lexically_relative(_scratch.path()).string());
    }
    return names;
  }
  static std::string text(const HTTPServer::Response& response) { return std::string(response.body.view()); }

  ScratchFolder _scratch;
  std::vector<std::string> _lines;
  UploadStore _store{_scratch.at("uploads"), [this](const std::string& line) { _lines.push_back(line); }};
};

TEST_F(UploadStoreTest, keepsAFileAsItCameUnderItsName) {
  const auto response =
      take(UploadStore::Kind::File, "/upload?uuid=device 1&filename=a%20log.gz&raw=true", {"on", "e"});
  EXPECT_EQ(response.status, 200);
  EXPECT_EQ(text(response), R"({"result":"success","file":"a_log.gz","bytes":3})");
  EXPECT_EQ(_scratch.read("uploads/a_log.gz"), "one");
  EXPECT_THAT(_lines, ElementsAre("upload a_log.gz 3 bytes from device_1"));
  EXPECT_EQ(_store.files(), 1u);
  EXPECT_EQ(_store.logData(), 0u);
  EXPECT_EQ(_store.bytes(), 3u);
}

TEST_F(UploadStoreTest, keepsLogDataAndAnswersWhere) {
  for (const char* name : {"logdata.plist", "2-logdata.plist"}) {
    const auto response = take(UploadStore::Kind::LogData, "/logdata?filename=ignored", {"bplist00"});
    EXPECT_EQ(response.status, 200);
    EXPECT_EQ(text(response), std::string("/uploads/") + name);
    EXPECT_EQ(_scratch.read(std::string("uploads/") + name), "bplist00");
  }
  EXPECT_THAT(_lines, ElementsAre("logdata logdata.plist 8 bytes", "logdata 2-logdata.plist 8 bytes"));
  EXPECT_EQ(_store.logData(), 2u);
  EXPECT_EQ(_store.bytes(), 16u);
}

TEST_F(UploadStoreTest, writesNothingOutsideItsFolder) {
  for (const char* name : {"../out", "..%2Fout", "%2Ftmp%2Fout", "uploads/../../out", "..", "."}) {
    EXPECT_EQ(take(UploadStore::Kind::File, std::string("/upload?filename=") + name + "&raw=true", {"x"}).status, 200);
  }
  for (const std::string& path : listing()) EXPECT_TRUE(path == "uploads" || path.starts_with("uploads/")) << path;
  EXPECT_EQ(listing().size(), 7u);
}

TEST_F(UploadStoreTest, keepsNothingOfAnUploadThatBreaksOff) {
  {
    const auto sink = _store.newSink();
    EXPECT_EQ(sink->take("half"), 0);
  }
  EXPECT_EQ(listing(), std::set<std::string>{"uploads"});
  EXPECT_EQ(_store.files(), 0u);
}

TEST_F(UploadStoreTest, refusesAnUploadWithoutABodyOrRoom) {
  HTTPServer::Request request;
  request.target = "/upload?filename=x";
  EXPECT_EQ(_store.take(UploadStore::Kind::File, request).status, 400);
  UploadStore nowhere("/proc/nothing", nullptr);
  request.sink = nowhere.newSink();
  EXPECT_EQ(request.sink->take("x"), 500);
  EXPECT_EQ(nowhere.take(UploadStore::Kind::File, request).status, 500);
  EXPECT_EQ(nowhere.files(), 0u);
}

// A device takes any text for the location of its log data.
TEST_F(UploadStoreTest, refusesLogDataWithoutAWord) {
  HTTPServer::Request request;
  request.target = "/logdata";
  const auto withoutABody = _store.take(UploadStore::Kind::LogData, request);
  EXPECT_EQ(withoutABody.status, 400);
  EXPECT_EQ(text(withoutABody), "");
  UploadStore nowhere("/proc/nothing", [this](const std::string& line) { _lines.push_back(line); });
  request.sink = nowhere.newSink();
  EXPECT_EQ(request.sink->take("x"), 500);
  const auto withoutAFile = nowhere.take(UploadStore::Kind::LogData, request);
  EXPECT_EQ(withoutAFile.status, 500);
  EXPECT_EQ(text(withoutAFile), "");
  UploadStore store(_scratch.at("gone"), nullptr);
  request.sink = store.newSink();
  ASSERT_EQ(request.sink->take("x"), 0);
  std::filesystem::remove_all(_scratch.at("gone"));
  const auto withoutAFolder = store.take(UploadStore::Kind::LogData, request);
  EXPECT_EQ(withoutAFolder.status, 500);
  EXPECT_EQ(text(withoutAFolder), "");
  EXPECT_THAT(_lines, ElementsAre(::testing::StartsWith("an upload was lost: "))) << "here it is said why";
}

TEST_F(UploadStoreTest, neverSaysTheWordThatDeletesAFileThatIsNotKept) {
  UploadStore store(_scratch.at("success"), nullptr);
  HTTPServer::Request request;
  request.target = "/upload?filename=success.log";
  request.sink = store.newSink();
  ASSERT_EQ(request.sink->take("x"), 0);
  std::filesystem::remove_all(_scratch.at("success"));
  const auto response = store.take(UploadStore::Kind::File, request);
  EXPECT_EQ(response.status, 500);
  EXPECT_EQ(text(response).find("success"), std::string::npos) << text(response);
}

TEST_F(UploadStoreTest, refusesEverythingWithoutAFolder) {
  UploadStore none("", nullptr);
  HTTPServer::Request request;
  EXPECT_EQ(none.take(UploadStore::Kind::File, request).status, 403) << "without a body";
  EXPECT_EQ(text(none.take(UploadStore::Kind::LogData, request)), "");
  request.sink = none.newSink();
  ASSERT_NE(request.sink, nullptr) << "a body that is gathered has a bound";
  for (int i = 0; i < 1000; ++i) EXPECT_EQ(request.sink->take(std::string(1000, 'x')), 0);
  const auto ofAFile = none.take(UploadStore::Kind::File, request);
  EXPECT_EQ(ofAFile.status, 403);
  EXPECT_EQ(text(ofAFile), "uploads are not taken; start with --uploads FOLDER\n");
  const auto ofLogData = none.take(UploadStore::Kind::LogData, request);
  EXPECT_EQ(ofLogData.status, 403);
  EXPECT_EQ(text(ofLogData), "") << "a text would be their location";
  EXPECT_EQ(none.bytes(), 0u);
  EXPECT_EQ(listing(), std::set<std::string>());
}

}  // namespace
}  // namespace telvane::testing
