// Which client entry of the storebag counts, and what its gates decide.
#include <algorithm>
#include <limits>

#include "interfaces/BackendNames.h"
#include "interfaces/DefaultsKeys.h"
#include "interfaces/EventKeys.h"
#include "interfaces/SessionKeys.h"
#include "interfaces/StorebagKeys.h"
#include "tests/backends/BackendFixture.h"

namespace telvane::testing {
namespace {

constexpr uint32_t kUnknown = TelvaneBackendStateUnknown;
constexpr uint32_t kDisabled = TelvaneBackendStateDisabled;
constexpr uint32_t kEnabled = TelvaneBackendStateEnabled;
constexpr uint32_t kSampledOut = TelvaneBackendStateSampledOut;
constexpr char kUsualURL[] = "https://collector.example/events";

class HTTPSPostConfigurationTest : public BackendFixture {
 protected:
  Dictionary entryWith(const Key& key, Value value) const {
    Dictionary entry = _client;
    entry.set(key, std::move(value));
    return entry;
  }
  void givenNames(Value clientName, Value serviceName) {
    Dictionary names{{Key("other"), 1}};
    names.set(kTelvaneUserInfoClientName, std::move(clientName));
    names.set(kTelvaneUserInfoServiceName, std::move(serviceName));
    _userInfo = names;
  }
  // Where an ordinary and a real-time event go; "" for nowhere.
  std::string postURL() {
    backend().setBatchEvents(false);
    const size_t before = posts().count();
    send({});
    return posts().count() > before ? posts().lastRequest().url : "";
  }
  std::string realtimePostURL() {
    const size_t before = posts().count();
    send({}, 7, 2, 1);
    return posts().count() > before ? posts().lastRequest().url : "";
  }
};

TEST_F(HTTPSPostConfigurationTest, needsAProfileAndAProductFamily) {
  EXPECT_EQ(newBackend(Value()), nullptr);
  EXPECT_EQ(newBackend(Value(60)), nullptr);
  EXPECT_EQ(TelvaneBackend::newBackendWithName(context(), "splunk", profile(), std::nullopt, 6), nullptr);
  EXPECT_TRUE(hasNoLine(log(), "can't find the client list"));
}

TEST_F(HTTPSPostConfigurationTest, needsAListOfClients) {
  log().expectError("HTTPSPostBackend(initWithName): can't find the client list.");
  for (const Value& list : {Value(), Value(Array()), Value("a"), Value(Dictionary{{Key("client"), "a"}})}) {
    Dictionary section = profile();
    section.set(kProfileClients, list);
    EXPECT_EQ(newBackend(section), nullptr) << description(list);
  }
  EXPECT_TRUE(hasLines(log(), 4, "HTTPSPostBackend(initWithName): can't find the client list."));
}

TEST_F(HTTPSPostConfigurationTest, takesTheDisplayURLWhenItIsText) {
  EXPECT_EQ(makeBackend().displayURL(), String("https://collector.example/show"));
  Dictionary section = profile();
  section.set(kProfileDisplayURL, 5);
  EXPECT_EQ(newBackend(section)->displayURL(), std::nullopt);
}

TEST_F(HTTPSPostConfigurationTest, readsBothIdentifiersWhenMade) {
  makeBackend();
  const Value respect = process().userDefaults().objectForKey(kTelvaneDefaultsSuite, kDefaultsUUIDRespectDNU);
  const Value overriding = process().userDefaults().objectForKey(kTelvaneDefaultsSuite, kDefaultsUUIDOverrideDNU);
  EXPECT_EQ(respect.text().size(), 36u);
  EXPECT_EQ(overriding.text().size(), 36u);
  EXPECT_NE(respect, overriding);
}

// One row of the gates: how a device and a client entry that report are changed, and what comes of it.
struct Gate {
  const char* rule;
  std::vector<std::pair<Key, Value>> entry;  // an absent value takes the key away
  uint32_t state;
  std::string line;  // why, in the log; nothing where a gate is passed or refuses without a word
  bool consents = true;
  std::optional<String> country = String("US");
  std::optional<String> hardwareType = String("Box2,1");
};

// What the gates say when they refuse; the filters' line is an error and stands in its row.
constexpr const char* kRefusals[] = {"reporting disabled by DNU", "isn't in country code list",
                                     "isn't in device whitelist", "is in device blacklist", "filters are required"};

Dictionary thresholdIn(Value countries, Value threshold) {
  Dictionary item;
  item.set(kPerCountryCountry, std::move(countries));
  item.set(kPerCountryThreshold, std::move(threshold));
  return item;
}

// The draw is 0.5, the version 8.1, the user info player and StreamMediaPlayer, the family TelvaneBox.
std::vector<Gate> gates() {
  const auto here = [](Value threshold) { return Value(Array{Value(thresholdIn(Array{"DE", "US"}, threshold))}); };
  return {
      // Which entry.
      {"this client among several, in any case", {{kClientEntryClient, "A,PLAYER"}}, kEnabled, ""},
      {"only the whole name", {{kClientEntryClient, "play"}}, kDisabled, ""},
      {"blanks belong to the name", {{kClientEntryClient, "A, player"}}, kDisabled, ""},
      {"a part of the service's name, in any case", {{kClientEntryService, "video,media"}}, kEnabled, ""},
      {"another service", {{kClientEntryService, "video,music"}}, kDisabled, ""},
      {"both must match", {{kClientEntryClient, "player"}, {kClientEntryService, "video"}}, kDisabled, ""},
      {"the same version", {{kClientEntryEnabledSince, "8.1.0"}}, kEnabled, ""},
      {"an older version", {{kClientEntryEnabledSince, "7.200.9"}}, kEnabled, ""},
      {"a newer minor version", {{kClientEntryEnabledSince, "8.1.1"}}, kDisabled, ""},
      {"a newer middle version", {{kClientEntryEnabledSince, "8.2"}}, kDisabled, ""},
      {"a newer major version", {{kClientEntryEnabledSince, "9"}}, kDisabled, ""},
      // Consent.
      {"consent reports", {}, kEnabled, ""},
      {"no consent does not", {}, kDisabled, "reporting disabled by DNU: 0.", false},
      {"unless overridden", {{kClientEntryOverrideDNU, 1}}, kEnabled, "", false},
      {"0 overrides nothing", {{kClientEntryOverrideDNU, 0}}, kDisabled, "reporting disabled by DNU: 0.", false},
      {"nor does any other number", {{kClientEntryOverrideDNU, 2}}, kDisabled, "reporting disabled by DNU: 2.", false},
      {"with consent it does not matter", {{kClientEntryOverrideDNU, 2}}, kEnabled, ""},
      // Country.
      {"a listed country", {{kClientEntryLocaleWhitelist, Array{"FR", "US"}}}, kEnabled, ""},
      {"in any case", {{kClientEntryLocaleWhitelist, Array{"us"}}}, kEnabled, ""},
      {"another country",
       {{kClientEntryLocaleWhitelist, Array{"FR"}}},
       kDisabled,
       "(US) isn't in country code list (\n    FR\n)"},
      {"no list", {{kClientEntryLocaleWhitelist, {}}}, kDisabled, "(US) isn't in country code list (null)"},
      {"an empty list", {{kClientEntryLocaleWhitelist, Array()}}, kDisabled, "(US) isn't in country code list (\n)"},
      {"a device without a country passes a list", {}, kEnabled, "", true, std::nullopt},
      {"but not an empty one",
       {{kClientEntryLocaleWhitelist, Array()}},
       kDisabled,
       "((null)) isn't in country code list (\n)",
       true,
       std::nullopt},
      // Device.
      {"a part of the product family", {{kClientEntryDeviceWhitelist, Array{"vaneb"}}}, kEnabled, ""},
      {"another family",
       {{kClientEntryDeviceWhitelist, Array{"Phone"}}},
       kDisabled,
       "(TelvaneBox) isn't in device whitelist (\n    Phone\n)"},
      {"an empty whitelist allows all", {{kClientEntryDeviceWhitelist, Array()}}, kEnabled, ""},
      {"a refused hardware type",
       {{kClientEntryDeviceBlacklist, Array{"box2"}}},
       kDisabled,
       "(Box2,1) is in device blacklist (\n    box2\n)"},
      {"another hardware type", {{kClientEntryDeviceBlacklist, Array{"Box3"}}}, kEnabled, ""},
      {"an empty blacklist refuses none", {{kClientEntryDeviceBlacklist, Array()}}, kEnabled, ""},
      {"any blacklist refuses a device that does not say what it is",
       {{kClientEntryDeviceBlacklist, Array{"Box3"}}},
       kDisabled,
       "((null)) is in device blacklist (\n    Box3\n)",
       true,
       String("US"),
       std::nullopt},
      // Filters.
      {"no filters", {{kClientEntryFilters, {}}}, kDisabled, "filters are required."},
      {"an empty list of them", {{kClientEntryFilters, Array()}}, kEnabled, ""},
      // Sampling.
      {"a threshold above the draw", {{kClientEntrySamplingThreshold, 0.6}}, kEnabled, ""},
      {"one equal to it", {{kClientEntrySamplingThreshold, 0.5}}, kSampledOut, ""},
      {"one below it", {{kClientEntrySamplingThreshold, 0.4}}, kSampledOut, ""},
      {"none", {{kClientEntrySamplingThreshold, {}}}, kDisabled, ""},
      {"the country's replaces it", {{kClientEntryPerCountrySamplingThresholds, here(0.25)}}, kSampledOut, ""},
      {"also a missing one",
       {{kClientEntrySamplingThreshold, {}}, {kClientEntryPerCountrySamplingThresholds, here(0.6)}},
       kEnabled,
       ""},
      {"a country without a threshold has none",
       {{kClientEntryPerCountrySamplingThresholds, here(Value())}},
       kDisabled,
       ""},
      {"another country's counts there",
       {{kClientEntryPerCountrySamplingThresholds, Array{Value(thresholdIn(Array{"FR"}, 0.1))}}},
       kEnabled,
       ""},
      {"who is out stays out above a second threshold",
       {{kClientEntrySamplingThreshold, 0.5}, {kClientEntryOverrideSampling, 0.4}},
       kDisabled,
       ""},
      {"and at it", {{kClientEntrySamplingThreshold, 0.5}, {kClientEntryOverrideSampling, 0.5}}, kDisabled, ""},
      {"and waits to be promoted below it",
       {{kClientEntrySamplingThreshold, 0.5}, {kClientEntryOverrideSampling, 0.7}},
       kSampledOut,
       ""},
      {"who is in does not look at it",
       {{kClientEntrySamplingThreshold, 0.6}, {kClientEntryOverrideSampling, 0.1}},
       kEnabled,
       ""},
      // Their order: what comes first speaks.
      {"consent before country",
       {{kClientEntryLocaleWhitelist, {}}},
       kDisabled,
       "reporting disabled by DNU: 0.",
       false},
      {"country before device",
       {{kClientEntryLocaleWhitelist, Array{"FR"}}, {kClientEntryDeviceWhitelist, Array{"Phone"}}},
       kDisabled,
       "(US) isn't in country code list (\n    FR\n)"},
      {"device whitelist before blacklist",
       {{kClientEntryDeviceWhitelist, Array{"Phone"}}, {kClientEntryDeviceBlacklist, Array{"Box2"}}},
       kDisabled,
       "(TelvaneBox) isn't in device whitelist (\n    Phone\n)"},
      {"device before filters",
       {{kClientEntryDeviceBlacklist, Array{"Box2"}}, {kClientEntryFilters, {}}},
       kDisabled,
       "(Box2,1) is in device blacklist (\n    Box2\n)"},
  };
}

TEST_F(HTTPSPostConfigurationTest, eachGateDecidesAndSaysWhy) {
  log().expectError("HTTPSPostBackend(updateBackendState): filters are required.");
  givenSamplingFactor(0.5);
  const Dictionary permissive = _client;
  for (const Gate& gate : gates()) {
    SCOPED_TRACE(gate.rule);
    _client = permissive;
    for (const auto& [key, value] : gate.entry) _client.set(key, value);
    process().consent().set(gate.consents);
    process().locale().setCountryCode(gate.country);
    _hardwareType = gate.hardwareType;
    log().clear();
    EXPECT_EQ(makeUndecidedBackend().updateState(), gate.state);
    if (!gate.line.empty()) {
      EXPECT_TRUE(hasLines(log(), 1, "HTTPSPostBackend(updateBackendState): " + gate.line));
    }
    size_t refusals = 0;
    for (const char* refusal : kRefusals) refusals += log().count(refusal);
    EXPECT_EQ(refusals, gate.line.empty() ? 0u : 1u) << log().text();
  }
}

// What a client entry's value of any type is taken for. The key that is looked at, its value, and what follows from it
// in the words of effectOf().
struct Reading {
  Key key;
  Value value;
  std::string effect;
};

class HTTPSPostLenientReadingTest : public HTTPSPostConfigurationTest {
 protected:
  // What the key did to a backend of an entry that says nothing else of it.
  std::string effectOf(const Key& key) {
    const auto isOneOf = [&key](std::initializer_list<Key> keys) {
      return std::any_of(keys.begin(), keys.end(), [&key](const Key& other) { return other.view() == key.view(); });
    };
    if (isOneOf({kClientEntryExpedite})) return backend().batchEvents() ? "batches" : "sends at once";
    if (isOneOf({kClientEntryEventThreshold})) return afterMark("event_threshold set to ");
    if (isOneOf({kClientEntryExtrasOnInternal})) return afterMark("extras on internal is set to ");
    if (isOneOf({kClientEntryPostURL})) return postURL();
    if (isOneOf({kClientEntryRealtimePostURL})) return realtimePostURL();
    if (isOneOf({kClientEntryEventWhitelist, kClientEntryEventBlacklist})) return sentCategories();
    if (isOneOf({kClientEntryIncludeSessionID})) return header("X-TVN-Session-ID").has_value() ? "sent" : "left out";
    if (isOneOf({kClientEntryUseWiFiOnly})) return postedAnything().allowsCellularAccess ? "any network" : "Wi-Fi only";
    if (isOneOf({kClientEntryCustomClientId})) return hasCustomClientId() ? "custom" : "usual";
    constexpr const char* kNames[] = {"waits", "disabled", "enabled", "sampled out"};
    return kNames[backend().state()];
  }

