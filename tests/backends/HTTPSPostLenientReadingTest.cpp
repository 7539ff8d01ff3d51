// What a client entry is taken for when its values are not of the type that they should be.
#include <algorithm>
#include <limits>
#include <vector>

#include "interfaces/DefaultsKeys.h"
#include "interfaces/EventKeys.h"
#include "interfaces/StorebagKeys.h"
#include "tests/backends/HTTPSPostEntryFixture.h"

namespace telvane::testing {
namespace {

constexpr char kUsualURL[] = "https://collector.example/events";

// What a client entry's value of any type is taken for. The key that is looked at, its value, and what follows from it
// in the words of effectOf().
struct Reading {
  Key key;
  Value value;
  std::string effect;
};

class HTTPSPostLenientReadingTest : public HTTPSPostEntryFixture {
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

}  // namespace
}  // namespace telvane::testing
