#include "platform/system/Paths.h"

#include <gtest/gtest.h>

namespace telvane {
namespace {

TEST(PathsTest, putsTheRootBeforeTheSystemsFolders) {
  const Paths paths{.root = "/scratch", .home = "/home/u"};
  EXPECT_EQ(paths.resolve("/run/telvane/x.socket"), "/scratch/run/telvane/x.socket");
  EXPECT_EQ(paths.resolve("/etc/telvane/device.plist"), "/scratch/etc/telvane/device.plist");
  EXPECT_EQ(paths.resolve("/var/mobile/Library/Logs"), "/scratch/var/mobile/Library/Logs");
  EXPECT_EQ(paths.resolve("/tmp/tvnstorage/a"), "/scratch/tmp/tvnstorage/a");
}

TEST(PathsTest, leavesOtherPathsAsTheyAre) {
  const Paths paths{.root = "/scratch", .home = "/home/u"};
  for (const char* path :
       {"/tmp/other", "/home/u/file", "relative/etc", "/etcetera", "/scratch/etc/x", "~other/x", ""}) {
    EXPECT_EQ(paths.resolve(path), path);
  }
}

TEST(PathsTest, putsTheHomeFolderInPlaceOfTheTildeWithoutTheRoot) {
  const Paths paths{.root = "/scratch", .home = "/home/u"};
  EXPECT_EQ(paths.resolve("~/Library"), "/home/u/Library");
  EXPECT_EQ(paths.resolve("~"), "/home/u");
  EXPECT_EQ((Paths{.root = "", .home = ""}).resolve("~/Library"), "/nonexistent/Library");
}

TEST(PathsTest, changesNothingWithoutARoot) { EXPECT_EQ((Paths{}).resolve("/etc/telvane"), "/etc/telvane"); }

TEST(PathsTest, takesRootAndHomeFromTheEnvironment) {
  const Paths paths = Paths::fromEnvironment({.root = "/scratch//", .home = "/home/u/"});
  EXPECT_EQ(paths.root, "/scratch");
  EXPECT_EQ(paths.home, "/home/u");
  EXPECT_TRUE(Paths::fromEnvironment({.root = "relative"}).root.starts_with('/'));
  EXPECT_EQ(Paths::fromEnvironment({.root = "/"}).root, "");
}

TEST(PathsTest, asksTheUserDatabaseWhenThereIsNoHomeVariable) {
  EXPECT_TRUE(Paths::fromEnvironment({}).home.starts_with('/') || Paths::fromEnvironment({}).home.empty());
  EXPECT_EQ(Paths::fromEnvironment({}).root, "");
}

}  // namespace
}  // namespace telvane
