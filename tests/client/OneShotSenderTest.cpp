#include "client/OneShotSender.h"

#include "tests/client/ClientFixture.h"

namespace telvane::testing {
namespace {

class OneShotSenderTest : public ClientFixture {
 protected:
  bool send(const Value& info, uint16_t category = 9, const Value& payload = {},
            std::optional<Error>* error = nullptr) {
    return _sender.sendOneMessageWithSessionInfo(info, _userInfo, category, 2, payload, error);
  }

  // Sends an event of which two fit, and not three.
  bool sendLarge(uint16_t category) {
    return send(sessionInfo(), category, Dictionary{{Key("text"), String(std::string(kLarge, 'x'))}});
  }
  // A daemon that takes events and answers when the test says so.
  void givenASilentDaemon() {
    daemon().answer(Operation::SendMessageWithSessionInfo,
                    [this](const ScriptedDaemon::Call&, ipc::ReplyBlock reply) { _kept.push_back(std::move(reply)); });
  }
  void answer(size_t index) {
    std::exchange(_kept[index], {})(Array{"finished"});
    run();
  }
  std::vector<int64_t> categories() {
    std::vector<int64_t> sent;
    for (const ScriptedDaemon::Call& call : daemon().calls()) sent.push_back(call.arguments[2].integerValue());
    return sent;
  }

