#include "platform/system/FolderSubmittableLogs.h"

#include <gtest/gtest.h>

#include <cerrno>
#include <filesystem>

#include "tests/platform/system/Expect.h"
#include "tests/support/ScratchFolder.h"

namespace telvane {
namespace {

namespace fs = std::filesystem;
using telvane::testing::failsWith;
using telvane::testing::succeeds;

constexpr char kLog[] = "/var/logs/one.ips";
constexpr char kLogBelowRoot[] = "root/var/logs/one.ips";
constexpr char kArea[] = "root/var/mobile/Library/Logs/CrashReporter/Submission";
constexpr char kSubmitted[] = "root/var/mobile/Library/Logs/CrashReporter/Submission/one.ips";

class FolderSubmittableLogsTest : public ::testing::Test {
 protected:
  Result<void> create() { return _logs.createTemporaryLog("224", kLog); }
  Result<void> submit() { return _logs.moveToSubmissionArea("224", kLog); }
  bool exists(const char* name) { return fs::exists(fs::symlink_status(_folder.at(name))); }

  testing::ScratchFolder _folder;
  FolderSubmittableLogs _logs{Paths{.root = _folder.at("root"), .home = _folder.at("home")}};
};

TEST_F(FolderSubmittableLogsTest, makesAnEmptyFileForItsOwnerOnlyWithItsFolder) {
  ASSERT_TRUE(succeeds(create()));
  EXPECT_EQ(fs::file_size(_folder.at(kLogBelowRoot)), 0u);
  EXPECT_EQ(fs::status(_folder.at(kLogBelowRoot)).permissions(), fs::perms(0600));
}

TEST_F(FolderSubmittableLogsTest, makesNothingWhereSomethingStands) {
  _folder.write(kLogBelowRoot, "old");
  EXPECT_TRUE(failsWith(create(), EEXIST));
  EXPECT_EQ(_folder.read(kLogBelowRoot), "old");
}

TEST_F(FolderSubmittableLogsTest, makesNothingThroughALink) {
  fs::create_directories(_folder.at("root/var/logs"));
  fs::create_symlink(_folder.at("elsewhere"), _folder.at(kLogBelowRoot));
  EXPECT_TRUE(failsWith(create(), EEXIST));
  EXPECT_FALSE(exists("elsewhere"));
}

TEST_F(FolderSubmittableLogsTest, tellsWhyAFileCannotBeMade) {
  _folder.write("root/var/logs", "a file in the folder's place");
  EXPECT_TRUE(failsWith(create(), EEXIST));
}

TEST_F(FolderSubmittableLogsTest, movesALogIntoTheAreaWhichItMakes) {
  _folder.write(kLogBelowRoot, "text");
  ASSERT_TRUE(succeeds(submit()));
  EXPECT_EQ(_folder.read(kSubmitted), "text");
  EXPECT_FALSE(exists(kLogBelowRoot));
}

TEST_F(FolderSubmittableLogsTest, keepsWhatIsInTheArea) {
  _folder.write(kSubmitted, "earlier");
  _folder.write(kLogBelowRoot, "later");
  EXPECT_TRUE(failsWith(submit(), EEXIST));
  EXPECT_EQ(_folder.read(kSubmitted), "earlier");
  EXPECT_EQ(_folder.read(kLogBelowRoot), "later");
}

TEST_F(FolderSubmittableLogsTest, aLinkInTheAreaIsNeitherFollowedNorReplaced) {
  _folder.write("elsewhere", "precious");
  fs::create_directories(_folder.at(kArea));
  fs::create_symlink(_folder.at("elsewhere"), _folder.at(kSubmitted));
  _folder.write(kLogBelowRoot, "text");
  EXPECT_TRUE(failsWith(submit(), EEXIST));
  EXPECT_EQ(_folder.read("elsewhere"), "precious");
  EXPECT_EQ(_folder.read(kLogBelowRoot), "text");
}

TEST_F(FolderSubmittableLogsTest, anAreaThatIsALinkTakesNothing) {
  fs::create_directories(_folder.at("elsewhere"));
  fs::create_directories(fs::path(_folder.at(kArea)).parent_path());
  fs::create_directory_symlink(_folder.at("elsewhere"), _folder.at(kArea));
  _folder.write(kLogBelowRoot, "text");
  EXPECT_FALSE(submit().has_value());
  EXPECT_TRUE(fs::is_empty(_folder.at("elsewhere")));
  EXPECT_EQ(_folder.read(kLogBelowRoot), "text");
}

TEST_F(FolderSubmittableLogsTest, submitsRegularFilesOnly) {
  EXPECT_TRUE(failsWith(submit(), ENOENT));
  _folder.write("elsewhere", "secret");
  fs::create_directories(_folder.at("root/var/logs"));
  fs::create_symlink(_folder.at("elsewhere"), _folder.at(kLogBelowRoot));
  EXPECT_TRUE(failsWith(submit(), EINVAL));
  fs::remove(_folder.at(kLogBelowRoot));
  fs::create_directory(_folder.at(kLogBelowRoot));
  EXPECT_TRUE(failsWith(submit(), EINVAL));
  EXPECT_FALSE(exists(kSubmitted));
}

TEST_F(FolderSubmittableLogsTest, tellsWhyTheAreaCannotBeMade) {
  _folder.write("root/var/mobile", "a file in the folder's place");
  _folder.write(kLogBelowRoot, "text");
  EXPECT_TRUE(failsWith(submit(), ENOTDIR));
  EXPECT_EQ(_folder.read(kLogBelowRoot), "text");
}

}  // namespace
}  // namespace telvane
