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
