// What an event becomes, and whether it goes at once or waits.
#include <cmath>
#include <limits>

#include "interfaces/DefaultsKeys.h"
#include "interfaces/EventKeys.h"
#include "interfaces/MessageFlags.h"
#include "interfaces/SessionKeys.h"
#include "interfaces/StorebagKeys.h"
#include "platform/JSON.h"
#include "tests/backends/BackendFixture.h"

namespace telvane::testing {
namespace {

constexpr int64_t kStartSeconds = SimulatedClock::kCalendarStart.time().time_since_epoch() / std::chrono::seconds(1);

class HTTPSPostEventsTest : public BackendFixture {
 protected:
  std::optional<String> sendBlob(const Dictionary& blob) {
    return backend().sendMessage(blob, _world.clock().now(), 7, 2, 0);
  }
};

TEST_F(HTTPSPostEventsTest, anEventIsItsPayloadAndWhatTheSessionAndTheDeviceAre) {
  _start = Date(SimulatedClock::kCalendarStart.time() + std::chrono::milliseconds(83'250));
  process().locale().setSecondsFromGMT(std::chrono::seconds(3600));
  makeBackend();
  backend().setCombinedSessionIDString("parent.child");
  _world.advance(std::chrono::milliseconds(100'750));
  const Dictionary expected{{Key("title"), "song"},
                            {kEventStartTS, kStartSeconds + 60},
                            {kEventSender, "MEDIA"},
                            {kEventClientVersion, 3},
                            {kEventSessionID, "parent.child"},
                            {kEventEventNumber, 1},
                            {kEventMethod, 7},
                            {kEventStatus, 2},
                            {kEventClientTS, static_cast<double>(kStartSeconds + 60) + 17.5},
                            {kEventEventTime, static_cast<double>(kStartSeconds + 60) + 17.5},
                            {kEventProductFamily, "TelvaneBox"},
                            {kEventProductModel, "Box2,1"},
                            {kEventOSVersion, "12.5"},
                            {kEventBuild, "6.1.0-13"},
                            {kEventInternal, 0},
                            {kEventReportVers, "8.1"},
                            {kEventTimezoneOffset, 3600},
                            {kTelvaneUserInfoClientName, "player"},
                            {kTelvaneUserInfoServiceName, "StreamMediaPlayer"}};
  EXPECT_EQ(posted({{Key("title"), "song"}}), expected);
}

TEST_F(HTTPSPostEventsTest, anInternalBuildTellsTheSecondsToo) {
  givenInternalBuild();
  _start = Date(SimulatedClock::kCalendarStart.time() + std::chrono::milliseconds(83'250));
  makeBackend();
  _world.advance(std::chrono::milliseconds(100'750));
  const Dictionary event = posted({});
  EXPECT_EQ(event[kEventStartTS], Value(kStartSeconds + 83));
  EXPECT_EQ(event[kEventClientTS], Value(static_cast<double>(kStartSeconds + 83) + 17.5));
  EXPECT_EQ(event[kEventInternal], Value(1));
}

TEST_F(HTTPSPostEventsTest, whatTheDeviceDoesNotSayIsLeftOut) {
  _hardwareType = std::nullopt;
  _clientType = 99;
  makeBackend();
  backend().setProductVersion(std::nullopt);
  backend().setBuildVersion(std::nullopt);
  const Dictionary event = posted({{kEventProductModel, "from the payload"}});
  EXPECT_EQ(event[kEventProductModel], Value("from the payload"));
  EXPECT_FALSE(event.contains(kEventOSVersion));
  EXPECT_FALSE(event.contains(kEventBuild));
  EXPECT_FALSE(event.contains(kEventSessionID));
  EXPECT_FALSE(event.contains(kEventSender)) << "no such client type";
}

TEST_F(HTTPSPostEventsTest, ownEntriesWinOverThePayloadUserInfoOverThoseAndSharedDataOverAll) {
  _userInfo = Dictionary{{kTelvaneUserInfoClientName, "player"}, {kEventBuild, "user"}, {kEventOSVersion, "user"}};
  makeBackend();
  backend().setBatchEvents(false);
  const Dictionary payload{{kEventMethod, 99}, {kEventBuild, "payload"}, {kTelvaneUserInfoClientName, "payload"}};
  sendBlob({{kTelvaneMessageBlobClientData, payload},
            {kTelvaneMessageBlobSharedData, Dictionary{{kEventOSVersion, "shared"}, {Key("more"), 1}}}});
  const Dictionary event = lastEvent();
  EXPECT_EQ(event[kEventMethod], Value(7));
  EXPECT_EQ(event[kEventBuild], Value("user"));
  EXPECT_EQ(event[kTelvaneUserInfoClientName], Value("player"));
  EXPECT_EQ(event[kEventOSVersion], Value("shared"));
  EXPECT_EQ(event["more"], Value(1));
}

TEST_F(HTTPSPostEventsTest, sharedDataOfAWrongTypeIsIgnored) {
  makeBackend();
  backend().setBatchEvents(false);
  sendBlob({{kTelvaneMessageBlobClientData, Dictionary{{Key("n"), 1}}}, {kTelvaneMessageBlobSharedData, "text"}});
  EXPECT_EQ(lastEvent()["n"], Value(1));
}

TEST_F(HTTPSPostEventsTest, aMessageWithoutClientDataIsThePayloadItself) {
  makeBackend();
  backend().setBatchEvents(false);
  sendBlob({{Key("n"), 1}});
  EXPECT_EQ(lastEvent()["n"], Value(1));
}

TEST_F(HTTPSPostEventsTest, clientDataThatIsNoDictionaryIsSaidAndCountsAsEmpty) {
  log().expectError("HTTPSPostBackend(sendMessage): SESSION_TYPE_STOP message dictionary is nil");
  makeBackend();
  backend().setBatchEvents(false);
  sendBlob({{kTelvaneMessageBlobClientData, 5}});
  EXPECT_EQ(lastEvent()[kEventMethod], Value(7));
}

TEST_F(HTTPSPostEventsTest, internalConferencingSessionsAreNumberedByTheClient) {
  _isInternal = true;
  for (const uint32_t type : {7u, 11u, 13u}) {
    _clientType = type;
    makeBackend();
    EXPECT_EQ(posted({})[kEventSessionID], Value(4711)) << type;
    backend().setCombinedSessionIDString("parent.child");
    EXPECT_EQ(posted({})[kEventSessionID], Value(4711)) << type;
  }
  _clientType = 20;
  makeBackend();
  backend().setCombinedSessionIDString("parent.child");
  EXPECT_EQ(posted({})[kEventSessionID], Value("parent.child"));
  _isInternal = false;
  _clientType = 7;
  makeBackend();
  EXPECT_FALSE(posted({}).contains(kEventSessionID));
}

TEST_F(HTTPSPostEventsTest, theVersionHasItsMinorPartUnlessThatIsZero) {
  _selfVersion = "9.0.4";
  makeBackend();
  EXPECT_EQ(posted({})[kEventReportVers], Value("9.0.4"));
}

TEST_F(HTTPSPostEventsTest, theTimeZoneIsAskedAnewEachMinute) {
  makeBackend();
  EXPECT_EQ(posted({})[kEventTimezoneOffset], Value(0));
  process().locale().setSecondsFromGMT(std::chrono::seconds(-18'000));
  _world.advance(std::chrono::seconds(60));
  EXPECT_EQ(posted({})[kEventTimezoneOffset], Value(-18'000));
}

TEST_F(HTTPSPostEventsTest, theStopEventTellsConsentSamplingAndBytes) {
  givenSamplingFactor(0.5);
  _client.set(kClientEntrySamplingThreshold, 0.75);
  makeBackend();
  const Dictionary first = posted({});
  const auto firstSize = static_cast<int64_t>(posts().request(0).body.size());
  const Dictionary stop = posted({{kEventBatch, "payload"}}, 0, 1);
  EXPECT_TRUE(hasLines(log(), 1,
                       "HTTPSPostBackend(sendMessage): Adding dnu type and sampling threshold to SESSION_TYPE_STOP "
                       "message dictionary"));
  EXPECT_EQ(stop[kEventOpt], Value(0));
  EXPECT_EQ(stop[kEventSamplingThreshold], Value(0.75));
  EXPECT_EQ(stop[kEventOverrideSampling], Value(-1));
  EXPECT_EQ(stop[kEventBatch], Value(0));
  EXPECT_EQ(stop[kEventTotalBytesSent], Value(firstSize));
  const auto stopSize = static_cast<int64_t>(posts().request(1).body.size());
  EXPECT_EQ(posted({}, 0, 1)[kEventTotalBytesSent], Value(stopSize)) << "counted anew since the last stop event";
  EXPECT_FALSE(first.contains(kEventOpt));
  EXPECT_FALSE(posted({}, 0, 0).contains(kEventOpt)) << "the start event is none";
  EXPECT_FALSE(posted({}, 1, 1).contains(kEventOpt));
}

TEST_F(HTTPSPostEventsTest, theStopEventTellsTheOverrideOfThoseSampledOut) {
  givenSamplingFactor(0.5);
  _client.set(kClientEntrySamplingThreshold, 0.25);
  _client.set(kClientEntryOverrideSampling, 0.75);
  makeBackend();
  send({}, 0, 1);
  send({}, 7, 2, kPromotingFlag);
  flush();
  const Array events = posts().events(0);
  ASSERT_EQ(events.size(), 2u);
  const Dictionary& stop = *events[0].dictionary();
  EXPECT_EQ(stop[kEventSamplingThreshold], Value(0.25));
  EXPECT_EQ(stop[kEventOverrideSampling], Value(0.75));
  EXPECT_EQ(stop[kEventBatch], Value(1));
}

TEST_F(HTTPSPostEventsTest, withoutAThresholdTheStopEventSaysMinusOne) {
  _requiresUserInfo = false;
  makeBackend();
  EXPECT_EQ(posted({}, 0, 1)[kEventSamplingThreshold], Value(-1));
}

TEST_F(HTTPSPostEventsTest, aDisabledBackendDropsEvents) {
  makeBackend();
  backend().setState(TelvaneBackendStateDisabled);
  EXPECT_EQ(send({}), std::nullopt);
  EXPECT_EQ(send({}, 7, 2, kRealtimeFlag), std::nullopt);
  EXPECT_EQ(backend().batchedEventsSize(), 0u);
  EXPECT_EQ(posts().count(), 0u);
}

TEST_F(HTTPSPostEventsTest, sendsAtOnceOrWaitsByStateFlagAndSwitches) {
  struct Case {
    uint32_t state;
    bool batches;
    uint32_t flag;
    bool needsUserInfo;
    bool hasUserInfo;
    bool isSent;
  };
  constexpr auto kOn = TelvaneBackendStateEnabled;
  const Case cases[] = {
      {kOn, true, kOrdinaryFlag, true, true, false},
      {kOn, true, kRealtimeFlag, true, true, true},
      {kOn, true, kPromotingFlag, true, true, false},
      {kOn, true, kRealtimeAndPromotingFlag, true, true, true},
      {kOn, true, kPeriodicReportFlag, true, true, false},
      {kOn, true, 5, true, true, false},
      {kOn, false, kOrdinaryFlag, true, true, true},
      {kOn, false, kOrdinaryFlag, true, false, false},
      {kOn, false, kOrdinaryFlag, false, false, true},
      {kOn, true, kRealtimeFlag, true, false, false},
      {TelvaneBackendStateUnknown, false, kRealtimeFlag, false, true, false},
      {TelvaneBackendStateSampledOut, false, kRealtimeFlag, false, true, false},
  };
  for (const Case& c : cases) {
    _requiresUserInfo = c.needsUserInfo;
    makeBackend();
    backend().setBatchEvents(c.batches);
    if (!c.hasUserInfo) backend().setUserInfoDict({});
    backend().setState(c.state);
    const size_t before = posts().count();
    log().clear();
    send({}, 7, 2, c.flag);
    const auto name = fmt::format("state {} batches {} flag {} requires {} has {}", c.state, c.batches, c.flag,
                                  c.needsUserInfo, c.hasUserInfo);
    EXPECT_EQ(posts().count() - before, c.isSent ? 1u : 0u) << name;
    EXPECT_EQ(backend().batchedEventsSize() > 0, !c.isSent) << name;
    EXPECT_TRUE(
        hasLine(log(), LogLevel::Default,
                fmt::format("HTTPSPostBackend(sendMessage): realtime is {}", c.flag == 1 || c.flag == 3 ? 1 : 0)));
    EXPECT_TRUE(hasLine(log(), LogLevel::Default,
                        fmt::format("HTTPSPostBackend(sendMessage): {} {}, {:d}, {:d}",
                                    c.isSent ? "Sending" : "Batching", c.state, c.batches, c.needsUserInfo)));
  }
}

TEST_F(HTTPSPostEventsTest, aPromotingMessageEnablesABackendThatIsSampledOut) {
  for (const uint32_t flag : {kPromotingFlag, kRealtimeAndPromotingFlag}) {
    makeBackend();
    backend().setState(TelvaneBackendStateSampledOut);
    const size_t before = posts().count();
    sendMany(2);
    send({}, 7, 2, flag);
    EXPECT_EQ(posts().count(), before) << "this message still goes by the state that was";
    EXPECT_EQ(backend().state(), TelvaneBackendStateEnabled);
    flush();
    ASSERT_EQ(posts().count(), before + 1);
    EXPECT_EQ(posts().events(before).size(), 3u);
  }
}

TEST_F(HTTPSPostEventsTest, aPromotingMessageDoesNotDecideForTheUndecided) {
  makeBackend();
  backend().setState(TelvaneBackendStateUnknown);
  send({}, 7, 2, kPromotingFlag);
  EXPECT_EQ(backend().state(), TelvaneBackendStateUnknown);
}

TEST_F(HTTPSPostEventsTest, aPeriodicReportTellsTheBytesOfInternalBuilds) {
  givenInternalBuild();
  makeBackend();
  posted({});
  const auto size = static_cast<int64_t>(posts().request(0).body.size());
  EXPECT_EQ(posted({}, 7, 2, kPeriodicReportFlag)[kEventBytesSentSinceLastReport], Value(size));
  const auto reportSize = static_cast<int64_t>(posts().request(1).body.size());
  EXPECT_EQ(posted({}, 7, 2, kPeriodicReportFlag)[kEventBytesSentSinceLastReport], Value(reportSize))
      << "counted anew since the last report";
  EXPECT_FALSE(posted({})[kEventBytesSentSinceLastReport].isPresent());
}

TEST_F(HTTPSPostEventsTest, aPeriodicReportOfACustomersDeviceTellsNone) {
  makeBackend();
  posted({});
  EXPECT_FALSE(posted({}, 7, 2, kPeriodicReportFlag).contains(kEventBytesSentSinceLastReport));
}

TEST_F(HTTPSPostEventsTest, aRealtimeEventSendsTheWaitingOnesBeforeItself) {
  makeBackend();
  sendMany(2);
  const std::optional<String> text = send({{Key("n"), 2}}, 8, 1, kRealtimeFlag);
  ASSERT_EQ(posts().count(), 2u);
  EXPECT_EQ(posts().request(0).url, kPostURL);
  EXPECT_EQ(posts().events(0).size(), 2u);
  EXPECT_EQ(posts().request(1).url, kRealtimeURL);
  EXPECT_EQ(lastEvent()["n"], Value(2));
  EXPECT_TRUE(hasLine(log(), LogLevel::Default,
                      "HTTPSPostBackend(sendMessage): Got a realtime event and some events have already been batched. "
                      "Forcing Flush here to keep events in order."));
  ASSERT_TRUE(text.has_value());
  EXPECT_TRUE(text->view().starts_with("Flushed events:\n{\n")) << text->view();
  const size_t second = text->view().find("\nStandalone event:\n{\n");
  ASSERT_NE(second, std::string_view::npos) << text->view();
  EXPECT_NE(text->view().find("\"n\": 2", second), std::string_view::npos) << text->view();
  process().locale().setCountryCode(String("FR"));
  EXPECT_EQ(backend().updateState(), TelvaneBackendStateEnabled) << "the configuration is frozen";
}

TEST_F(HTTPSPostEventsTest, aRealtimeEventWithNothingWaitingReturnsItsOwnText) {
  makeBackend();
  const std::optional<String> text = send({{Key("n"), 2}}, 8, 1, kRealtimeFlag);
  ASSERT_TRUE(text.has_value());
  EXPECT_TRUE(text->view().starts_with("{\n")) << text->view();
  EXPECT_EQ(posts().count(), 1u);
  EXPECT_TRUE(hasNoLine(log(), "Forcing Flush"));
  process().locale().setCountryCode(String("FR"));
  EXPECT_EQ(backend().updateState(), TelvaneBackendStateDisabled) << "only a flush freezes the configuration";
}

TEST_F(HTTPSPostEventsTest, theTextIsThePostedBodyInPrettyForm) {
  makeBackend();
  const std::optional<String> text = send({{Key("n"), 2}}, 8, 1, kRealtimeFlag);
  const Result<Value> parsed = json::parse(*text);
  ASSERT_TRUE(isOk(parsed));
  EXPECT_EQ(*parsed, RecordingConnectivity::bodyValue(posts().request(0)));
}

TEST_F(HTTPSPostEventsTest, withoutConsentThereIsNoText) {
  process().consent().set(false);
  _client.set(kClientEntryOverrideDNU, 1);
  makeBackend();
  EXPECT_EQ(send({}, 8, 1, kRealtimeFlag), std::nullopt);
  sendMany(1);
  EXPECT_EQ(send({}, 8, 1, kRealtimeFlag), std::nullopt) << "nor one of a flush that had none";
  EXPECT_EQ(posts().count(), 3u);
}

TEST_F(HTTPSPostEventsTest, forcedLoggingGivesTextInEnvironmentsOfDevelopers) {
  process().consent().set(false);
  _client.set(kClientEntryOverrideDNU, 1);
  const auto hasText = [this](Value forced, Value environment) {
    givenDefault(kDefaultsForceEventLogging, std::move(forced));
    givenDefault(kDefaultsEnvironmentType, std::move(environment));
    makeBackend();
    return send({}, 8, 1, kRealtimeFlag).has_value();
  };
  EXPECT_TRUE(hasText("YES", 1));
  EXPECT_TRUE(hasText(true, 2));
  EXPECT_FALSE(hasText("YES", 3));
  EXPECT_FALSE(hasText("YES", 4));
  EXPECT_FALSE(hasText("YES", Value())) << "a release build";
  EXPECT_FALSE(hasText("no", 1));
  EXPECT_FALSE(hasText(Value(), 1));
  EXPECT_FALSE(hasText(Value(Array{1}), 1));
}

TEST_F(HTTPSPostEventsTest, datesBecomeSeconds) {
  makeBackend();
  const Date date(Date::TimePoint(std::chrono::milliseconds(1500)));
  EXPECT_EQ(posted({{Key("when"), date}})["when"], Value(1.5));
}

TEST_F(HTTPSPostEventsTest, whatJSONCannotHoldIsRemovedWithALineEach) {
  log().expectError(
      "HTTPSPostBackend(createMessageForPostAndLogging): NSJSONSerialization unable to handle key: nan, value: nan");
  log().expectError("unable to handle key: infinite, value: inf");
  log().expectError("unable to handle key: bytes, value: <0102>");
  log().expectError("unable to handle key: list, value: (\n    1\n)");
  log().expectError("unable to handle key: dict, value: {\n}");
  makeBackend();
  const Dictionary event = posted({{Key("nan"), std::numeric_limits<double>::quiet_NaN()},
                                   {Key("a"), 1},
                                   {Key("infinite"), std::numeric_limits<double>::infinity()},
                                   {Key("b"), 2.5},
                                   {Key("bytes"), Data::copyOf("\x01\x02")},
                                   {Key("list"), Array{1}},
                                   {Key("dict"), Dictionary()},
                                   {Key("c"), true}});
  EXPECT_TRUE(hasLines(log(), 5, "NSJSONSerialization unable to handle"));
  EXPECT_EQ(event.size(), 3u + 17u) << "three of the payload, and what every event has";
  EXPECT_EQ(event["a"], Value(1));
  EXPECT_EQ(event["b"], Value(2.5));
  EXPECT_EQ(event["c"], Value(true));
}

TEST_F(HTTPSPostEventsTest, nestedValuesStayWhereAllowed) {
  _allowsNestedData = true;
  makeBackend();
  const Value list(Array{1, Value(Dictionary{{Key("x"), 2}})});
  EXPECT_EQ(posted({{Key("list"), list}})["list"], list);
}

TEST_F(HTTPSPostEventsTest, aNestedValueThatCannotBeWrittenGoesAsAWhole) {
  log().expectError("unable to handle key: list, value:");
  log().expectError("unable to handle key: dict, value:");
  _allowsNestedData = true;
  makeBackend();
  const double nan = std::numeric_limits<double>::quiet_NaN();
  const Dictionary event = posted({{Key("list"), Array{1, Data::copyOf("x")}},
                                   {Key("dict"), Dictionary{{Key("deep"), Array{Value(Dictionary{{Key("x"), nan}})}}}},
                                   {Key("kept"), Array{1}}});
  EXPECT_FALSE(event.contains("list"));
  EXPECT_FALSE(event.contains("dict"));
  EXPECT_EQ(event["kept"], Value(Array{1}));
}

// JSON is written 64 levels deep, and three of them are around a value: body, list of events, event.
TEST_F(HTTPSPostEventsTest, aValueDeeperThanTheBodyHoldsGoesAlone) {
  const auto nested = [](int depth) {
    Value value = 1;
    for (int level = 1; level < depth; ++level) {
      value = level % 2 == 0 ? Value(Array{Value(value)}) : Value(Dictionary{{Key("k"), value}});
    }
    return value;
  };
  log().expectError("unable to handle key: tooDeep, value:");
  log().expectError("unable to handle key: muchTooDeep, value:");
  log().expectError("unable to handle key: shared, value:");
  log().expectError("unable to handle key: user, value:");
  _allowsNestedData = true;
  _userInfo = Dictionary{{kTelvaneUserInfoClientName, "player"}, {Key("user"), nested(62)}};
  makeBackend();
  backend().setBatchEvents(false);
  sendBlob({{kTelvaneMessageBlobClientData,
             Dictionary{{Key("deepest"), nested(61)}, {Key("tooDeep"), nested(62)}, {Key("muchTooDeep"), nested(500)}}},
            {kTelvaneMessageBlobSharedData, Dictionary{{Key("shared"), nested(62)}, {Key("kept"), nested(61)}}}});
  const Dictionary event = lastEvent();
  EXPECT_EQ(event["deepest"], nested(61));
  EXPECT_EQ(event["kept"], nested(61));
  for (const char* gone : {"tooDeep", "muchTooDeep", "shared", "user"}) EXPECT_FALSE(event.contains(gone)) << gone;
}

TEST_F(HTTPSPostEventsTest, theLineAboutAValueShowsOnlyItsBeginning) {
  const std::string key(5000, 'k');
  log().expectError("unable to handle key: " + key.substr(0, 1024) + "..., value: <01010101");
  makeBackend();
  Dictionary payload;
  payload.set(String(key), Data(std::string(20u << 20, '\x01')));
  posted(std::move(payload));
  const std::string text = log().text();
  const size_t start = text.find("unable to handle key");
  ASSERT_NE(start, std::string::npos);
  EXPECT_LT(text.find('\n', start) - start, 2200u);
}

// What the session adds stands beside the payload; without one, the message is the payload.
TEST_F(HTTPSPostEventsTest, sharedDataOfAMessageWithoutAPayloadIsItsContentToo) {
  const Dictionary shared{{Key("more"), 1}};
  _allowsNestedData = true;
  makeBackend();
  backend().setBatchEvents(false);
  sendBlob({{kTelvaneMessageBlobSharedData, shared}});
  EXPECT_EQ(lastEvent()[kTelvaneMessageBlobSharedData], Value(shared));
  EXPECT_EQ(lastEvent()["more"], Value(1));
  log().expectError("unable to handle key: SharedData, value: {");
  backend().setAllowNestedData(false);
  sendBlob({{kTelvaneMessageBlobSharedData, shared}});
  EXPECT_FALSE(lastEvent().contains(kTelvaneMessageBlobSharedData));
  EXPECT_EQ(lastEvent()["more"], Value(1));
}

TEST_F(HTTPSPostEventsTest, filtersTouchTheEventAndTheBody) {
  const auto filter = [](const char* key, const char* action) {
    return Value(Dictionary{{kFilterKey, key}, {kFilterAction, action}});
  };
  _client.set(kClientEntryFilters, Array{filter("SECRET", "remove"), filter("clientId", "sha256")});
  makeBackend();
  const Dictionary event = posted({{Key("secret"), 1}, {Key("clientId"), "x"}});
  EXPECT_FALSE(event.contains("secret"));
  EXPECT_EQ(event["clientId"].text().size(), 64u);
  const Value body = RecordingConnectivity::bodyValue(posts().request(0));
  EXPECT_EQ((*body.dictionary())[kBodyClientId].text().size(), 64u);
}

TEST_F(HTTPSPostEventsTest, theBodyHasTheTimeTheClientAndTheEvents) {
  makeBackend();
  _world.clock().jumpCalendar(std::chrono::microseconds(250'000));
  posted({});
  const Value body = RecordingConnectivity::bodyValue(posts().request(0));
  ASSERT_TRUE(body.isDictionary());
  EXPECT_EQ(body.dictionary()->size(), 3u);
  EXPECT_EQ((*body.dictionary())[kBodyPostTime], Value(static_cast<double>(kStartSeconds) + 0.25));
  EXPECT_EQ(std::string(RecordingConnectivity::bodyText(posts().request(0))).substr(0, 13), "{\"postTime\":1");
}

TEST_F(HTTPSPostEventsTest, theClientIdentifierGoesByConsentEntryAndBuild) {
  const auto clientId = [this] {
    makeBackend();
    posted({});
    const Value body = RecordingConnectivity::bodyValue(posts().lastRequest());
    return (*body.dictionary())[kBodyClientId];
  };
  const auto stored = [this](std::string_view key) {
    return process().userDefaults().objectForKey(kTelvaneDefaultsSuite, key);
  };
  const Value respecting = clientId();
  EXPECT_EQ(respecting, stored(kDefaultsUUIDRespectDNU));
  _client.set(kClientEntryOverrideDNU, 1);
  EXPECT_EQ(clientId(), stored(kDefaultsUUIDOverrideDNU));
  _client.set(kClientEntryCustomClientId, true);
  const Value custom = clientId();
  EXPECT_EQ(custom, stored("uuid:player:StreamMediaPlayer"));
  EXPECT_TRUE(custom.isString()) << description(custom);
  _client.set(kClientEntryExtrasOnInternal, 1);
  EXPECT_EQ(clientId(), custom) << "not an internal build";
  _isInternal = true;
  EXPECT_EQ(clientId(), Value("device-id"));
}

TEST_F(HTTPSPostEventsTest, identifiersOfAWrongTypeAreSentAsText) {
  givenDefault(kDefaultsUUIDRespectDNU, 17);
  makeBackend();
  posted({});
  const Value body = RecordingConnectivity::bodyValue(posts().lastRequest());
  EXPECT_EQ((*body.dictionary())[kBodyClientId], Value("17"));
}

}  // namespace
}  // namespace telvane::testing
