#include "platform/system/FolderClientBundle.h"

#include <gtest/gtest.h>

#include "platform/PropertyList.h"
#include "tests/platform/system/Expect.h"
#include "tests/support/RecordingLog.h"
#include "tests/support/ScratchFolder.h"

namespace telvane {
namespace {

using telvane::testing::RecordingLog;
using telvane::testing::textOf;

class FolderClientBundleTest : public ::testing::Test {
 protected:
  void givenInformation(const Value& content) {
    _folder.write("Info.plist", propertylist::serialize(content, propertylist::Format::XML)->view());
  }

  testing::ScratchFolder _folder;
  RecordingLog _log;
  FolderClientBundle _bundle{_folder.path(), _log};
};

TEST_F(FolderClientBundleTest, tellsItsVersionAndKey) {
  givenInformation(Dictionary{{"CFBundleIdentifier", "com.corvex.Telvane"}, {"CFBundleVersion", "9.1"}});
  _folder.write("publicKey.der", "key bytes");
  EXPECT_EQ(textOf(_bundle.version()), "9.1");
  ASSERT_TRUE(_bundle.publicKey().has_value());
  EXPECT_EQ(_bundle.publicKey()->view(), "key bytes");
}

TEST_F(FolderClientBundleTest, readsTheKeyAnew) {
  _folder.write("publicKey.der", "old key");
  EXPECT_EQ(_bundle.publicKey()->view(), "old key");
  _folder.write("publicKey.der", "new key");
  EXPECT_EQ(_bundle.publicKey()->view(), "new key");
}

TEST_F(FolderClientBundleTest, countsWhatIsMissingAsAbsent) {
  _log.expectError("publicKey.der");
  EXPECT_FALSE(_bundle.version().has_value());
  EXPECT_FALSE(_bundle.publicKey().has_value());
  EXPECT_FALSE(_bundle.publicKey().has_value());
  EXPECT_EQ(_log.count(LogLevel::Error, ""), 1u);
}

TEST_F(FolderClientBundleTest, countsGarbageAsAbsentWithOneErrorLine) {
  _folder.write("Info.plist", "garbage");
  _log.expectError("Info.plist");
  EXPECT_FALSE(_bundle.version().has_value());
  EXPECT_FALSE(_bundle.version().has_value());
  EXPECT_EQ(_log.count(LogLevel::Error, ""), 1u);
}

TEST_F(FolderClientBundleTest, countsAVersionOfAWrongTypeAsAbsentWithOneErrorLine) {
  givenInformation(Dictionary{{"CFBundleVersion", 9}});
  _log.expectError("CFBundleVersion");
  EXPECT_FALSE(_bundle.version().has_value());
  EXPECT_FALSE(_bundle.version().has_value());
  EXPECT_EQ(_log.count(LogLevel::Error, ""), 1u);
}

TEST_F(FolderClientBundleTest, refusesAKeyThatIsTooLargeForOne) {
  _folder.write("publicKey.der", std::string(65537, 'x'));
  _log.expectError("publicKey.der");
  EXPECT_FALSE(_bundle.publicKey().has_value());
}

TEST_F(FolderClientBundleTest, isWhereTheVariableSaysElseInTheInstallationBelowTheRoot) {
  const Paths paths{.root = "/scratch", .home = ""};
  EXPECT_EQ(FolderClientBundle::folderFor({.bundle = "/my/Telvane.bundle"}, paths), "/my/Telvane.bundle");
  const std::string installed = FolderClientBundle::folderFor({}, paths);
  EXPECT_TRUE(installed.starts_with("/scratch/")) << installed;
  EXPECT_TRUE(installed.ends_with("/share/telvane/Telvane.bundle")) << installed;
}

}  // namespace
}  // namespace telvane