 private:
  std::string afterMark(const std::string& mark) {
    const std::string text = log().text();
    const size_t start = text.find(mark) + mark.size();
    return text.substr(start, text.find('\n', start) - start);
  }
  URLRequest postedAnything() {
    backend().setCombinedSessionIDString("id");
    backend().setBatchEvents(false);
    send({});
    return posts().lastRequest();
  }
  std::optional<std::string> header(const char* name) { return RecordingConnectivity::header(postedAnything(), name); }
  bool hasCustomClientId() {
    const Value body = RecordingConnectivity::bodyValue(postedAnything());
    return (*body.dictionary())[kBodyClientId] ==
           process().userDefaults().objectForKey(kTelvaneDefaultsSuite, "uuid:player:StreamMediaPlayer");
  }
  // Of 7, 8 and 9.
  std::string sentCategories() {
    std::string text;
    for (uint16_t category = 7; category <= 9; ++category) {
      if (backend().isWhitelistedEvent(category) && !backend().isBlacklistedEvent(category)) {
        text += static_cast<char>('0' + category);
      }
    }
    return text;
  }
};

const double kNaN = std::numeric_limits<double>::quiet_NaN();
const double kInfinity = std::numeric_limits<double>::infinity();

std::vector<Reading> readings() {
  const Value list(Array{1});
  const Value dictionary(Dictionary{{Key("x"), 1}});
  const Value data(Data::copyOf("1"));
  const Value date{Date()};
  return {
      // Text that is none names nobody, which is everybody.
      {kClientEntryClient, 5, "enabled"},
      {kClientEntryClient, list, "enabled"},
      {kClientEntryClient, "", "disabled"},
      {kClientEntryService, true, "enabled"},
      {kClientEntryService, dictionary, "enabled"},
      {kClientEntryService, "", "disabled"},
      {kClientEntryEnabledSince, 9, "enabled"},
      {kClientEntryEnabledSince, date, "enabled"},
      {kClientEntryEnabledSince, "", "enabled"},
      {kClientEntryEnabledSince, "eight", "enabled"},
      {kClientEntryEnabledSince, "300", "disabled"},  // 44, in 8 bits
      {kClientEntryEnabledSince, "256", "enabled"},   // 0
      // Numbers.
      {kClientEntryExpedite, "1", "sends at once"},
      {kClientEntryExpedite, true, "sends at once"},
      {kClientEntryExpedite, "yes", "batches"},
      {kClientEntryExpedite, list, "batches"},
      {kClientEntryExpedite, 0.9, "batches"},
      {kClientEntryEventThreshold, "7", "7"},
      {kClientEntryEventThreshold, 7.9, "7"},
      {kClientEntryEventThreshold, "many", "0"},
      {kClientEntryEventThreshold, list, "0"},
      {kClientEntryEventThreshold, date, "0"},
      {kClientEntryEventThreshold, kNaN, "0"},
      {kClientEntryEventThreshold, Value(), "49"},
      {kClientEntryExtrasOnInternal, "1", "1"},
      {kClientEntryExtrasOnInternal, dictionary, "0"},
      {kClientEntryIncludeSessionID, "1", "sent"},
      {kClientEntryIncludeSessionID, true, "sent"},
      {kClientEntryIncludeSessionID, list, "left out"},
      {kClientEntryIncludeSessionID, "on", "left out"},
      {kClientEntryUseWiFiOnly, "1", "Wi-Fi only"},
      {kClientEntryUseWiFiOnly, data, "any network"},
      // Consent is off for these.
      {kClientEntryOverrideDNU, 1, "enabled"},
      {kClientEntryOverrideDNU, true, "enabled"},
      {kClientEntryOverrideDNU, "1", "enabled"},
      {kClientEntryOverrideDNU, " +1 of them", "enabled"},
      {kClientEntryOverrideDNU, 1.9, "enabled"},
      {kClientEntryOverrideDNU, Value(), "disabled"},
      {kClientEntryOverrideDNU, false, "disabled"},
      {kClientEntryOverrideDNU, 0, "disabled"},
      {kClientEntryOverrideDNU, -1, "disabled"},
      {kClientEntryOverrideDNU, 2, "disabled"},
      {kClientEntryOverrideDNU, 0.9, "disabled"},
      {kClientEntryOverrideDNU, 4294967297, "disabled"},
      {kClientEntryOverrideDNU, kNaN, "disabled"},
      {kClientEntryOverrideDNU, kInfinity, "disabled"},
      {kClientEntryOverrideDNU, "true", "disabled"},
      {kClientEntryOverrideDNU, "YES", "disabled"},
      {kClientEntryOverrideDNU, "", "disabled"},
      {kClientEntryOverrideDNU, list, "disabled"},
      {kClientEntryOverrideDNU, dictionary, "disabled"},
      {kClientEntryOverrideDNU, data, "disabled"},
      {kClientEntryOverrideDNU, date, "disabled"},
      // Lists: what is none is empty, and an element that is no text is no name.
      {kClientEntryLocaleWhitelist, "US", "disabled"},
      {kClientEntryLocaleWhitelist, dictionary, "disabled"},
      {kClientEntryLocaleWhitelist, list, "disabled"},
      {kClientEntryLocaleWhitelist, Array{""}, "disabled"},
      {kClientEntryLocaleWhitelist, Array{1, "US"}, "enabled"},
      {kClientEntryDeviceWhitelist, "Phone", "enabled"},
      {kClientEntryDeviceWhitelist, list, "disabled"},
      {kClientEntryDeviceWhitelist, Array{"", date}, "disabled"},
      {kClientEntryDeviceBlacklist, "Box", "enabled"},
      {kClientEntryDeviceBlacklist, list, "enabled"},
      {kClientEntryFilters, "all", "disabled"},
      {kClientEntryFilters, 1, "disabled"},
      {kClientEntryFilters, dictionary, "disabled"},
      {kClientEntryFilters, list, "disabled"},
      {kClientEntryEventWhitelist, Array{7, "8", 9.9}, "789"},
      {kClientEntryEventWhitelist, Array{list, "seven", dictionary}, ""},
      {kClientEntryEventWhitelist, Array(), ""},
      {kClientEntryEventWhitelist, "7", ""},
      {kClientEntryEventWhitelist, 7, ""},
      {kClientEntryEventWhitelist, dictionary, ""},
      {kClientEntryEventWhitelist, Value(), "789"},
      {kClientEntryEventBlacklist, Array{7, "8"}, "9"},
      {kClientEntryEventBlacklist, Array(), "789"},
      {kClientEntryEventBlacklist, "7", "789"},
      {kClientEntryEventBlacklist, date, "789"},
      // Thresholds; the draw is 0.5. What is no number is no threshold.
      {kClientEntrySamplingThreshold, "0.6", "enabled"},
      {kClientEntrySamplingThreshold, "0,6", "sampled out"},
      {kClientEntrySamplingThreshold, "much", "sampled out"},
      {kClientEntrySamplingThreshold, true, "enabled"},
      {kClientEntrySamplingThreshold, kInfinity, "enabled"},
      {kClientEntrySamplingThreshold, kNaN, "sampled out"},
      {kClientEntrySamplingThreshold, -1, "sampled out"},
      {kClientEntrySamplingThreshold, list, "disabled"},
      {kClientEntrySamplingThreshold, data, "disabled"},
      {kClientEntryPerCountrySamplingThresholds, 5, "enabled"},
      {kClientEntryPerCountrySamplingThresholds, Array(), "enabled"},
      {kClientEntryPerCountrySamplingThresholds, list, "enabled"},
      {kClientEntryPerCountrySamplingThresholds, Array{Value(thresholdIn("US", 0.1))}, "enabled"},
      {kClientEntryPerCountrySamplingThresholds, Array{Value(thresholdIn(Array{1}, 0.1))}, "enabled"},
      {kClientEntryPerCountrySamplingThresholds, Array{Value(thresholdIn(Array{"us"}, 0.1))}, "enabled"},
      {kClientEntryPerCountrySamplingThresholds, Array{Value(thresholdIn(Array{"US"}, "0.1"))}, "sampled out"},
      {kClientEntryPerCountrySamplingThresholds, Array{Value(thresholdIn(Array{"US"}, list))}, "disabled"},
      // Links.
      {kClientEntryPostURL, 5, ""},
      {kClientEntryPostURL, list, ""},
      {kClientEntryPostURL, Value(), ""},
      {kClientEntryRealtimePostURL, 5, kUsualURL},
      {kClientEntryRealtimePostURL, dictionary, kUsualURL},
      // Present is enough.
      {kClientEntryCustomClientId, false, "custom"},
      {kClientEntryCustomClientId, "", "custom"},
      {kClientEntryCustomClientId, Value(), "usual"},
  };
}

TEST_F(HTTPSPostLenientReadingTest, everyValueIsReadAsWhatItCanBe) {
  log().allowErrors();
  givenSamplingFactor(0.5);
  const Dictionary permissive = _client;
  for (const Reading& reading : readings()) {
    _client = permissive;
    _client.set(reading.key, reading.value);
    process().consent().set(reading.key.view() != kClientEntryOverrideDNU.view());
    log().clear();
    makeBackend();
    EXPECT_EQ(effectOf(reading.key), reading.effect) << reading.key.view() << " = " << description(reading.value);
  }
}

TEST_F(HTTPSPostLenientReadingTest, aSecondThresholdCountsWhenItIsANumber) {
  givenSamplingFactor(0.5);
  _client.set(kClientEntrySamplingThreshold, 0.1);
  const std::pair<Value, uint32_t> cases[] = {
      {"0.4", kDisabled},        {"0.6", kSampledOut},        {"x", kDisabled},
      {Array{0.1}, kSampledOut}, {Dictionary(), kSampledOut}, {kNaN, kSampledOut}};
  for (const auto& [value, state] : cases) {
    EXPECT_EQ(stateWith(kClientEntryOverrideSampling, value), state) << description(value);
  }
}

// What a filter entry does to the text "abc" under "secret" of an event with method 7 and status 2.
struct FilterReading {
  const char* why;
  Dictionary filter;
  std::string effect;
};

TEST_F(HTTPSPostLenientReadingTest, everyFilterIsReadAsWhatItCanBe) {
  const Key& method = kFilterMethod;
  const Key& status = kFilterStatus;
  const auto with = [](const Key& key, Value value) {
    Dictionary filter{{kFilterKey, "secret"}, {kFilterAction, "remove"}};
    filter.set(key, std::move(value));
    return filter;
  };
  const auto withValues = [](const char* action, Value values) {
    Dictionary filter{{kFilterKey, "secret"}, {kFilterAction, action}};
    filter.set(kFilterValue, std::move(values));
    return filter;
  };
  const FilterReading rows[] = {
      {"any method and status", with(method, Value()), "gone"},
      {"a negative number is any", with(method, -5), "gone"},
      {"this method", with(method, 7), "gone"},
      {"as text", with(method, "7"), "gone"},
      {"as a real", with(method, 7.9), "gone"},
      {"another method", with(method, 8), "abc"},
      {"true is 1", with(method, true), "abc"},
      {"no number is 0", with(method, "seven"), "abc"},
      {"nor is a list", with(method, Array{7}), "abc"},
      {"nor a dictionary", with(method, Dictionary()), "abc"},
      {"nor a date", with(method, Date()), "abc"},
      {"this status", with(status, "2"), "gone"},
      {"another status", with(status, 3), "abc"},
      {"no status is 0", with(status, Data::copyOf("2")), "abc"},
      {"keys in any case", with(kFilterKey, "SECRET"), "gone"},
      {"a key that is no text is none", with(kFilterKey, 5), "abc"},
      {"nor is a list of them", with(kFilterKey, Array{"secret"}), "abc"},
      {"nor an empty one", with(kFilterKey, ""), "abc"},
      {"no action", with(kFilterAction, Value()), "abc"},
      {"an unknown action", with(kFilterAction, "delete"), "abc"},
      {"actions are exact", with(kFilterAction, "Remove"), "abc"},
      {"an action that is no text", with(kFilterAction, 1), "abc"},
      {"a digest", with(kFilterAction, "sha256"), "ba7816bf8f01cfea414140de5dae2223b00361a396177a9cb410ff61f20015ad"},
      {"a barred part", withValues("blacklistValues", Array{"x", "B"}), "gone"},
      {"no barred part", withValues("blacklistValues", Array{"x"}), "abc"},
      {"no text among them", withValues("blacklistValues", Array{1, Value(Array{"b"}), ""}), "abc"},
      {"no list is an empty one", withValues("blacklistValues", "b"), "abc"},
      {"nor is nothing", withValues("blacklistValues", Value()), "abc"},
      {"an allowed part", withValues("whitelistValues", Array{"x", "B"}), "abc"},
      {"no allowed part", withValues("whitelistValues", Array{"x"}), "gone"},
      {"an empty list allows none", withValues("whitelistValues", Array()), "gone"},
      {"no list is an empty one", withValues("whitelistValues", "abc"), "gone"},
      {"nor is a number", withValues("whitelistValues", 1), "gone"},
  };
  for (const FilterReading& row : rows) {
    _client.set(kClientEntryFilters, Array{Value(row.filter)});
    makeBackend();
    const Dictionary event = posted({{Key("secret"), "abc"}, {Key("open"), 1}}, 7, 2);
    EXPECT_EQ(event.contains("secret") ? std::string(event["secret"].text()) : "gone", row.effect)
        << row.why << ": " << description(Value(row.filter));
    EXPECT_EQ(event["open"], Value(1)) << row.why;
  }
}

TEST_F(HTTPSPostConfigurationTest, aFilterThatIsNoDictionaryDisables) {
  constexpr const char* kLine = "HTTPSPostBackend(updateBackendState): a filter is no dictionary.";
  log().expectError(kLine);
  const Value filter(Dictionary{{kFilterKey, "secret"}, {kFilterAction, "remove"}});
  EXPECT_EQ(stateWith(kClientEntryFilters, Array{"secret"}), kDisabled);
  EXPECT_EQ(stateWith(kClientEntryFilters, Array{filter, 1}), kDisabled) << "one good filter does not make up for it";
  EXPECT_TRUE(hasLines(log(), 2, kLine));
}

TEST_F(HTTPSPostConfigurationTest, aFilterWithoutAKeyMatchesNothing) {
  _client.set(kClientEntryFilters, Array{Value(Dictionary{{kFilterAction, "remove"}}),
                                         Value(Dictionary{{kFilterKey, "secret"}, {kFilterAction, "remove"}})});
  makeBackend();
  EXPECT_EQ(backend().state(), kEnabled);
  const Dictionary event = posted({{Key("secret"), 1}, {Key("open"), 2}});
  EXPECT_FALSE(event.contains("secret"));
  EXPECT_EQ(event["open"], Value(2));
}

TEST_F(HTTPSPostConfigurationTest, withoutUserInfoItWaits) {
  _userInfo = Value();
  EXPECT_EQ(makeUndecidedBackend().updateState(), kUnknown);
  backend().setUserInfoDict(Value(Dictionary()));
  EXPECT_EQ(backend().updateState(), kUnknown);
  backend().setUserInfoDict(Value("text"));
  EXPECT_EQ(backend().updateState(), kUnknown);
  backend().setUserInfoDict(Dictionary{{kTelvaneUserInfoClientName, "player"}});
  EXPECT_EQ(backend().updateState(), kEnabled);
  EXPECT_EQ(backend().state(), kEnabled);
}

TEST_F(HTTPSPostConfigurationTest, aSessionWithoutAClientNameMatchesOnlyEntriesWithoutClient) {
  givenNames(Value(), "StreamMediaPlayer");
  EXPECT_EQ(makeUndecidedBackend().updateState(), kEnabled);
  EXPECT_EQ(stateWith(kClientEntryClient, "player"), kDisabled);
  givenNames(Value(5), "StreamMediaPlayer");
  EXPECT_EQ(makeUndecidedBackend().updateState(), kDisabled) << "a number is no name";
}

TEST_F(HTTPSPostConfigurationTest, triesTheNextEntryWhenOneIsTooNew) {
  _clients = Array{Value(entryWith(kClientEntryEnabledSince, "9.0")), Value(_client)};
  EXPECT_EQ(makeUndecidedBackend().updateState(), kEnabled);
}

TEST_F(HTTPSPostConfigurationTest, theFirstEntryThatPassesDecidesAlone) {
  _clients = Array{5, Value(entryWith(kClientEntryClient, "other")),
                   Value(entryWith(kClientEntryLocaleWhitelist, Array{"FR"})), Value(_client)};
  EXPECT_EQ(makeUndecidedBackend().updateState(), kDisabled);
}

TEST_F(HTTPSPostConfigurationTest, tellsTheKindOfConsentInTheStopEvent) {
  const auto opt = [this] { return posted({}, 0, 1)[kEventOpt].integerValue(); };
  makeBackend();
  EXPECT_EQ(opt(), 0);
  _client.set(kClientEntryOverrideDNU, 1);
  makeBackend();
  EXPECT_EQ(opt(), 2) << "overridden, and the user consents";
  process().consent().set(false);
  makeBackend();
  EXPECT_EQ(opt(), 1) << "overridden, and the user does not";
}

TEST_F(HTTPSPostConfigurationTest, consentIsAskedOnceWhenMade) {
  makeBackend();
  process().consent().set(false);
  EXPECT_EQ(backend().updateState(), kEnabled);
}

TEST_F(HTTPSPostConfigurationTest, aThresholdOfTheCountryReplacesTheOthers) {
  givenSamplingFactor(0.5);
  _client.set(kClientEntrySamplingThreshold, 1.0);
  const Dictionary elsewhere{{kPerCountryCountry, Array{"FR"}}, {kPerCountryThreshold, 0.9}};
  const Dictionary here{{kPerCountryCountry, Array{"DE", "US"}}, {kPerCountryThreshold, 0.25}};
  const Dictionary tooLate{{kPerCountryCountry, Array{"US"}}, {kPerCountryThreshold, 0.9}};
  EXPECT_EQ(
      stateWith(kClientEntryPerCountrySamplingThresholds, Array{5, Value(elsewhere), Value(here), Value(tooLate)}),
      kSampledOut);
  EXPECT_TRUE(
      hasLine(log(), "HTTPSPostBackend(updateBackendState): sampling threshold for US changed from 1.00 to 0.25"));
  EXPECT_EQ(backend().samplingThreshold(), Value(0.25));
  EXPECT_EQ(stateWith(kClientEntryPerCountrySamplingThresholds, Array{Value(elsewhere)}), kEnabled);
  EXPECT_EQ(
      stateWith(kClientEntryPerCountrySamplingThresholds, Array{Value(Dictionary{{kPerCountryCountry, Array{"US"}}})}),
      kDisabled)
      << "a country without a threshold has none";
}

TEST_F(HTTPSPostConfigurationTest, saysWhatItDecided) {
  givenSamplingFactor(0.25);
  _client.set(kClientEntryEventThreshold, 5);
  _client.set(kClientEntryExtrasOnInternal, 1);
  makeBackend();
  EXPECT_TRUE(hasLine(log(), "resetBackendStateWithClient: event_threshold set to 5"));
  EXPECT_TRUE(hasLine(log(), "setBackendStateWithClient: extras on internal is set to 1"));
  EXPECT_TRUE(hasLine(log(),
                      "HTTPSPostBackend(updateBackendState): splunk: client found player:StreamMediaPlayer, "
                      "state=2, samplingFactor=0.250000"));
}

TEST_F(HTTPSPostConfigurationTest, withoutRequiredUserInfoItIsEnabledWhateverTheEntriesSay) {
  _requiresUserInfo = false;
  process().consent().set(false);
  _userInfo = Value();
  _clients = Array{Value(Dictionary{{kClientEntryClient, "nobody"}}), "text",
                   Value(Dictionary{{kClientEntryPostURL, "https://first.example/"}, {kClientEntryEventThreshold, 3}}),
                   Value(Dictionary{{kClientEntryPostURL, "https://second.example/"}})};
  EXPECT_EQ(makeUndecidedBackend().updateState(), kEnabled);
  EXPECT_TRUE(hasLine(log(), "resetBackendStateWithClient: event_threshold set to 3"));
  EXPECT_EQ(postURL(), "https://first.example/");
  EXPECT_EQ(realtimePostURL(), "https://first.example/");
}

TEST_F(HTTPSPostConfigurationTest, withoutAnyPostURLTheThresholdIsTheUsualOne) {
  _requiresUserInfo = false;
  _clients = Array{Value(Dictionary{{kClientEntryEventThreshold, 3}})};
  EXPECT_EQ(makeUndecidedBackend().updateState(), kEnabled);
  EXPECT_TRUE(hasLine(log(), "resetBackendStateWithClient: event_threshold set to 49"));
  EXPECT_TRUE(hasLine(log(), "HTTPSPostBackend(updatePostLink): realtimePostURL defaults to postURL '(null)'"));
}

// No entry's URL is taken then, so none of them answers for the rest either.
TEST_F(HTTPSPostConfigurationTest, withAPostURLOfTheUserDefaultsAndWithoutUserInfoTheThresholdIsTheUsualOne) {
  givenDefault(kDefaultsHTTPSPostURL, "https://mine.example/");
  _requiresUserInfo = false;
  _clients = Array{Value(Dictionary{{kClientEntryPostURL, "https://first.example/"},
                                    {kClientEntryEventThreshold, 3},
                                    {kClientEntryExtrasOnInternal, 1}})};
  EXPECT_EQ(makeUndecidedBackend().updateState(), kEnabled);
  EXPECT_TRUE(hasLine(log(), "resetBackendStateWithClient: event_threshold set to 49"));
  EXPECT_TRUE(hasLine(log(), "setBackendStateWithClient: extras on internal is set to 0"));
  EXPECT_EQ(postURL(), "https://mine.example/");
}

TEST_F(HTTPSPostConfigurationTest, theOverrideOfSamplingStaysUntilAnotherEntrySamplesOut) {
  givenSamplingFactor(0.5);
  const auto entryFor = [this](const char* client, Value threshold, Value override) {
    Dictionary entry = _client;
    entry.set(kClientEntryClient, client);
    entry.set(kClientEntrySamplingThreshold, std::move(threshold));
    entry.set(kClientEntryOverrideSampling, std::move(override));
    return Value(entry);
  };
  _clients = Array{entryFor("held", 0.25, 0.75), entryFor("sampled", 1.0, 0.6), entryFor("none", Value(), 0.6),
                   entryFor("bare", 0.25, Value())};
  makeBackend();
  const auto toldOverrideOf = [this](const char* client, uint32_t state) {
    backend().setUserInfoDict(Dictionary{{kTelvaneUserInfoClientName, client}});
    EXPECT_EQ(backend().updateState(), state) << client;
    backend().setState(kEnabled);
    return posted({}, 0, 1)[kEventOverrideSampling];
  };
  EXPECT_EQ(toldOverrideOf("held", kSampledOut), Value(0.75));
  EXPECT_EQ(toldOverrideOf("sampled", kEnabled), Value(0.75)) << "below the threshold nobody looks at it";
  EXPECT_EQ(toldOverrideOf("none", kDisabled), Value(0.75));
  EXPECT_EQ(toldOverrideOf("bare", kSampledOut), Value(-1));
}

TEST_F(HTTPSPostConfigurationTest, aCustomIdentifierStaysAndExtrasOnInternalDoNotWhenAnotherEntryMatches) {
  _isInternal = true;
  Dictionary first = entryWith(kClientEntryClient, "first");
  first.set(kClientEntryCustomClientId, true);
  first.set(kClientEntryExtrasOnInternal, 1);
  _clients = Array{Value(first), Value(_client)};
  makeBackend();
  const auto clientIdOf = [this](const char* client) {
    backend().setUserInfoDict(Dictionary{{kTelvaneUserInfoClientName, client}});
    backend().updateState();
    posted({});
    const Value body = RecordingConnectivity::bodyValue(posts().lastRequest());
    return (*body.dictionary())[kBodyClientId];
  };
  EXPECT_EQ(clientIdOf("first"), Value("device-id"));
  const Value custom = process().userDefaults().objectForKey(kTelvaneDefaultsSuite, "uuid:first:");
  ASSERT_TRUE(custom.isString());
  EXPECT_EQ(clientIdOf("other"), custom);
}

TEST_F(HTTPSPostConfigurationTest, theFirstMatchingEntrySaysWhetherToBatch) {
  _client.set(kClientEntryExpedite, 1);
  makeBackend();
  EXPECT_FALSE(backend().batchEvents());
  EXPECT_TRUE(hasLine(log(), "HTTPSPostBackend(updateBackendState): Store bag override  _batchEvent=0"));
  _batchesEvents = false;
  _client.set(kClientEntryExpedite, 0);
  makeBackend();
  EXPECT_TRUE(backend().batchEvents());
  EXPECT_TRUE(hasLine(log(), "HTTPSPostBackend(updateBackendState): Store bag override  _batchEvent=1"));
}

TEST_F(HTTPSPostConfigurationTest, onlyTheFirstMatchingEntrySaysWhetherToBatch) {
  _clients =
      Array{Value(entryWith(kClientEntryClient, "other")), Value(_client), Value(entryWith(kClientEntryExpedite, 1))};
  makeBackend();
  EXPECT_TRUE(backend().batchEvents());
  EXPECT_TRUE(hasNoLine(log(), "Store bag override"));
}

TEST_F(HTTPSPostConfigurationTest, takesItsURLsFromTheMatchedEntry) {
  makeBackend();
  EXPECT_TRUE(hasLine(log(), std::string("HTTPSPostBackend(updatePostLink): Storebag '") + kPostURL + "' for postURL"));
  EXPECT_TRUE(hasLine(
      log(), std::string("HTTPSPostBackend(updatePostLink): Storebag '") + kRealtimeURL + "' for realtimePostURL"));
  EXPECT_EQ(postURL(), kPostURL);
  EXPECT_EQ(realtimePostURL(), kRealtimeURL);
}

TEST_F(HTTPSPostConfigurationTest, realtimeEventsGoToThePostURLUnlessThereIsAnother) {
  _client.set(kClientEntryRealtimePostURL, Value());
  makeBackend();
  EXPECT_TRUE(hasLine(
      log(), std::string("HTTPSPostBackend(updatePostLink): realtimePostURL defaults to postURL '") + kPostURL + "'"));
  EXPECT_EQ(realtimePostURL(), kPostURL);
}

TEST_F(HTTPSPostConfigurationTest, aURLThatIsNoTextIsNone) {
  _client.set(kClientEntryPostURL, 5);
  _client.set(kClientEntryRealtimePostURL, Array{"https://collector.example/"});
  makeBackend();
  EXPECT_EQ(postURL(), "");
  EXPECT_EQ(realtimePostURL(), "");
}

TEST_F(HTTPSPostConfigurationTest, aPostURLOfTheUserDefaultsSurvivesTheStorebag) {
  givenDefault(kDefaultsHTTPSPostURL, "https://mine.example/");
  makeBackend();
  backend().updateState();
  EXPECT_TRUE(hasLine(log(), "HTTPSPostBackend(initWithName): Using user default 'https://mine.example/' for postURL"));
  EXPECT_EQ(postURL(), "https://mine.example/");
  EXPECT_EQ(realtimePostURL(), kRealtimeURL);
}

TEST_F(HTTPSPostConfigurationTest, aRealtimePostURLOfTheUserDefaultsSurvivesTheStorebag) {
  givenDefault(kDefaultsHTTPSRealtimePostURL, "https://mine.example/");
  makeBackend();
  EXPECT_TRUE(
      hasLine(log(), "HTTPSPostBackend(initWithName): Using user default 'https://mine.example/' for realtimePostURL"));
  EXPECT_EQ(postURL(), kPostURL);
  EXPECT_EQ(realtimePostURL(), "https://mine.example/");
}

TEST_F(HTTPSPostConfigurationTest, defaultsThatAreNoTextAreNoURLs) {
  givenDefault(kDefaultsHTTPSPostURL, 5);
  givenDefault(kDefaultsHTTPSRealtimePostURL, Value(Array{"x"}));
  makeBackend();
  EXPECT_EQ(postURL(), kPostURL);
  EXPECT_TRUE(hasNoLine(log(), "Using user default"));
}

TEST_F(HTTPSPostConfigurationTest, keepsItsListsWhenTheEntryHasNone) {
  Dictionary first = entryWith(kClientEntryEventWhitelist, Array{7, 8});
  first.set(kClientEntryEventBlacklist, Array{8});
  first.set(kClientEntryClient, "first");
  _clients = Array{Value(first), Value(_client)};
  givenNames("first", Value());
  makeBackend();
  EXPECT_TRUE(hasLine(log(), "HTTPSPostBackend(updateBackendState): splunk: eventWhitelist=(\n    7,\n    8\n)"));
  EXPECT_TRUE(hasLine(log(), "HTTPSPostBackend(updateBackendState): splunk: eventBlacklist=(\n    8\n)"));
  log().clear();
  backend().setUserInfoDict(Dictionary{{kTelvaneUserInfoClientName, "second"}});
  EXPECT_EQ(backend().updateState(), kEnabled);
  EXPECT_TRUE(hasLine(log(), "client found second"));
  EXPECT_TRUE(hasNoLine(log(), "list=")) << "the second entry has no lists";
  EXPECT_TRUE(backend().isWhitelistedEvent(7));
  EXPECT_FALSE(backend().isWhitelistedEvent(9));
  EXPECT_TRUE(backend().isBlacklistedEvent(8));
}

TEST_F(HTTPSPostConfigurationTest, theListsComeWithAnyState) {
  givenSamplingFactor(0.5);
  _client.set(kClientEntrySamplingThreshold, 0.1);
  _client.set(kClientEntryEventWhitelist, Array{8});
  makeBackend();
  EXPECT_EQ(backend().state(), kSampledOut);
  EXPECT_FALSE(backend().isWhitelistedEvent(7));
}

TEST_F(HTTPSPostConfigurationTest, anEmptyListOfFiltersKeepsTheOldOnes) {
  const Dictionary filter{{kFilterKey, "secret"}, {kFilterAction, "remove"}};
  Dictionary first = entryWith(kClientEntryFilters, Array{Value(filter)});
  first.set(kClientEntryClient, "first");
  _clients = Array{Value(first), Value(_client)};
  givenNames("first", Value());
  makeBackend();
  backend().setUserInfoDict(Dictionary{{kTelvaneUserInfoClientName, "second"}});
  backend().updateState();
  EXPECT_FALSE(posted({{Key("secret"), 1}}).contains("secret"));
}

TEST_F(HTTPSPostConfigurationTest, onceFlushedWithTextItIsFrozen) {
  makeBackend();
  sendMany(1);
  ASSERT_TRUE(flush()->returned.has_value());
  backend().setUserInfoDict(Dictionary{{kTelvaneUserInfoClientName, "other"}});
  process().locale().setCountryCode(String("FR"));
  EXPECT_EQ(backend().updateState(), kEnabled);
  EXPECT_EQ(backend().state(), kEnabled);
}

TEST_F(HTTPSPostConfigurationTest, aFlushWithoutTextFreezesNothing) {
  _client.set(kClientEntryOverrideDNU, 1);
  makeBackend();
  sendMany(1);
  ASSERT_FALSE(flush()->returned.has_value());
  ASSERT_EQ(posts().count(), 1u);
  process().locale().setCountryCode(String("FR"));
  EXPECT_EQ(backend().updateState(), kDisabled);
}

TEST_F(HTTPSPostConfigurationTest, aFrozenBackendStaysDisabledByTheServer) {
  makeBackend();
  sendMany(1);
  flush();
  posts().answer(0, 503);
  EXPECT_EQ(backend().updateState(), kDisabled);
  EXPECT_EQ(backend().state(), kDisabled);
}

TEST_F(HTTPSPostConfigurationTest, anyValueUnderAnyKeyIsSurvived) {
  log().allowErrors();
  const Dictionary permissive = _client;
  const Value values[] = {Value(),
                          true,
                          -1,
                          1e300,
                          "text",
                          Array{1, 2},
                          Dictionary(),
                          Date(),
                          Data::copyOf("x"),
                          Array{Value(Array{Value(Dictionary())})}};
  for (const Key& key : {kClientEntryClient,
                         kClientEntryService,
                         kClientEntryExpedite,
                         kClientEntryEnabledSince,
                         kClientEntryOverrideDNU,
                         kClientEntryLocaleWhitelist,
                         kClientEntryDeviceWhitelist,
                         kClientEntryDeviceBlacklist,
                         kClientEntryFilters,
                         kClientEntrySamplingThreshold,
                         kClientEntryPerCountrySamplingThresholds,
                         kClientEntryOverrideSampling,
                         kClientEntryCustomClientId,
                         kClientEntryEventThreshold,
                         kClientEntryExtrasOnInternal,
                         kClientEntryPostURL,
                         kClientEntryRealtimePostURL,
                         kClientEntryEventWhitelist,
                         kClientEntryEventBlacklist,
                         kClientEntryIncludeSessionID,
                         kClientEntryUseWiFiOnly}) {
    for (const Value& value : values) {
      _client = permissive;
      _client.set(key, value);
      makeBackend();
      EXPECT_LE(backend().state(), kSampledOut) << key.view() << " = " << description(value);
      send({{Key("n"), 1}}, 7, 2, 1);
      flush();
    }
  }
}

}  // namespace
}  // namespace telvane::testing