  static constexpr size_t kLarge = OneShotSender::kMaximumWaitingBytes / 5 * 2;
  std::vector<ipc::ReplyBlock> _kept;
  const Dictionary _userInfo{{kTelvaneUserInfoClientName, "app"}};
  OneShotSender _sender{_context};
};

TEST_F(OneShotSenderTest, sendsOneEventAndEndsTheConnectionWithTheAnswer) {
  daemon().answer(Operation::SendMessageWithSessionInfo, Array{"finished"});
  std::optional<Error> error = Error("old", 1);
  EXPECT_TRUE(send(sessionInfo(), 40000, Dictionary{{Key("a"), 1}}, &error));
  EXPECT_EQ(error, std::nullopt);
  EXPECT_TRUE(daemon().calls().empty()) << "nothing is sent on the caller's thread";
  run();
  ASSERT_EQ(daemon().operations(), Operations{Operation::SendMessageWithSessionInfo});
  Dictionary info = sessionInfo();
  info.set(kTelvaneSessionInfoBatchEvent, false);
  EXPECT_EQ(daemon().calls()[0].arguments, (Array{info, _userInfo, 40000, 2, Dictionary{{Key("a"), 1}}}));
  EXPECT_EQ(daemon().endedConnectionCount(), 1u);
  EXPECT_TRUE(hasLines(log(), 1, "startLogging: Client starts logging..."));
  EXPECT_TRUE(hasLines(log(), 1, "finished"));
  EXPECT_TRUE(hasLines(log(), 1, "sendOneMessageWithSessionInfo: XPC connection invalidated"));
}

TEST_F(OneShotSenderTest, keepsTheConnectionUntilTheAnswerComes) {
  ipc::ReplyBlock kept;
  daemon().answer(Operation::SendMessageWithSessionInfo,
                  [&](const ScriptedDaemon::Call&, ipc::ReplyBlock reply) { kept = std::move(reply); });
  EXPECT_TRUE(send(sessionInfo()));
  run();
  EXPECT_EQ(daemon().endedConnectionCount(), 0u);
  kept(Array{"storebag not available"});
  run();
  EXPECT_EQ(daemon().endedConnectionCount(), 1u);
  EXPECT_TRUE(hasLines(log(), 1, "storebag not available"));
}

TEST_F(OneShotSenderTest, sendsAnEmptyDictionaryForAnAbsentPayload) {
  daemon().answer(Operation::SendMessageWithSessionInfo, Array{"finished"});
  EXPECT_TRUE(send(sessionInfo()));
  run();
  EXPECT_EQ(daemon().last(Operation::SendMessageWithSessionInfo).arguments[4], Value(Dictionary()));
}

TEST_F(OneShotSenderTest, turnsBatchingOffInItsCopyOfTheSessionInfo) {
  daemon().answer(Operation::SendMessageWithSessionInfo, Array{"finished"});
  Dictionary info = sessionInfo();
  info.set(kTelvaneSessionInfoBatchEvent, true);
  EXPECT_TRUE(send(info));
  run();
  EXPECT_EQ((*daemon().calls()[0].arguments[0].dictionary())[kTelvaneSessionInfoBatchEvent], Value(false));
  EXPECT_EQ(info[kTelvaneSessionInfoBatchEvent], Value(true));
}

TEST_F(OneShotSenderTest, refusesASessionInfoThatIsNotValid) {
  log().expectError("validateSessionInfo: sessionInfo is nil");
  log().expectError("validateSessionInfo: clientType is invalid");
  std::optional<Error> error;
  EXPECT_FALSE(send(Value(), 9, {}, &error));
  EXPECT_THAT(error, HasCode(2));
  EXPECT_FALSE(send(sessionInfo(31), 9, {}, &error));
  EXPECT_THAT(error, HasCode(3));
  EXPECT_EQ(error->domain(), "TelvaneErrorDomain");
}

TEST_F(OneShotSenderTest, makesNoConnectionForCategoryZero) {
  std::optional<Error> error;
  EXPECT_FALSE(send(sessionInfo(), 0, {}, &error));
  EXPECT_THAT(error, HasCode(4));
  EXPECT_FALSE(send(sessionInfo(), 0));
  run();
  EXPECT_EQ(daemon().connectionCount(), 0u);
}

TEST_F(OneShotSenderTest, refusesAPayloadThatIsNoDictionary) {
  std::optional<Error> error;
  EXPECT_FALSE(send(sessionInfo(), 9, Array{1}, &error));
  EXPECT_THAT(error, HasCode(4));
}

TEST_F(OneShotSenderTest, asksNeitherForTheEnableFlagNorForTheRightToLookUp) {
  log().expectError("sendOneMessageWithSessionInfo: Failed to get remote object proxy");
  daemon().answer(Operation::SendMessageWithSessionInfo, Array{"finished"});
  _world.services().denyLookUp("client", kTelvanedServiceName, EPERM);
  Dictionary info = sessionInfo();
  info.set(kTelvaneSessionInfoEnableFlag, 0);
  EXPECT_TRUE(send(info));
  run();
  EXPECT_TRUE(hasNoLine(log(), "not entitled"));
  EXPECT_TRUE(hasNoLine(log(), "the session is disabled"));
  EXPECT_TRUE(hasLine(log(), "startLogging: Client starts logging..."));
}

TEST_F(OneShotSenderTest, sendsOneAfterAnotherEachOverItsOwnConnection) {
  daemon().answer(Operation::SendMessageWithSessionInfo, Array{"finished"});
  for (uint16_t category = 1; category <= 5; ++category) EXPECT_TRUE(send(sessionInfo(), category));
  run();
  EXPECT_EQ(daemon().connectionCount(), 5u);
  EXPECT_EQ(daemon().endedConnectionCount(), 5u);
  EXPECT_EQ(daemon().count(Operation::SendMessageWithSessionInfo), 5u);
}

TEST_F(OneShotSenderTest, waitsForTheAnswerSoThatABurstIsNeverSeveralSessionsAtOnce) {
  std::vector<ipc::ReplyBlock> kept;
  daemon().answer(Operation::SendMessageWithSessionInfo,
                  [&](const ScriptedDaemon::Call&, ipc::ReplyBlock reply) { kept.push_back(std::move(reply)); });
  constexpr size_t kBurst = 12;
  for (size_t i = 0; i < kBurst; ++i) EXPECT_TRUE(send(sessionInfo()));
  for (size_t i = 0; i < kBurst; ++i) {
    run();
    ASSERT_EQ(kept.size(), i + 1);
    kept.back()(Array{"finished"});
  }
  run();
  EXPECT_EQ(daemon().endedConnectionCount(), kBurst);
}

TEST_F(OneShotSenderTest, anAnswerThatTakesLongHoldsUpTheOthersForTenSecondsOnly) {
  std::vector<ipc::ReplyBlock> kept;
  daemon().answer(Operation::SendMessageWithSessionInfo,
                  [&](const ScriptedDaemon::Call&, ipc::ReplyBlock reply) { kept.push_back(std::move(reply)); });
  EXPECT_TRUE(send(sessionInfo()));
  EXPECT_TRUE(send(sessionInfo()));
  run();
  _world.advance(std::chrono::seconds(9));
  EXPECT_EQ(kept.size(), 1u);
  _world.advance(std::chrono::seconds(2));
  EXPECT_EQ(kept.size(), 2u);
  for (ipc::ReplyBlock& reply : kept) reply(Array{"finished"});
  run();
  EXPECT_EQ(daemon().endedConnectionCount(), 2u);
}

TEST_F(OneShotSenderTest, dropsTheNewestBeyondTheBoundUntilTheDaemonHasAnswered) {
  log().expectError("sendOneMessageWithSessionInfo: Dropping events: more than 33554432 bytes wait for the daemon");
  log().expectError("sendOneMessageWithSessionInfo: Dropped 3 events");
  givenASilentDaemon();
  EXPECT_TRUE(sendLarge(1));
  EXPECT_TRUE(sendLarge(2));
  EXPECT_TRUE(sendLarge(3)) << "dropping an event is no error of its caller's";
  EXPECT_TRUE(hasLines(log(), 1, "Dropping events")) << "told at once: this daemon may never answer";
  EXPECT_TRUE(sendLarge(4));
  run();
  _world.advance(std::chrono::seconds(60));
  EXPECT_TRUE(sendLarge(5));
  run();
  EXPECT_EQ(categories(), (std::vector<int64_t>{1, 2})) << "what is with the daemon still takes its memory";
  EXPECT_TRUE(hasLines(log(), 1, "Dropping events")) << "one line per burst";
  answer(0);
  EXPECT_TRUE(hasLines(log(), 1, "Dropped 3 events"));
  EXPECT_TRUE(sendLarge(6));
  run();
  EXPECT_EQ(categories(), (std::vector<int64_t>{1, 2, 6})) << "there is room again";
  answer(1);
  answer(2);
  EXPECT_EQ(daemon().endedConnectionCount(), 3u);
  EXPECT_TRUE(hasLines(log(), 2, "Dropp"));
}

TEST_F(OneShotSenderTest, countsAllThatAnEventHolds) {
  log().expectError("sendOneMessageWithSessionInfo: Dropping events");
  log().expectError("sendOneMessageWithSessionInfo: Dropped 1 events");
  givenASilentDaemon();
  Dictionary info = sessionInfo();
  info.set(kTelvaneSessionInfoSessionID, String(std::string(kLarge, 'x')));
  EXPECT_TRUE(send(info, 1));
  const Dictionary userInfo{{kTelvaneUserInfoClientName, String(std::string(kLarge, 'x'))}};
  EXPECT_TRUE(_sender.sendOneMessageWithSessionInfo(sessionInfo(), userInfo, 2, 2, {}, nullptr));
  EXPECT_TRUE(sendLarge(3));
  EXPECT_TRUE(send(sessionInfo(), 4)) << "a small one fits yet";
  run();
  for (size_t i = 0; i < 3; ++i) {
    ASSERT_EQ(_kept.size(), i + 1);
    answer(i);
  }
  EXPECT_EQ(categories(), (std::vector<int64_t>{1, 2, 4}));
}

TEST_F(OneShotSenderTest, hasRoomAgainAfterConnectionsThatEndWithoutAnAnswer) {
  log().expectError("sendOneMessageWithSessionInfo: Failed to get remote object proxy");
  daemon().stop();
  for (int round = 0; round < 3; ++round) {
    EXPECT_TRUE(sendLarge(1));
    EXPECT_TRUE(sendLarge(2));
    run();
  }
  EXPECT_TRUE(hasNoLine(log(), "Dropp"));
  EXPECT_TRUE(hasLines(log(), 6, "sendOneMessageWithSessionInfo: XPC connection invalidated"));
}

TEST_F(OneShotSenderTest, opensOnlySoManyConnectionsToADaemonThatDoesNotAnswer) {
  givenASilentDaemon();
  constexpr size_t kMost = OneShotSender::kMaximumConnections;
  for (size_t i = 0; i < kMost + 2; ++i) EXPECT_TRUE(send(sessionInfo()));
  run();
  _world.advance(std::chrono::seconds(10 * (kMost + 2)));
  EXPECT_EQ(daemon().connectionCount(), kMost) << "each takes a descriptor of the host's";
  answer(0);
  EXPECT_EQ(daemon().connectionCount(), kMost + 1);
  answer(1);
  _world.advance(std::chrono::seconds(10));
  EXPECT_EQ(daemon().connectionCount(), kMost + 2);
  for (size_t i = 2; i < _kept.size(); ++i) answer(i);
  EXPECT_EQ(daemon().endedConnectionCount(), kMost + 2);
}

TEST_F(OneShotSenderTest, logsAnAnswerThatIsNoTextAsAbsent) {
  for (const Value& status : {Value(), Value(7)}) {
    daemon().answer(Operation::SendMessageWithSessionInfo, Array{status});
    EXPECT_TRUE(send(sessionInfo()));
    run();
  }
  EXPECT_TRUE(hasLines(log(), 2, "(null)"));
  EXPECT_EQ(daemon().endedConnectionCount(), 2u);
}

TEST_F(OneShotSenderTest, letsTheConnectionGoWhenTheAnswerCanNoLongerCome) {
  log().expectError("sendOneMessageWithSessionInfo: Failed to get remote object proxy");
  EXPECT_TRUE(send(sessionInfo()));
  run();
  daemon().connection().invalidate();
  run();
  EXPECT_TRUE(hasLines(log(), 1, "sendOneMessageWithSessionInfo: XPC connection interrupted"));
  EXPECT_TRUE(_context.pendingWork().waitUntilNone(client().platform().dispatch, std::chrono::seconds(0)))
      << "nothing may be left under way";
}

TEST_F(OneShotSenderTest, onlyLogsADaemonThatIsNotThere) {
  log().expectError("sendOneMessageWithSessionInfo: Failed to get remote object proxy");
  daemon().stop();
  EXPECT_TRUE(send(sessionInfo()));
  run();
  EXPECT_TRUE(hasLines(log(), 1, "sendOneMessageWithSessionInfo: Failed to get remote object proxy"));
  EXPECT_TRUE(hasLines(log(), 1, "sendOneMessageWithSessionInfo: XPC connection invalidated"));
}

TEST_F(OneShotSenderTest, holdsTheEndOfTheProcessUpUntilTheAnswer) {
  daemon().answer(Operation::SendMessageWithSessionInfo, Array{"finished"});
  EXPECT_TRUE(send(sessionInfo()));
  EXPECT_TRUE(_context.pendingWork().waitUntilNone(client().platform().dispatch, std::chrono::seconds(2)));
  EXPECT_EQ(daemon().count(Operation::SendMessageWithSessionInfo), 1u);
}

}  // namespace
}  // namespace telvane::testing
