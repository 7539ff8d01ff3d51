#include "platform/ipc/Entitlements.h"

#include <grp.h>
#include <gtest/gtest.h>
#include <pwd.h>

#include "platform/PropertyList.h"
#include "platform/system/PosixFileSystem.h"
#include "tests/support/RecordingLog.h"
#include "tests/support/ScratchFolder.h"

namespace telvane::testing {
namespace {

constexpr const char* kName = "com.corvex.private.telvaned";

class EntitlementsTest : public ::testing::Test {
 protected:
  // Grants the value to the peers in the list with this key.
  void grant(const std::string& file, const std::string& list, const std::string& bearer, Value value) {
    Dictionary granted;
    granted.set(String(kName), std::move(value));
    Dictionary content;
    content.set(String(list), Value(Array({Value(bearer)})));
    content.set(String("entitlements"), Value(granted));
    const auto data = propertylist::serialize(Value(content), propertylist::Format::XML);
    ASSERT_TRUE(data) << data.error().description();
    scratch.write("etc/telvane/entitlements.d/" + file, data->view());
  }
  bool isGranted() const { return entitlements.isGranted(kName, peer); }

  ScratchFolder scratch;
  RecordingLog log;
  PosixFileSystem files{Paths{scratch.path(), scratch.path()}};
  ipc::Entitlements entitlements{files, log};
  ipc::unixsocket::Peer peer{.processID = 1, .userID = 12345, .groupID = 12345, .executable = "/usr/bin/app"};
};

TEST_F(EntitlementsTest, grantsNothingWithoutFiles) { EXPECT_FALSE(isGranted()); }

TEST_F(EntitlementsTest, grantsByExecutable) {
  grant("a.plist", "executables", "/usr/bin/app", Value(true));
  EXPECT_TRUE(isGranted());
  EXPECT_FALSE(entitlements.isGranted("com.corvex.private.other", peer));
  peer.executable = "/usr/bin/app2";
  EXPECT_FALSE(isGranted());
  peer.executable = "";
  EXPECT_FALSE(isGranted());
}

TEST_F(EntitlementsTest, grantsByUser) {
  grant("a.plist", "users", "root", Value(true));
  EXPECT_FALSE(isGranted());
  peer.userID = getpwnam("root")->pw_uid;
  EXPECT_TRUE(isGranted());
}

TEST_F(EntitlementsTest, grantsByGroupWhetherItIsThePeersFirstOrAnother) {
  const gid_t group = getgrnam("daemon")->gr_gid;
  grant("a.plist", "groups", "daemon", Value(true));
  EXPECT_FALSE(isGranted());
  peer.supplementaryGroups = {7777, group};
  EXPECT_TRUE(isGranted());
  peer.supplementaryGroups = {};
  peer.groupID = group;
  EXPECT_TRUE(isGranted());
}

TEST_F(EntitlementsTest, grantsNothingToNamesThatNobodyBears) {
  grant("a.plist", "users", "no-such-user-here", Value(true));
  grant("b.plist", "groups", "no-such-group-here", Value(true));
  EXPECT_FALSE(isGranted());
}

TEST_F(EntitlementsTest, readsTheValueLeniently) {
  const std::vector<std::pair<Value, bool>> cases = {
      {Value(true), true}, {Value(1), true},     {Value("yes"), true}, {Value(false), false},
      {Value(0), false},   {Value("no"), false}, {Value(0.0), false},  {Value(Array{}), false}};
  for (const auto& [value, isExpected] : cases) {
    grant("a.plist", "executables", "/usr/bin/app", value);
    EXPECT_EQ(ipc::Entitlements(files, log).isGranted(kName, peer), isExpected) << description(value);
  }
}

TEST_F(EntitlementsTest, filesAddUp) {
  grant("a.plist", "executables", "/usr/bin/app", Value(false));
  grant("b.plist", "executables", "/usr/bin/app", Value(true));
  grant("c.plist", "executables", "/usr/bin/app", Value(false));
  EXPECT_TRUE(isGranted());
}

TEST_F(EntitlementsTest, readsOnlyPropertyListsOfTheFolderItself) {
  grant("a.plist.bak", "executables", "/usr/bin/app", Value(true));
  grant("below/a.plist", "executables", "/usr/bin/app", Value(true));
  EXPECT_FALSE(isGranted());
}

TEST_F(EntitlementsTest, aFaultyFileCountsAsAbsentAndIsToldOnce) {
  for (const char* part : {"garbage.plist", "\"executables\" is not a list of texts",
                           "\"entitlements\" is not a dictionary", "it is not a dictionary"}) {
    log.expectError(part);
  }
  const std::string folder = "etc/telvane/entitlements.d/";
  scratch.write(folder + "garbage.plist", "no property list");
  scratch.write(folder + "array.plist", "<plist version=\"1.0\"><array/></plist>");
  scratch.write(folder + "type.plist",
                "<plist version=\"1.0\"><dict><key>executables</key><string>/usr/bin/app</string></dict></plist>");
  scratch.write(folder + "missing.plist", "<plist version=\"1.0\"><dict/></plist>");
  grant("good.plist", "executables", "/usr/bin/app", Value(true));
  EXPECT_TRUE(isGranted());
  EXPECT_TRUE(isGranted());
  EXPECT_EQ(log.count(LogLevel::Error, "are ignored"), 4u) << log.text();
}

TEST_F(EntitlementsTest, seesFilesThatChangeComeAndGo) {
  EXPECT_FALSE(isGranted());
  grant("a.plist", "executables", "/usr/bin/app", Value(true));
  EXPECT_TRUE(isGranted());
  grant("a.plist", "executables", "/usr/bin/other", Value(true));
  EXPECT_FALSE(isGranted());
  grant("a.plist", "executables", "/usr/bin/app", Value(true));
  EXPECT_TRUE(isGranted());
  ASSERT_TRUE(files.remove("/etc/telvane/entitlements.d/a.plist"));
  EXPECT_FALSE(isGranted());
}

}  // namespace
}  // namespace telvane::testing
