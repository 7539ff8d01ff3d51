// Which client entry of the storebag counts, and what a backend takes from it.
#include "interfaces/DefaultsKeys.h"
#include "interfaces/EventKeys.h"
#include "interfaces/SessionKeys.h"
#include "interfaces/StorebagKeys.h"
#include "tests/backends/HTTPSPostEntryFixture.h"

namespace telvane::testing {
namespace {

class HTTPSPostConfigurationTest : public HTTPSPostEntryFixture {
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
  for (const Key& key : clientEntryKeys()) {
    for (const Value& value : valuesOfAllKinds()) {
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
