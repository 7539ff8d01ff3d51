// How events wait, and how they go.
#include "interfaces/EventKeys.h"
#include "interfaces/MessageFlags.h"
#include "interfaces/SessionKeys.h"
#include "interfaces/StorebagKeys.h"
#include "interfaces/TelvaneErrors.h"
#include "tests/backends/BackendFixture.h"
#include "util/DataHelpers.h"

namespace telvane::testing {
namespace {

Error failure(const char* text, int64_t code = -1) { return makeTelvaneError(text, code); }

class HTTPSPostFlushTest : public BackendFixture {
 protected:
  std::vector<int64_t> postedNumbers(size_t index) {
    std::vector<int64_t> numbers;
    for (const Value& event : posts().events(index)) numbers.push_back((*event.dictionary())["n"].integerValue());
    return numbers;
  }
  // Sends that many events of about 1 MiB, each of a method of its own, so that no threshold is near.
  void sendLarge(int count) {
    for (int n = 0; n < count; ++n) {
      send({{Key("n"), n}, {Key("text"), std::string(1u << 20, 'x')}}, static_cast<uint16_t>(100 + n));
    }
  }
  static std::vector<int64_t> upTo(int64_t count) {
    std::vector<int64_t> numbers;
    for (int64_t n = 0; n < count; ++n) numbers.push_back(n);
    return numbers;
  }
};

TEST_F(HTTPSPostFlushTest, theEventBehindTheThresholdFlushesTheOnesBeforeIt) {
  makeBackend();
  sendMany(50);
  EXPECT_EQ(posts().count(), 0u);
  const std::optional<String> text = send({{Key("n"), 50}});
  ASSERT_EQ(posts().count(), 1u);
  EXPECT_EQ(postedNumbers(0), upTo(50));
  EXPECT_TRUE(text.has_value()) << "the flush's text is the message's";
  EXPECT_TRUE(hasLine(log(), LogLevel::Default,
                      "HTTPSPostBackend(batchEvent): Flushing all batched events as we reached event threshold for "
                      "method 7"));
  flush();
  EXPECT_EQ(postedNumbers(1), std::vector<int64_t>{50});
}

TEST_F(HTTPSPostFlushTest, neverMoreThanFiftyEventsOfOneMethodWait) {
  makeBackend();
  for (int n = 0; n < 230; ++n) send({{Key("n"), n}});
  ASSERT_EQ(posts().count(), 4u);
  for (size_t index = 0; index < 4; ++index) EXPECT_EQ(posts().events(index).size(), 50u) << index;
  flush();
  EXPECT_EQ(posts().events(4).size(), 30u);
}

TEST_F(HTTPSPostFlushTest, methodsAreCountedEachForItself) {
  makeBackend();
  sendMany(50, 7);
  sendMany(50, 8);
  EXPECT_EQ(posts().count(), 0u);
  sendMany(1, 8);
  ASSERT_EQ(posts().count(), 1u);
  EXPECT_EQ(posts().events(0).size(), 100u);
  sendMany(50, 7);
  EXPECT_EQ(posts().count(), 1u) << "the flush began all counts anew";
  sendMany(1, 7);
  EXPECT_EQ(posts().count(), 2u);
}

TEST_F(HTTPSPostFlushTest, theStorebagSaysHowManyWait) {
  _client.set(kClientEntryEventThreshold, 2);
  makeBackend();
  sendMany(4);
  ASSERT_EQ(posts().count(), 1u);
  EXPECT_EQ(posts().events(0).size(), 3u);
}

TEST_F(HTTPSPostFlushTest, aNegativeThresholdSendsEachEventWithTheNext) {
  _client.set(kClientEntryEventThreshold, -1);
  makeBackend();
  sendMany(1);
  EXPECT_EQ(posts().count(), 0u);
  sendMany(1);
  ASSERT_EQ(posts().count(), 1u);
  EXPECT_EQ(posts().events(0).size(), 1u);
}

TEST_F(HTTPSPostFlushTest, anUndecidedBackendLosesWhatWaitedAtTheThreshold) {
  makeBackend();
  backend().setState(TelvaneBackendStateUnknown);
  sendMany(51);
  backend().setState(TelvaneBackendStateEnabled);
  flush();
  ASSERT_EQ(posts().count(), 1u);
  EXPECT_EQ(postedNumbers(0), std::vector<int64_t>{50});
}

TEST_F(HTTPSPostFlushTest, withoutABatchThereIsNothingToFlush) {
  makeBackend();
  const auto flushed = flush();
  EXPECT_EQ(flushed->returned, std::nullopt);
  EXPECT_EQ(flushed->calls, 1);
  EXPECT_EQ(flushed->text, std::nullopt);
  EXPECT_EQ(flushed->error, failure("Nothing to flush"));
}

TEST_F(HTTPSPostFlushTest, aBackendThatIsNotEnabledDiscardsItsBatch) {
  for (const uint32_t state :
       {TelvaneBackendStateUnknown, TelvaneBackendStateDisabled, TelvaneBackendStateSampledOut}) {
    makeBackend();
    sendMany(3);
    backend().setState(state);
    const auto flushed = flush();
    EXPECT_EQ(flushed->error, failure("Nothing to flush")) << state;
    EXPECT_EQ(flushed->calls, 1);
    backend().setState(TelvaneBackendStateEnabled);
    EXPECT_EQ(flush()->error, failure("Nothing to flush")) << state;
  }
  EXPECT_EQ(posts().count(), 0u);
}

TEST_F(HTTPSPostFlushTest, withoutRequiredUserInfoTheBatchStays) {
  makeBackend();
  sendMany(3);
  backend().setUserInfoDict({});
  const auto flushed = flush();
  EXPECT_EQ(flushed->error, failure("Can not flush: userInfo is required"));
  EXPECT_EQ(flushed->returned, std::nullopt);
  EXPECT_EQ(posts().count(), 0u);
  backend().setUserInfoDict(_userInfo);
  flush();
  EXPECT_EQ(posts().events(0).size(), 3u);
}

TEST_F(HTTPSPostFlushTest, postsTheBatchInOrderWithoutAnEventMap) {
  makeBackend();
  sendMany(3);
  const auto flushed = flush();
  EXPECT_TRUE(hasLine(log(), LogLevel::Default, "HTTPSPostBackend(flushMessagesWithCompletion): called"));
  ASSERT_EQ(posts().count(), 1u);
  EXPECT_EQ(posts().request(0).url, kPostURL);
  EXPECT_EQ(RecordingConnectivity::header(posts().request(0), "X-TVN-Event-Map"), std::nullopt);
  EXPECT_EQ(postedNumbers(0), upTo(3));
  EXPECT_EQ(flushed->calls, 0) << "the completion waits for the answer";
  ASSERT_TRUE(flushed->returned.has_value());
  posts().answer(0, 200);
  EXPECT_EQ(flushed->calls, 1);
  EXPECT_EQ(flushed->text, flushed->returned);
  EXPECT_EQ(flushed->error, std::nullopt);
  EXPECT_EQ(backend().batchedEventsSize(), 0u);
}

TEST_F(HTTPSPostFlushTest, eventsAreJudgedByTheListsWhenTheyGo) {
  _client.set(kClientEntryEventWhitelist, Array{7, 8});
  _client.set(kClientEntryEventBlacklist, Array{8});
  makeBackend();
  uint64_t held = 0;
  for (uint16_t method : {7, 8, 9}) {
    sendMany(1, method);
    EXPECT_GT(backend().batchedEventsSize(), held) << "the batch must hold the event of method " << method;
    held = backend().batchedEventsSize();
  }
  EXPECT_EQ(posts().count(), 0u);
  EXPECT_TRUE(hasNoLine(log(), "Dropping event")) << "nothing is judged before it goes";
  flush();
  ASSERT_EQ(posts().count(), 1u);
  const Array events = posts().events(0);
  ASSERT_EQ(events.size(), 1u);
  EXPECT_EQ((*events[0].dictionary())[kEventMethod], Value(7));
  EXPECT_TRUE(hasLines(log(), 1,
                       "flushMessagesWithCompletion: Dropping event with category 9 as it is not whitelisted for "
                       "backend splunk"));
  EXPECT_TRUE(hasLines(log(), 1,
                       "flushMessagesWithCompletion: Dropping event with category 8 as it is blacklisted for backend "
                       "splunk"));
}

TEST_F(HTTPSPostFlushTest, aBatchThatIsFilteredOutIsSaidSo) {
  _client.set(kClientEntryEventWhitelist, Array());
  makeBackend();
  sendMany(3);
  const auto flushed = flush();
  EXPECT_EQ(flushed->error, failure("Nothing to flush: batched events were completely filtered out"));
  EXPECT_EQ(flushed->calls, 1);
  EXPECT_EQ(posts().count(), 0u);
  EXPECT_EQ(flush()->error, failure("Nothing to flush")) << "the batch is gone";
}

TEST_F(HTTPSPostFlushTest, aValueThatIsTooDeepGoesAloneAndTheBatchIsSent) {
  log().expectError("unable to handle key: list, value: (");
  _allowsNestedData = true;
  makeBackend();
  send({{Key("n"), 0}, {Key("list"), nestedTooDeep()}});
  send({{Key("n"), 1}});
  flush();
  ASSERT_EQ(posts().count(), 1u);
  EXPECT_EQ(postedNumbers(0), upTo(2));
  EXPECT_FALSE((*posts().events(0)[0].dictionary()).contains("list"));
}

TEST_F(HTTPSPostFlushTest, userInfoThatIsTooDeepGoesFromEachEventAlone) {
  log().expectError("unable to handle key: list, value: (");
  _allowsNestedData = true;
  makeBackend();
  sendMany(2);
  backend().setUserInfoDict(Dictionary{{kTelvaneUserInfoClientName, "player"}, {Key("list"), nestedTooDeep()}});
  flush();
  ASSERT_EQ(posts().count(), 1u);
  EXPECT_EQ(postedNumbers(0), upTo(2));
  EXPECT_TRUE(hasLines(log(), 2, "unable to handle key: list"));
}

TEST_F(HTTPSPostFlushTest, userInfoThatCameLaterIsInTheEventsThatWaited) {
  _userInfo = Value();
  makeBackend();
  sendMany(1);
  EXPECT_EQ(backend().state(), TelvaneBackendStateUnknown);
  backend().setUserInfoDict(Dictionary{{kTelvaneUserInfoClientName, "late"}, {Key("n"), 99}});
  backend().updateState();
  flush();
  const Array events = posts().events(0);
  ASSERT_EQ(events.size(), 1u);
  EXPECT_EQ((*events[0].dictionary())[kTelvaneUserInfoClientName], Value("late"));
  EXPECT_EQ((*events[0].dictionary())["n"], Value(99));
}

TEST_F(HTTPSPostFlushTest, userInfoIsFilteredByItselfToo) {
  _client.set(kClientEntryFilters,
              Array{Value(Dictionary{{kFilterKey, "_clientName"}, {kFilterMethod, 0}, {kFilterAction, "sha256"}})});
  makeBackend();
  sendMany(1);
  flush();
  const Array events = posts().events(0);
  ASSERT_EQ(events.size(), 1u);
  EXPECT_EQ((*events[0].dictionary())[kTelvaneUserInfoClientName], Value(TelvaneBackend::convertIntoSHA256("player")))
      << "user info has method 0, the event has not";
}

TEST_F(HTTPSPostFlushTest, userInfoIsDigestedTwiceInABatchAndOnceAlone) {
  _client.set(kClientEntryFilters, Array{Value(Dictionary{{kFilterKey, "_clientName"}, {kFilterAction, "sha256"}})});
  makeBackend();
  const String once = TelvaneBackend::convertIntoSHA256("player");
  sendMany(1);
  flush();
  EXPECT_EQ(lastEvent()[kTelvaneUserInfoClientName], Value(TelvaneBackend::convertIntoSHA256(once)));
  EXPECT_EQ(posted({})[kTelvaneUserInfoClientName], Value(once));
}

TEST_F(HTTPSPostFlushTest, anEventIsJudgedByTheCategoryThatItSays) {
  _userInfo = Dictionary{{kTelvaneUserInfoClientName, "player"}, {kEventMethod, 9}};
  _client.set(kClientEntryEventWhitelist, Array{7});
  makeBackend();
  sendMany(1, 7);
  EXPECT_EQ(flush()->error, failure("Nothing to flush: batched events were completely filtered out"));
  EXPECT_TRUE(hasLine(log(), "Dropping event with category 9 as it is not whitelisted"));
  EXPECT_EQ(posts().count(), 0u);
}

TEST_F(HTTPSPostFlushTest, aServerErrorDisablesTheBackend) {
  for (const int status : {500, 503, 599}) {
    makeBackend();
    sendMany(1);
    const auto flushed = flush();
    posts().answer(posts().count() - 1, status);
    const std::string text = fmt::format("backend splunk disabled by server {} return code", status);
    EXPECT_EQ(flushed->error, failure(text.c_str(), status));
    EXPECT_EQ(flushed->text, flushed->returned);
    EXPECT_TRUE(hasLine(log(), LogLevel::Default, "postJSONMessage: " + text));
    EXPECT_EQ(backend().state(), TelvaneBackendStateDisabled);
  }
}

TEST_F(HTTPSPostFlushTest, anyOtherStatusIsASuccess) {
  makeBackend();
  for (const int status : {200, 204, 302, 404, 499, 600}) {
    sendMany(1);
    const auto flushed = flush();
    posts().answer(posts().count() - 1, status);
    EXPECT_EQ(flushed->calls, 1);
    EXPECT_EQ(flushed->error, std::nullopt) << status;
    EXPECT_EQ(backend().state(), TelvaneBackendStateEnabled) << status;
  }
}

TEST_F(HTTPSPostFlushTest, aTransportErrorIsSaidAndPassedOnAndTheEventsAreLost) {
  makeBackend();
  sendMany(1);
  const auto flushed = flush();
  const Error error = Error::withDescription("TelvanePlatform", -1004, "Could not connect");
  posts().fail(0, error);
  EXPECT_EQ(flushed->error, error);
  EXPECT_EQ(flushed->text, flushed->returned);
  EXPECT_TRUE(hasLine(log(), LogLevel::Default, "HTTPSPostBackend(postJsonMessage): post error: Could not connect"));
  EXPECT_EQ(backend().state(), TelvaneBackendStateEnabled);
  EXPECT_EQ(flush()->error, failure("Nothing to flush"));
}

TEST_F(HTTPSPostFlushTest, withoutAURLTheFlushFails) {
  _client.set(kClientEntryPostURL, Value());
  makeBackend();
  sendMany(1);
  const auto flushed = flush();
  EXPECT_EQ(flushed->error, failure("postURL is nil"));
  EXPECT_EQ(flushed->calls, 1);
  EXPECT_TRUE(flushed->returned.has_value());
  EXPECT_EQ(flushed->text, flushed->returned) << "the completion gets the text too";
  EXPECT_EQ(posts().count(), 0u);
  process().locale().setCountryCode(String("FR"));
  EXPECT_EQ(backend().updateState(), TelvaneBackendStateEnabled) << "the configuration is frozen";
}

// So a parent session enables a child whose own gates refused: the gates come before links, filters and lists.
TEST_F(HTTPSPostFlushTest, aBackendThatAGateRefusedHasNowhereToSendWhenAnotherEnablesIt) {
  process().locale().setCountryCode(String("FR"));
  makeBackend();
  EXPECT_EQ(backend().state(), TelvaneBackendStateDisabled);
  backend().setState(TelvaneBackendStateEnabled);
  sendMany(1);
  send({}, 7, 2, kRealtimeFlag);
  EXPECT_EQ(posts().count(), 0u);
  sendMany(1);
  EXPECT_EQ(flush()->error, failure("postURL is nil"));
  EXPECT_EQ(posts().count(), 0u);
}

TEST_F(HTTPSPostFlushTest, aBackendKeepsItsConfigurationWhenALaterGateRefuses) {
  _client.set(kClientEntryFilters, Array{Value(Dictionary{{kFilterKey, "n"}, {kFilterAction, "remove"}})});
  makeBackend();
  process().locale().setCountryCode(String("FR"));
  EXPECT_EQ(backend().updateState(), TelvaneBackendStateDisabled);
  backend().setState(TelvaneBackendStateEnabled);
  sendMany(1);
  flush();
  EXPECT_FALSE(lastEvent().contains("n"));
}

TEST_F(HTTPSPostFlushTest, withoutAConnectivityHelperTheRequestIsDroppedSilently) {
  makeBackend();
  backend().setReportingSessionConnectivityDelegate({});
  sendMany(1);
  const auto flushed = flush();
  EXPECT_TRUE(flushed->returned.has_value());
  EXPECT_EQ(flushed->calls, 0);
}

TEST_F(HTTPSPostFlushTest, anAnswerMayComeWhenTheBackendIsGone) {
  auto shortLived = newBackend(profile());
  shortLived->setCompType(_clientType);
  shortLived->setUserInfoDict(_userInfo);
  const auto helper = std::make_shared<RecordingConnectivity>();
  shortLived->setReportingSessionConnectivityDelegate(helper);
  shortLived->setBatchEvents(true);
  shortLived->setRequireUserInfo(true);
  shortLived->updateState();
  shortLived->sendMessage({}, _world.clock().now(), 7, 2, 0);
  std::optional<Error> error;
  shortLived->flushMessagesWithCompletion(
      [&error](std::optional<String>, std::optional<Error> given) { error = std::move(given); });
  const std::weak_ptr<TelvaneBackend> weak = shortLived;
  shortLived.reset();
  _world.runUntilIdle();
  EXPECT_TRUE(weak.expired()) << "a post does not keep the backend";
  helper->answer(0, 503);
  EXPECT_EQ(error, failure("backend splunk disabled by server 503 return code", 503));
}

TEST_F(HTTPSPostFlushTest, aNewCombinedIdentifierCorrectsTheEventsThatWait) {
  makeBackend();
  backend().setCombinedSessionIDString("own");
  sendMany(2);
  backend().setCorrelatedSessionID("parent.own");
  sendMany(1);
  flush();
  for (const Value& event : posts().events(0)) {
    EXPECT_EQ((*event.dictionary())[kEventSessionID], Value("parent.own"));
  }
  EXPECT_EQ(backend().combinedSessionIDString(), String("parent.own"));
}

TEST_F(HTTPSPostFlushTest, countsTheBytesThatWait) {
  makeBackend();
  EXPECT_EQ(backend().batchedEventsSize(), 0u);
  sendMany(1);
  const uint64_t one = backend().batchedEventsSize();
  EXPECT_GT(one, 100u);
  sendMany(1);
  EXPECT_EQ(backend().batchedEventsSize(), 2 * one);
  send({{Key("text"), std::string(10'000, 'x')}, {Key("more"), 1}}, 8);
  const uint64_t all = backend().batchedEventsSize();
  EXPECT_GE(all, 2 * one + 10'000);
  flush();
  uint64_t estimate = 0;
  for (const Value& event : posts().events(0)) estimate += objectSizeEstimate(event);
  EXPECT_EQ(all, estimate);
}

TEST_F(HTTPSPostFlushTest, aFlushThatDiscardsLeavesTheCounts) {
  makeBackend();
  sendMany(30);
  backend().setState(TelvaneBackendStateUnknown);
  flush();
  backend().setState(TelvaneBackendStateEnabled);
  sendMany(20);
  EXPECT_EQ(posts().count(), 0u);
  sendMany(1);
  ASSERT_EQ(posts().count(), 1u);
  EXPECT_EQ(postedNumbers(0), upTo(20));
}

TEST_F(HTTPSPostFlushTest, eventsThatTakeMuchGoBeforeTheThreshold) {
  makeBackend();
  sendLarge(7);
  EXPECT_EQ(posts().count(), 0u);
  EXPECT_TRUE(hasNoLine(log(), "Flushing all batched events"));
  sendLarge(1);
  ASSERT_EQ(posts().count(), 1u);
  EXPECT_EQ(posts().events(0).size(), 7u);
  EXPECT_TRUE(hasLines(log(), 1, "HTTPSPostBackend(batchEvent): Flushing all batched events early as they take 7"));
  flush();
  ASSERT_EQ(posts().count(), 2u);
  EXPECT_EQ(posts().events(1).size(), 1u) << "the event that found no room begins the next batch";
}

TEST_F(HTTPSPostFlushTest, anEarlyFlushBeginsTheCountOfItsEventAnew) {
  makeBackend();
  sendMany(40, 7);
  sendLarge(7);
  send({{Key("text"), std::string(2u << 20, 'x')}}, 7);
  ASSERT_EQ(posts().count(), 1u);
  EXPECT_EQ(posts().events(0).size(), 47u);
  sendMany(49, 7);
  EXPECT_EQ(posts().count(), 1u);
  sendMany(1, 7);
  ASSERT_EQ(posts().count(), 2u);
  EXPECT_EQ(posts().events(1).size(), 50u);
}

TEST_F(HTTPSPostFlushTest, everyFlushCountsTheBytesAnew) {
  makeBackend();
  sendLarge(7);
  flush();
  sendLarge(7);
  backend().setState(TelvaneBackendStateUnknown);
  flush();
  backend().setState(TelvaneBackendStateEnabled);
  sendLarge(7);
  EXPECT_EQ(posts().count(), 1u);
  EXPECT_TRUE(hasNoLine(log(), "early"));
}

TEST_F(HTTPSPostFlushTest, oneEventLargerThanABatchWaitsAlone) {
  makeBackend();
  sendMany(1);
  send({{Key("n"), 1}, {Key("text"), std::string(9u << 20, 'x')}});
  ASSERT_EQ(posts().count(), 1u);
  EXPECT_EQ(postedNumbers(0), upTo(1));
  sendMany(1);
  ASSERT_EQ(posts().count(), 2u);
  EXPECT_EQ(postedNumbers(1), std::vector<int64_t>{1});
}

TEST_F(HTTPSPostFlushTest, anUndecidedBackendLosesWhatTakesTooMuch) {
  makeBackend();
  backend().setState(TelvaneBackendStateUnknown);
  sendLarge(8);
  EXPECT_TRUE(hasLines(log(), 1, "Flushing all batched events early"));
  backend().setState(TelvaneBackendStateEnabled);
  flush();
  ASSERT_EQ(posts().count(), 1u);
  EXPECT_EQ(posts().events(0).size(), 1u);
}

TEST_F(HTTPSPostFlushTest, withoutRequiredUserInfoTheNewestIsDroppedWithOneLinePerBurst) {
  log().expectError("HTTPSPostBackend(batchEvent): Dropped 60 events, since those that wait took 7");
  log().expectError("HTTPSPostBackend(batchEvent): Dropped 2 events, since those that wait took 7");
  makeBackend();
  for (const int tooMany : {60, 2}) {
    const size_t before = posts().count();
    backend().setUserInfoDict({});
    sendLarge(7);
    for (int n = 0; n < tooMany; ++n) send({{Key("text"), std::string(1u << 20, 'x')}}, 7);
    EXPECT_TRUE(hasNoLine(log(), fmt::format("Dropped {} events", tooMany))) << "the burst goes on";
    EXPECT_TRUE(hasNoLine(log(), "Flushing all batched events"))
        << "nothing to flush, and what is dropped does not count";
    EXPECT_EQ(flush()->error, failure("Can not flush: userInfo is required"));
    backend().setUserInfoDict(_userInfo);
    flush();
    ASSERT_EQ(posts().count(), before + 1);
    EXPECT_EQ(posts().events(before).size(), 7u);
    EXPECT_TRUE(hasLines(log(), 1, fmt::format("Dropped {} events", tooMany)));
  }
  sendLarge(8);
  EXPECT_EQ(posts().count(), 3u) << "there is room again";
}

TEST_F(HTTPSPostFlushTest, aBackendThatEndsTellsWhatItDropped) {
  log().expectError("HTTPSPostBackend(batchEvent): Dropped 1 events");
  makeBackend();
  backend().setUserInfoDict({});
  sendLarge(8);
  makeBackend();
  EXPECT_TRUE(hasLines(log(), 1, "Dropped 1 events"));
}

// The body holds user info once for each event, which only shows when it has grown since the events were made.
TEST_F(HTTPSPostFlushTest, userInfoThatHasGrownLeavesRoomForTheOldestEvents) {
  log().expectError("HTTPSPostBackend(flushMessagesWithCompletion): Dropped 2 events, since each would take 11");
  _client.set(kClientEntryFilters,
              Array{Value(Dictionary{{kFilterKey, "blob"}, {kFilterMethod, 7}, {kFilterAction, "remove"}})});
  makeBackend();
  sendMany(4);
  backend().setUserInfoDict(
      Dictionary{{kTelvaneUserInfoClientName, "player"}, {Key("blob"), std::string(11u << 20, 'x')}});
  flush();
  ASSERT_EQ(posts().count(), 1u);
  EXPECT_EQ(postedNumbers(0), upTo(2));
}

TEST_F(HTTPSPostFlushTest, aRealtimeEventFlushesALeftOverBatchOnlyWhenEnabled) {
  makeBackend();
  sendMany(1);
  backend().setState(TelvaneBackendStateSampledOut);
  send({}, 7, 2, kRealtimeFlag);
  EXPECT_EQ(posts().count(), 0u);
  backend().setState(TelvaneBackendStateEnabled);
  send({}, 7, 2, kRealtimeFlag);
  ASSERT_EQ(posts().count(), 2u);
  EXPECT_EQ(posts().events(0).size(), 2u);
}

TEST_F(HTTPSPostFlushTest, aFlushWithoutACompletionDoesTheSame) {
  makeBackend();
  EXPECT_EQ(backend().flushMessagesWithCompletion(nullptr), std::nullopt);
  sendMany(1);
  EXPECT_TRUE(backend().flushMessagesWithCompletion(nullptr).has_value());
  posts().answer(0, 503);
  EXPECT_EQ(backend().state(), TelvaneBackendStateDisabled);
}

}  // namespace
}  // namespace telvane::testing
