// What telvane-storebag explain says of a bag is what the daemon does with it: the same bags, device and session given
// to both programs.
#include <gmock/gmock.h>
#include <gtest/gtest.h>

#include "interfaces/StorebagKeys.h"
#include "platform/JSON.h"
#include "tests/endtoend/Instance.h"

namespace telvane::testing {
namespace {

constexpr char kDevice[] =
    "<plist><dict><key>ProductType</key><string>Box2,1</string><key>DeviceName</key><string>TelvaneBox</string></dict>"
    "</plist>";

class ExplainTest : public ::testing::Test {
 protected:
  ExplainTest() {
    instance.startCollector();
    instance.givenConsent(true);
    instance.givenFile("root/etc/telvane/device.plist", kDevice);
    instance.grant("telvanectl");
    instance.startDaemon();
  }
  // A client entry that is open but for what is laid over it.
  Dictionary entry(const Dictionary& changes = {}) const {
    Dictionary client{{kClientEntryPostURL, instance.collectorURL("/events")},
                      {kClientEntryLocaleWhitelist, Array{"US"}},
                      {kClientEntryFilters, Array()},
                      {kClientEntrySamplingThreshold, 1.0}};
    client.addEntriesFrom(changes);
    return client;
  }
  static Dictionary bagOf(const Dictionary& section) {
    return {{kEnvironmentRelease, section}, {kStorebagVersion, "7"}, {kStorebagRefreshCycle, 3600}};
  }
  static Value profile(const Dictionary& client) { return Dictionary{{kProfileClients, Array{Value(client)}}}; }

  // Runs the program to its end and returns what it printed.
  std::string run(const std::string& program, const std::vector<std::string>& arguments) {
    const std::string name = program + std::to_string(++_runs);
    const int status = instance.startProgram(program, arguments, name)->wait();
    EXPECT_EQ(status, 0) << instance.read(name + ".err");
    return instance.read(name + ".out");
  }
  Array explain(int clientType, const Dictionary& bag) {
    instance.givenFile("bag.json", json::serialize(bag).value());
    const std::string output =
        run("telvane-storebag",
            {"explain", instance.path("bag.json"), "--json", "--client-type", std::to_string(clientType),
             "--client-name", "demo", "--service-name", "explained", "--country", "US", "--product-family",
             "TelvaneBox", "--hardware", "Box2,1", "--framework-version", "8.0", "--consent", "on"});
    const Result<Value> parsed = json::parse(output);
    const Array* backends = parsed.has_value() ? (*parsed->dictionary())["backends"].array() : nullptr;
    return backends != nullptr ? *backends : Array();
  }
  static std::string enabledNames(const Array& backends) {
    std::string names;
    for (const Value& backend : backends) {
      const Dictionary& fields = *backend.dictionary();
      if (fields["state"].text() == "enabled")
        names += (names.empty() ? "" : ", ") + std::string(fields["name"].text());
    }
    return "enabled backends: " + (names.empty() ? "none" : names);
  }
  // Each line that explain foretells, as far as it does not depend on chance.
  void expectLogged(const Array& backends) {
    for (const Value& backend : backends) {
      for (const Value& foretold : *(*backend.dictionary())["log"].array()) {
        std::string line(foretold.text());
        if (line.find("(the device's own)") != std::string::npos) continue;
        line = line.substr(0, line.find(", samplingFactor="));
        for (size_t at = line.find('\n'); at != std::string::npos; at = line.find('\n', at)) line.replace(at, 1, "\\n");
        EXPECT_TRUE(eventually([this, &line] { return instance.daemonLogHas(line); })) << line;
      }
    }
  }
  void expectTheDaemonDoesWhatExplainSays(int clientType, const std::string& bagName, const Dictionary& bag,
                                          const std::string& expected) {
    SCOPED_TRACE(bagName);
    const Array backends = explain(clientType, bag);
    EXPECT_EQ(enabledNames(backends), expected);
    instance.givenStorebag(bagName, bag);
    const std::string said =
        run("telvanectl", {"send", "--client-type", std::to_string(clientType), "--client-name", "demo",
                           "--service-name", "explained", "--category", "21", "--type", "1"});
    EXPECT_THAT(said, ::testing::HasSubstr(expected + "\n"));
    expectLogged(backends);
  }

  Instance instance;

 private:
  int _runs = 0;
};

TEST_F(ExplainTest, theDaemonEnablesWhatExplainCallsEnabledAndLogsWhatItForetells) {
  Dictionary several;
  several.set("splunk", profile(entry()));
  several.set("gonzo", profile(entry({{kClientEntryLocaleWhitelist, Array{"DE"}}})));
  several.set("qrs", profile(entry({{kClientEntryClient, "demo,other"}})));
  several.set("nonsense", profile(entry()));
  expectTheDaemonDoesWhatExplainSays(5, "gaming", bagOf(several), "enabled backends: splunk, qrs");

  Dictionary sampledOut;
  sampledOut.set("splunk", profile(entry({{kClientEntrySamplingThreshold, 0.0}})));
  expectTheDaemonDoesWhatExplainSays(8, "audio", bagOf(sampledOut), "enabled backends: none");

  Dictionary disabled;
  disabled.set("splunk", profile(entry({{kClientEntrySamplingThreshold, 0.0}, {kClientEntryOverrideSampling, 0.0}})));
  disabled.set("splunk2", profile(entry({{kClientEntryDeviceBlacklist, Array{"Box2"}}})));
  disabled.set("splunk3", profile(entry({{kClientEntryDeviceWhitelist, Array{"Phone"}}})));
  disabled.set("splunk4", profile(entry({{kClientEntryEnabledSince, "8.1"}})));
  expectTheDaemonDoesWhatExplainSays(9, "camera", bagOf(disabled), "enabled backends: none");

  const Dictionary perCountry{{kPerCountryCountry, Array{"US"}}, {kPerCountryThreshold, 1.0}};
  Dictionary replaced;
  replaced.set("splunk", profile(entry({{kClientEntrySamplingThreshold, 0.0},
                                        {kClientEntryPerCountrySamplingThresholds, Array{Value(perCountry)}}})));
  expectTheDaemonDoesWhatExplainSays(16, "accessory", bagOf(replaced), "enabled backends: splunk");

  expectTheDaemonDoesWhatExplainSays(17, "location", {{kEnvironmentDevelopment, several}, {kStorebagVersion, "7"}},
                                     "enabled backends: none");
}

// What they would do is told without doing it: explain opens no socket, and loads nothing.
TEST_F(ExplainTest, theDaemonEnablesTheKindsThatAskForNothing) {
  constexpr int kNobody = 9;  // the port on which datagrams are thrown away, if anybody takes them
  Dictionary section;
  section.set("dashboard", Dictionary{{kProfileIP, "127.0.0.1"}, {kProfilePort, kNobody}, {kProfileReliable, 10}});
  section.set("upload_server", Dictionary{{kProfilePostURL, instance.collectorURL("/upload")}});
  section.set("power", Dictionary());
  section.set("vdr", Dictionary{{kProfileActive, true}});
  expectTheDaemonDoesWhatExplainSays(7, "conferencing", bagOf(section),
                                     "enabled backends: dashboard, upload_server, power, vdr");
  section.set("dashboard", Dictionary{{kProfileIP, "dashboard.example"}, {kProfilePort, kNobody}});
  section.set("upload_server", Dictionary());
  expectTheDaemonDoesWhatExplainSays(5, "gaming", bagOf(section), "enabled backends: power");
}

}  // namespace
}  // namespace telvane::testing
