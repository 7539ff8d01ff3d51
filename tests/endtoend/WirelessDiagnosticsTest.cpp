// Events on their way from a client process through a real daemon into a shared object of the device's.
#include <gmock/gmock.h>
#include <gtest/gtest.h>
#include <signal.h>

#include <filesystem>

#include "foundation/Description.h"
#include "interfaces/BackendNames.h"
#include "interfaces/StorebagKeys.h"
#include "platform/PropertyList.h"
#include "tests/endtoend/Instance.h"

namespace telvane::testing {
namespace {

namespace fs = std::filesystem;
using ::testing::HasSubstr;

constexpr char kBundle[] =
    "root/System/Library/PrivateFrameworks/Confluxa.framework/Frameworks/ZPHPerformance.framework";
constexpr int kCategory = 21;

class WirelessDiagnosticsTest : public ::testing::Test {
 protected:
  void givenAdaptor(const std::string& name) {
    fs::create_directories(instance.path(kBundle));
    fs::copy_file(std::string(TELVANE_TEST_ADAPTORS) + "/" + name + ".so", object());
  }
  std::string object() const { return instance.path(std::string(kBundle) + "/ZPHPerformance"); }
  // A daemon whose bag for the sender's client type names wireless diagnostics and the collector.
  void startDaemon() {
    instance.startCollector();
    Dictionary bag = openBag(instance.collectorURL("/events"));
    Dictionary section = *bag[kEnvironmentRelease].dictionary();
    section.set(kTelvaneBackendVDR, Dictionary{{kProfileActive, true}});
    bag.set(kEnvironmentRelease, section);
    instance.givenStorebag("conferencing", bag);
    instance.startDaemon();
  }
  // The message that the adaptor kept under this number; nothing when there is none.
  Dictionary kept(int number) const {
    const std::string bytes = instance.read(std::string(kBundle) + "/message-" + std::to_string(number) + ".plist");
    const Result<Value> message = propertylist::parse(Data(bytes));
    return message.has_value() && message->isDictionary() ? *message->dictionary() : Dictionary();
  }
  // All messages of the category, in their order.
  std::vector<Dictionary> keptOfCategory(int category) const {
    std::vector<Dictionary> found;
    for (int number = 1; !kept(number).empty(); ++number) {
      if (kept(number)["method"] == Value(category)) found.push_back(kept(number));
    }
    return found;
  }
  size_t arrivedAtCollector() const { return instance.arrivedWithCategory(kCategory).size(); }

  Instance instance;
};

TEST_F(WirelessDiagnosticsTest, eventsReachTheAdaptorAsTheClientSentThem) {
  givenAdaptor("RecordingAdaptor");
  startDaemon();
  const std::string said = instance.sendEvents({"--client-type", "11", "--count", "3"});
  EXPECT_THAT(said, HasSubstr("vdr"));
  ASSERT_TRUE(eventually([this] { return keptOfCategory(kCategory).size() == 3; })) << instance.daemonLog();
  EXPECT_TRUE(eventually([this] { return arrivedAtCollector() == 3; }));
  const std::vector<Dictionary> messages = keptOfCategory(kCategory);
  for (size_t i = 0; i < messages.size(); ++i) {
    const Dictionary* const dict = messages[i]["dict"].dictionary();
    ASSERT_NE(dict, nullptr);
    EXPECT_THAT(description(Value(*dict)), HasSubstr("event " + std::to_string(i)));
    EXPECT_FALSE(dict->contains("ClientData")) << description(Value(*dict));
    EXPECT_FALSE(dict->contains("_method")) << "what the collector gets has more in it";
  }
  const std::string life = std::string(kBundle) + "/life";
  EXPECT_TRUE(eventually([&] { return instance.read(life) == "create 1\nrelease 1\n"; })) << instance.read(life);
}

TEST_F(WirelessDiagnosticsTest, anAdaptorThatThrowsCostsItsEventsOnly) {
  givenAdaptor("ThrowingAdaptor");
  startDaemon();
  EXPECT_THAT(instance.sendEvents({"--count", "2"}), HasSubstr("flushed: ok"));
  EXPECT_TRUE(eventually([this] { return arrivedAtCollector() == 2; })) << instance.daemonLog();
  EXPECT_TRUE(eventually([this] {
    return instance.daemonLogHas("TelvaneVDRAdaptorSendMessage of " + object() + " threw an exception: no service") &&
           instance.daemonLogHas("TelvaneVDRAdaptorRelease of " + object() + " threw an exception");
  })) << instance.daemonLog();
  EXPECT_THAT(instance.sendEvents({"--count", "1"}), HasSubstr("flushed: ok")) << "the daemon lives on";
}

// It takes a thread of the daemon's with it, and whatever that thread held; nobody should have to guess who it was.
TEST_F(WirelessDiagnosticsTest, anAdaptorThatEndsItsThreadEndsTheDaemonAndIsNamed) {
  givenAdaptor("ThrowingAdaptor");
  instance.grant("telvanectl");
  startDaemon();
  const auto client = instance.startProgram(
      "telvanectl", {"send", "--client-type", "7", "--client-name", "sender", "--category", "2", "--type", "1"}, "ctl");
  EXPECT_EQ(instance.daemon().wait(), -SIGABRT) << instance.daemonLog();
  EXPECT_TRUE(instance.daemonLogHas("<error> TelvaneVDRAdaptorSendMessage of " + object() +
                                    " ended the thread that called it\n"))
      << instance.daemonLog();
  // Another daemon, and another adaptor, and all is well again.
  fs::remove(object());
  givenAdaptor("RecordingAdaptor");
  instance.startDaemon();
  EXPECT_THAT(instance.sendEvents({"--client-type", "11", "--count", "1"}), HasSubstr("flushed: ok"));
}

TEST_F(WirelessDiagnosticsTest, aDeviceWithoutAnAdaptorLosesWhatWouldGoThere) {
  startDaemon();
  EXPECT_THAT(instance.sendEvents({"--count", "2"}), HasSubstr("flushed: ok"));
  EXPECT_TRUE(eventually([this] { return arrivedAtCollector() == 2; })) << instance.daemonLog();
  EXPECT_TRUE(eventually([this] {
    return instance.daemonLogHas("openBundleAtPath: There is no bundle " + instance.path(kBundle)) &&
           instance.daemonLogHas(
               "VDRBackend(sendMessage): VDR adaptor (null) does not respond to forwarding selector "
               "sendMessageWithMethod:respCode:dict:");
  })) << instance.daemonLog();
}

TEST_F(WirelessDiagnosticsTest, aBrokenAdaptorIsNamedInTheLog) {
  instance.givenFile(std::string(kBundle) + "/ZPHPerformance", "no shared object");
  startDaemon();
  EXPECT_THAT(instance.sendEvents({"--count", "1"}), HasSubstr("flushed: ok"));
  EXPECT_TRUE(eventually([this] {
    return instance.daemonLogHas("<error> openBundleAtPath: " + object() + " cannot be loaded: ");
  })) << instance.daemonLog();
}

}  // namespace
}  // namespace telvane::testing
