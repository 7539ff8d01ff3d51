#include "platform/system/SystemPlatform.h"

#include <gtest/gtest.h>
#include <stdlib.h>

#include <chrono>
#include <filesystem>

#include "platform/PropertyList.h"
#include "tests/platform/system/Expect.h"
#include "tests/support/RecordingLog.h"
#include "tests/support/ScratchFolder.h"

namespace telvane {
namespace {

using namespace std::chrono_literals;
using telvane::testing::RecordingLog;
using telvane::testing::succeeds;
using telvane::testing::textOf;

// A whole instance in a scratch folder.
class SystemPlatformTest : public ::testing::Test {
 protected:
  SystemPlatformTest() {
    std::filesystem::create_directories(_folder.at("home"));
    ::setenv("TELVANE_ROOT", _folder.at("root").c_str(), 1);
    ::setenv("HOME", _folder.at("home").c_str(), 1);
    ::setenv("LC_ALL", "en_NZ.UTF-8", 1);
  }
  ~SystemPlatformTest() override {
    for (const char* name : {"TELVANE_ROOT", "TELVANE_BUNDLE", "LC_ALL"}) ::unsetenv(name);
  }

  testing::ScratchFolder _folder;
  RecordingLog _log;
};

TEST_F(SystemPlatformTest, livesBelowItsRootAndHome) {
  _folder.write("root/etc/telvane/device.plist",
                propertylist::serialize(Dictionary{{"ReleaseType", "Internal"}}, propertylist::Format::XML)->view());
  SystemPlatform system(_log);
  const Platform& platform = system.platform();
  EXPECT_EQ(textOf(platform.deviceAnswers.answer(DeviceAnswers::kReleaseType)), "Internal");
  EXPECT_EQ(textOf(platform.locale.countryCode()), "NZ");
  EXPECT_FALSE(platform.consent.isSubmissionAllowed());
  ASSERT_TRUE(succeeds(platform.userDefaults.setObject("com.corvex.diagnostics", "AutoSubmit", true)));
  EXPECT_TRUE(platform.consent.isSubmissionAllowed());
  EXPECT_TRUE(std::filesystem::exists(_folder.at("home/Library/Preferences/com.corvex.diagnostics.plist")));
  EXPECT_EQ(platform.files.resolve("/run/telvane"), _folder.at("root/run/telvane"));
}

TEST_F(SystemPlatformTest, readsTheBundleThatTheEnvironmentNames) {
  _folder.write("bundle/publicKey.der", "key");
  ::setenv("TELVANE_BUNDLE", _folder.at("bundle").c_str(), 1);
  SystemPlatform system(_log);
  ASSERT_TRUE(system.platform().clientBundle.publicKey().has_value());
  EXPECT_EQ(system.platform().clientBundle.publicKey()->view(), "key");
}

TEST_F(SystemPlatformTest, tellsWhenItHasBeenIdle) {
  SystemPlatform system(_log);
  const Platform& platform = system.platform();
  const auto queue = platform.dispatch.newSerialQueue("idle");
  const auto idle = platform.dispatch.newSemaphore(0);
  platform.transactions.begin();
  system.transactions().whenIdleFor(1ms, queue, [idle] { idle->signal(); });
  platform.transactions.end();
  EXPECT_TRUE(idle->waitFor(20s));
}

TEST_F(SystemPlatformTest, opensAServiceBelowItsRoot) {
  SystemPlatform system(_log);
  Result<std::unique_ptr<ipc::Listener>> listener = system.platform().localService.newListener("com.corvex.test");
  ASSERT_TRUE(succeeds(listener));
  EXPECT_TRUE(std::filesystem::exists(_folder.at("root/run/telvane/com.corvex.test.socket")));
}

TEST_F(SystemPlatformTest, maySeveralExistInOneProcess) {
  SystemPlatform one(_log);
  SystemPlatform other(_log);
  one.platform().transactions.begin();
  EXPECT_EQ(one.transactions().count(), 1u);
  EXPECT_EQ(other.transactions().count(), 0u);
  one.flowGate().add(FlowGate::kDefaultLimit + 1);
  EXPECT_FALSE(one.flowGate().isOpen());
  EXPECT_TRUE(other.flowGate().isOpen());
  one.flowGate().subtract(FlowGate::kDefaultLimit + 1);
}

}  // namespace
}  // namespace telvane
