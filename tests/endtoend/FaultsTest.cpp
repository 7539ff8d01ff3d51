#include <gmock/gmock.h>
#include <gtest/gtest.h>

#include <filesystem>

#include "interfaces/StorebagKeys.h"
#include "tests/endtoend/Instance.h"

namespace telvane::testing {
namespace {

using ::testing::HasSubstr;

// A bag that cannot be used, and what the daemon says of it.
struct BadBag {
  const char* name;
  std::function<std::string(Instance&)> bytes;
  const char* logged;
};

void PrintTo(const BadBag& bag, std::ostream* stream) { *stream << bag.name; }

std::string altered(std::string envelope) {
  const size_t bag = envelope.find("<key>bag</key>");
  const size_t text = envelope.find("<string>", bag) + 20;
  envelope[text] = envelope[text] == 'A' ? 'B' : 'A';
  return envelope;
}

class BadStorebagTest : public ::testing::TestWithParam<BadBag> {
 protected:
  Instance instance;
};

TEST_P(BadStorebagTest, isRefusedAndTheDaemonServesTheNextSession) {
  instance.startCollector();
  instance.givenStorebagFile("conferencing", GetParam().bytes(instance));
  instance.givenStorebag("audio", openBag(instance.collectorURL("/events")));
  instance.startDaemon();
  EXPECT_THAT(instance.sendEvents({"--no-flush"}), HasSubstr("configured: nothing"));
  // The log is written behind what it tells of.
  EXPECT_TRUE(eventually([this] { return instance.daemonLogHas(GetParam().logged); })) << instance.daemonLog();
  EXPECT_THAT(instance.sendEvents({"--client-type", "8"}), HasSubstr("configured: [splunk]"));
  EXPECT_TRUE(eventually([this] { return instance.arrivedWithCategory(21).size() == 3; }));
}

INSTANTIATE_TEST_SUITE_P(
    Bags, BadStorebagTest,
    ::testing::Values(
        BadBag{"garbage", [](Instance&) { return std::string("\x01\x02garbage"); }, "Signature is missing"},
        BadBag{"empty", [](Instance&) { return std::string(); }, "received zero-length storebag for 'conferencing‘"},
        BadBag{"truncated",
               [](Instance& instance) {
                 const std::string whole = instance.signedEnvelope(openBag("https://127.0.0.1:1/"));
                 return whole.substr(0, whole.size() / 2);
               },
               "Signature is missing"},
        BadBag{"oversized", [](Instance&) { return std::string(17u << 20, ' '); }, "Could not fetch storebag"},
        BadBag{"altered", [](Instance& instance) { return altered(instance.signedEnvelope(openBag("https://x/"))); },
               "Signature can not be verified"},
        BadBag{"noSection",
               [](Instance& instance) {
                 return instance.signedEnvelope({{kStorebagVersion, "1"}});
               },
               "Could not find storebag for client type 7 with release environment"},
        BadBag{"sectionOfAnotherType",
               [](Instance& instance) {
                 return instance.signedEnvelope({{kEnvironmentRelease, "text"}, {kStorebagSharedValues, 7}});
               },
               "Could not find storebag for client type 7 with release environment"}),
    [](const auto& bag) { return std::string(bag.param.name); });

class FaultsTest : public ::testing::Test {
 protected:
  void expectFirstLight() {
    instance.startCollector();
    instance.givenStorebag("conferencing", openBag(instance.collectorURL("/events")));
    instance.startDaemon();
    EXPECT_THAT(instance.sendEvents({}), HasSubstr("configured: [splunk]")) << instance.daemonLog();
    EXPECT_TRUE(eventually([this] { return instance.arrivedWithCategory(21).size() == 3; })) << instance.daemonLog();
  }
  Instance instance;
};

TEST_F(FaultsTest, aProfileOfAnotherTypeMakesNoBackendAndHarmsNone) {
  instance.startCollector();
  Dictionary bag = openBag(instance.collectorURL("/events"));
  Dictionary section = *bag[kEnvironmentRelease].dictionary();
  section.set("gonzo", Value("text"));
  section.set("nonsense", Value(Array{Value(1)}));
  bag.set(kEnvironmentRelease, section);
  instance.givenStorebag("conferencing", bag);
  instance.startDaemon();
  EXPECT_THAT(instance.sendEvents({}), HasSubstr("configured: [splunk]"));
  EXPECT_TRUE(eventually([this] { return instance.daemonLogHas("TelvaneBackend(newBackendWithName): nonsense"); }))
      << instance.daemonLog();
}

TEST_F(FaultsTest, macrosOfAnyTypeAreTakenAsTheyAre) {
  instance.startCollector();
  Dictionary bag = openBag("==URL");
  Dictionary macros;
  macros.set("==URL", Value(17));
  bag.set(kStorebagSharedValues, macros);
  instance.givenStorebag("conferencing", bag);
  instance.startDaemon();
  EXPECT_THAT(instance.sendEvents({}), HasSubstr("configured: [splunk]"));
  EXPECT_TRUE(instance.arrived().empty());
  EXPECT_TRUE(instance.daemon().isRunning());
}

TEST_F(FaultsTest, anUnreadableCacheFolderCostsTheCacheOnly) {
  instance.givenFile("home/Library/Caches/telvaned/storebags/conferencing/in the way", "");
  instance.startCollector();
  instance.givenStorebag("conferencing", openBag(instance.collectorURL("/events")));
  instance.startDaemon();
  EXPECT_THAT(instance.sendEvents({}), HasSubstr("configured: [splunk]")) << instance.daemonLog();
  EXPECT_TRUE(eventually([this] {
    return instance.daemonLogHas("saveStorebagToDisk: could not save storebag 'conferencing'");
  })) << instance.daemonLog();
}

TEST_F(FaultsTest, garbageInTheDeviceFileCountsAsAbsent) {
  instance.givenFile("root/etc/telvane/device.plist", "garbage");
  expectFirstLight();
}

TEST_F(FaultsTest, garbageInAnotherGrantFileIsPassedOver) {
  instance.givenFile("root/etc/telvane/entitlements.d/a.plist", "garbage");
  expectFirstLight();
  EXPECT_TRUE(eventually([this] { return instance.daemonLogHas("<error>"); })) << instance.daemonLog();
}

TEST_F(FaultsTest, garbageInTheSystemWideDefaultsCountsAsAbsent) {
  instance.givenFile("root/etc/telvane/defaults/com.corvex.telvane.plist", "garbage");
  expectFirstLight();
}

TEST_F(FaultsTest, garbageInTheConsentFileMeansNo) {
  instance.givenFile("home/Library/Preferences/com.corvex.diagnostics.plist", "garbage");
  instance.startCollector();
  Dictionary bag = openBag(instance.collectorURL("/events"));
  Dictionary section = *bag[kEnvironmentRelease].dictionary();
  Dictionary profile = *section["splunk"].dictionary();
  Dictionary entry = *(*profile[kProfileClients].array())[0].dictionary();
  entry.set(kClientEntryOverrideDNU, Value(0));
  profile.set(kProfileClients, Array{Value(entry)});
  section.set("splunk", profile);
  bag.set(kEnvironmentRelease, section);
  instance.givenStorebag("conferencing", bag);
  instance.startDaemon();
  EXPECT_THAT(instance.sendEvents({}), HasSubstr("configured: []"));
  EXPECT_TRUE(instance.arrived().empty());
}

TEST_F(FaultsTest, aMissingPublicKeyRefusesEveryBag) {
  std::filesystem::remove(instance.path("bundle/publicKey.der"));
  instance.startCollector();
  instance.givenStorebag("conferencing", openBag(instance.collectorURL("/events")));
  instance.startDaemon();
  EXPECT_THAT(instance.sendEvents({"--no-flush"}), HasSubstr("configured: nothing"));
}

TEST_F(FaultsTest, aMissingStorebagServerIsToldAsNothing) {
  instance.givenStorebagServer("https://127.0.0.1:1/storebags");
  instance.startDaemon();
  EXPECT_THAT(instance.sendEvents({"--no-flush"}), HasSubstr("configured: nothing"));
  EXPECT_TRUE(eventually([this] {
    return instance.daemonLogHas("fetchAndCacheStorebag: Unable to fetch storebag for client type 7");
  })) << instance.daemonLog();
}

}  // namespace
}  // namespace telvane::testing
