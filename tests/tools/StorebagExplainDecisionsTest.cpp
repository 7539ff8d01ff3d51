// What explain says, held against what a real backend of the same bag and device decides.
#include "interfaces/DefaultsKeys.h"
#include "interfaces/StorebagKeys.h"
#include "tests/tools/StorebagExplainFixture.h"

namespace telvane::testing {
namespace {

using ::testing::ElementsAre;
using ::testing::HasSubstr;

class StorebagExplainDecisionsTest : public StorebagExplainFixture {};

struct GateCase {
  Key key;
  Value value;
  const char* because;
};

// One key of an otherwise open entry at a time; the device's sampling factor is 0.5.
std::vector<GateCase> gateCases() {
  const Array perCountry{Value(Dictionary{{kPerCountryCountry, Array{"US"}}, {kPerCountryThreshold, 0.2}})};
  const Array elsewhere{Value(Dictionary{{kPerCountryCountry, Array{"DE"}}, {kPerCountryThreshold, 0.2}})};
  return {
      {kClientEntryClient, "other,PLAYER", "sampling: pass"},
      {kClientEntryClient, "other", "matching entry: fail"},
      {kClientEntryService, "media", "sampling: pass"},
      {kClientEntryService, "mail", "matching entry: fail"},
      {kClientEntryEnabledSince, "8.1", "sampling: pass"},
      {kClientEntryEnabledSince, "8.2", "matching entry: fail"},
      {kClientEntryExpedite, 1, "sampling: pass"},
      {kClientEntryExpedite, 0, "sampling: pass"},
      {kClientEntryLocaleWhitelist, Array{"US"}, "sampling: pass"},
      {kClientEntryLocaleWhitelist, Array{"FR"}, "country: fail"},
      {kClientEntryLocaleWhitelist, Array(), "country: fail"},
      {kClientEntryDeviceWhitelist, Array{"Box"}, "sampling: pass"},
      {kClientEntryDeviceWhitelist, Array{"Phone"}, "device whitelist: fail"},
      {kClientEntryDeviceBlacklist, Array{"Box1"}, "sampling: pass"},
      {kClientEntryDeviceBlacklist, Array{"Box2"}, "device blacklist: fail"},
      {kClientEntryFilters, Value(), "filters: fail"},
      {kClientEntryFilters, Array{1}, "filters: fail"},
      {kClientEntrySamplingThreshold, 0.6, "sampling: pass"},
      {kClientEntrySamplingThreshold, 0.5, "override sampling: hold"},
      {kClientEntrySamplingThreshold, Value(), "sampling: fail"},
      {kClientEntryPerCountrySamplingThresholds, perCountry, "override sampling: hold"},
      {kClientEntryPerCountrySamplingThresholds, elsewhere, "sampling: pass"},
      {kClientEntryEventThreshold, 5, "sampling: pass"},
      {kClientEntryExtrasOnInternal, 1, "sampling: pass"},
      {kClientEntryCustomClientId, 1, "sampling: pass"},
      {kClientEntryPostURL, Value(), "sampling: pass"},
      {kClientEntryRealtimePostURL, Value(), "sampling: pass"},
      {kClientEntryEventWhitelist, Array{1, 2}, "sampling: pass"},
      {kClientEntryEventBlacklist, Array{1, 2}, "sampling: pass"},
      {kClientEntryIncludeSessionID, 1, "sampling: pass"},
      {kClientEntryUseWiFiOnly, 1, "sampling: pass"},
  };
}

TEST_F(StorebagExplainDecisionsTest, saysOfEachGateWhatARealBackendDecides) {
  log().allowErrors();
  const Dictionary open = _client;
  for (const GateCase& gate : gateCases()) {
    SCOPED_TRACE(std::string(gate.key.view()) + " " + description(gate.value));
    _client = open;
    _client.set(gate.key, gate.value);
    const Dictionary explained = explainBackend(0.5);
    EXPECT_EQ(because(explained), gate.because);
    expectTheSame(explained, 0.5);
  }
}

TEST_F(StorebagExplainDecisionsTest, decidesSamplingAsARealBackendDoes) {
  _client.set(kClientEntrySamplingThreshold, 0.5);
  for (const Value& override : {Value(), Value(0.4), Value(0.7)}) {
    _client.set(kClientEntryOverrideSampling, override);
    for (const double factor : {0.0, 0.3999, 0.4, 0.4999, 0.5, 0.6999, 0.7, 0.9999}) {
      SCOPED_TRACE(fmt::format("{} {}", override, factor));
      expectTheSame(explainBackend(factor), factor);
    }
  }
}

TEST_F(StorebagExplainDecisionsTest, decidesConsentAsARealBackendDoes) {
  for (const Value& override : {Value(), Value(0), Value(1), Value(2), Value("1"), Value(true)}) {
    _client.set(kClientEntryOverrideDNU, override);
    for (const bool isGiven : {true, false}) {
      SCOPED_TRACE(fmt::format("{} {}", override, isGiven));
      process().consent().set(isGiven);
      expectTheSame(explainBackend(0, {"--consent", isGiven ? "on" : "off"}), 0);
    }
  }
}

TEST_F(StorebagExplainDecisionsTest, decidesForASessionAndADeviceThatLackSomething) {
  _userInfo = Value();
  const Dictionary undecided = explainBackend(0, {"--client-name", "", "--service-name", ""});
  EXPECT_EQ(because(undecided), "user info: fail");
  EXPECT_EQ(text(undecided, "state"), "unknown");
  expectTheSame(undecided, 0);
  _requiresUserInfo = false;
  const Dictionary always =
      explainBackend(0, {"--client-name", "", "--service-name", "", "--require-user-info", "off"});
  EXPECT_EQ(because(always), "user info required: set");
  EXPECT_THAT(text(always, "events"), HasSubstr("no connection"));
  expectTheSame(always, 0);
}

TEST_F(StorebagExplainDecisionsTest, aDeviceWithoutACountryPassesAnyListAndOneWithoutHardwareNoBlacklist) {
  process().locale().setCountryCode(std::nullopt);
  expectTheSame(explainBackend(0, {"--country", ""}), 0);
  _hardwareType = std::nullopt;
  _client.set(kClientEntryDeviceBlacklist, Array{"Other"});
  const Dictionary refused = explainBackend(0, {"--country", "", "--hardware", ""});
  EXPECT_EQ(because(refused), "device blacklist: fail");
  expectTheSame(refused, 0);
}

TEST_F(StorebagExplainDecisionsTest, takesURLsOfTheUsersSettings) {
  givenDefault(kDefaultsHTTPSPostURL, "https://other.example/events");
  _scratch.write("settings", R"({"httpsPostURL": "https://other.example/events"})");
  const Dictionary explained = explainBackend(0, {"--defaults", "@settings"});
  EXPECT_EQ(text(explained, "postURL"), "https://other.example/events");
  EXPECT_EQ(text(explained, "realtimePostURL"), kRealtimeURL);
  expectTheSame(explained, 0);
}

TEST_F(StorebagExplainDecisionsTest, saysWhyEarlierEntriesAreSkipped) {
  Dictionary other = _client;
  other.set(kClientEntryClient, "other");
  Dictionary mail = _client;
  mail.set(kClientEntryService, "mail");
  Dictionary later = _client;
  later.set(kClientEntryEnabledSince, "9.0");
  _clients = Array{1, other, mail, later, _client};
  const Dictionary explained = explainBackend();
  std::vector<std::string> skipped;
  for (const Value& step : *explained["gates"].array()) {
    const Dictionary& fields = *step.dictionary();
    if (text(fields, "outcome") != "skip") continue;
    skipped.push_back(fmt::format("{} {}: {}", fields["entry"], fields["gate"], fields["text"]));
  }
  EXPECT_THAT(skipped, ElementsAre("0 entry: no dictionary", "1 client name: player is none of other",
                                   "2 service name: StreamMediaPlayer has none in it of mail",
                                   "3 enabled since: framework 8.1 is below 9.0"));
  EXPECT_EQ((*explained["because"].dictionary())["entry"], Value(4));
  expectTheSame(explained, 0);
}

TEST_F(StorebagExplainDecisionsTest, bearsAnyKindOfValueUnderAnyKeyAsARealBackendDoes) {
  log().allowErrors();
  const Dictionary open = _client;
  for (const Key& key : clientEntryKeys()) {
    for (const Value& value : valuesOfAllKinds()) {
      SCOPED_TRACE(std::string(key.view()) + " " + description(value));
      _client = open;
      _client.set(key, value);
      expectTheSame(explainBackend(0.5), 0.5);
      givenBag(bag());
      EXPECT_EQ(run({"explain", "@bag"}), 0) << errors();
    }
  }
}

}  // namespace
}  // namespace telvane::testing
