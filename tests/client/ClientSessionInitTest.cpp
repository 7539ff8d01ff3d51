#include <cerrno>

#include "client/ClientSession.h"
#include "tests/client/ClientFixture.h"
#include "tests/support/PassingDispatch.h"

namespace telvane::testing {
namespace {

// Connections that cannot be made.
class NoConnections final : public ipc::Service {
 public:
  Result<std::unique_ptr<ipc::Listener>> newListener(const std::string&) override { return Error("none", EMFILE); }
  Result<std::shared_ptr<ipc::Connection>> newConnection(const std::string&) override { return Error("none", EMFILE); }
  int checkLookUp(const std::string&) const override { return 0; }
};

// Queues that cannot be made; everything else is another dispatch's.
class NoSerialQueues final : public PassingDispatch {
 public:
  using PassingDispatch::PassingDispatch;
  std::shared_ptr<SerialQueue> newSerialQueue(std::string, QualityOfService) override { return nullptr; }
};

class ClientSessionInitTest : public ClientFixture {};

TEST_F(ClientSessionInitTest, tellsTheDaemonTheThreeArgumentsUnchanged) {
  const Dictionary info{{kTelvaneSessionInfoClientType, 7}, {kTelvaneSessionInfoSessionID, 12}};
  const Dictionary userInfo{{kTelvaneUserInfoClientName, "app"}};
  const auto session = open(info, userInfo, Array{"A", "B"});
  ASSERT_NE(session, nullptr);
  run();
  ASSERT_EQ(daemon().operations(), Operations{Operation::SetSessionInfo});
  EXPECT_EQ(daemon().calls()[0].arguments, (Array{info, userInfo, Array{"A", "B"}, false}));
  EXPECT_TRUE(hasLines(log(), 1, "startLogging: Client starts logging..."));
}

TEST_F(ClientSessionInitTest, leavesAbsentArgumentsAbsent) {
  const auto session = open();
  run();
  ASSERT_EQ(daemon().calls().size(), 1u);
  EXPECT_FALSE(daemon().calls()[0].arguments[1].isPresent());
  EXPECT_FALSE(daemon().calls()[0].arguments[2].isPresent());
}

TEST_F(ClientSessionInitTest, tellsThatThereIsAnAggregationBlock) {
  const auto session = open(sessionInfo(), {}, {}, [](const Value&, double, uint16_t, uint16_t, const Value&) {});
  run();
  ASSERT_EQ(daemon().calls().size(), 1u);
  EXPECT_EQ(daemon().calls()[0].arguments[3], Value(true));
}

TEST_F(ClientSessionInitTest, refusesAMissingSessionInfo) {
  log().expectError("validateSessionInfo: sessionInfo is nil");
  EXPECT_EQ(open(Value()), nullptr);
  EXPECT_EQ(open("text"), nullptr);
  run();
  EXPECT_EQ(daemon().connectionCount(), 0u);
  EXPECT_TRUE(hasNoLine(log(), "startLogging"));
}

TEST_F(ClientSessionInitTest, acceptsClientTypesFrom5To30Only) {
  log().expectError("validateSessionInfo: clientType is invalid");
  for (int type : {-1, 0, 4, 31, 1000}) EXPECT_EQ(open(sessionInfo(type)), nullptr) << type;
  EXPECT_EQ(open(Dictionary()), nullptr) << "a missing client type";
  EXPECT_EQ(open(Dictionary{{kTelvaneSessionInfoClientType, Array{7}}}), nullptr) << "a client type that is a list";
  EXPECT_NE(open(sessionInfo(5)), nullptr);
  EXPECT_NE(open(sessionInfo(30)), nullptr);
  EXPECT_EQ(log().count(LogLevel::Error, "validateSessionInfo: clientType is invalid"), 7u) << log().text();
}

TEST_F(ClientSessionInitTest, makesNoConnectionForADisabledSession) {
  Dictionary info = sessionInfo();
  info.set(kTelvaneSessionInfoEnableFlag, 0);
  EXPECT_EQ(open(info), nullptr);
  info.set(kTelvaneSessionInfoEnableFlag, false);
  EXPECT_EQ(open(info), nullptr);
  run();
  EXPECT_EQ(daemon().connectionCount(), 0u);
  EXPECT_TRUE(hasLines(log(), 2, "initWithSessionInfo: the session is disabled"));
}

TEST_F(ClientSessionInitTest, opensASessionThatSaysItIsEnabled) {
  Dictionary info = sessionInfo();
  info.set(kTelvaneSessionInfoEnableFlag, 1);
  EXPECT_NE(open(info), nullptr);
}

TEST_F(ClientSessionInitTest, refusesWhereTheServiceMustNotBeLookedUp) {
  _world.services().denyLookUp("client", kTelvanedServiceName, EPERM);
  EXPECT_EQ(open(), nullptr);
  run();
  EXPECT_EQ(daemon().connectionCount(), 0u);
  EXPECT_TRUE(hasLine(log(), LogLevel::Default, "initWithSessionInfo: XPC not entitled, 1"));
}

TEST_F(ClientSessionInitTest, refusesWithoutResourcesForAConnection) {
  NoConnections none;
  const Platform& platform = client().platform();
  ClientContext context{
      ClientPlatform(platform.clock, platform.dispatch, platform.log, platform.random, platform.userDefaults, none)};
  log().expectError("initWithSessionInfo: Failed to connect to daemon");
  EXPECT_EQ(TelvaneFactory::initWithSessionInfo(context, sessionInfo()), nullptr);
}

TEST_F(ClientSessionInitTest, letsTheConnectionGoWhenThereIsNoQueue) {
  NoSerialQueues none(client().platform().dispatch);
  const Platform& platform = client().platform();
  ClientContext context{ClientPlatform(platform.clock, none, platform.log, platform.random, platform.userDefaults,
                                       platform.localService)};
  log().expectError("initWithSessionInfo: Failed to create reporting queue");
  EXPECT_EQ(TelvaneFactory::initWithSessionInfo(context, sessionInfo()), nullptr);
  run();
  EXPECT_EQ(daemon().operations(), Operations{Operation::SetSessionInfo}) << "the session info was sent before";
  EXPECT_EQ(daemon().endedConnectionCount(), 1u);
}

TEST_F(ClientSessionInitTest, opensASessionWhenNoDaemonRuns) {
  daemon().stop();
  const auto session = open();
  EXPECT_NE(session, nullptr);
  log().allowErrors();
  run();
  EXPECT_TRUE(hasLine(log(), LogLevel::Default, "initWithSessionInfo: XPC connection invalidated"));
  EXPECT_TRUE(hasLine(log(), LogLevel::Error, "initWithSessionInfo: Failed to get remote object proxy: "));
}

TEST_F(ClientSessionInitTest, onlyLogsARefusedConnection) {
  daemon().refuse();
  const auto session = open();
  ASSERT_NE(session, nullptr);
  log().allowErrors();
  run();
  EXPECT_TRUE(hasLines(log(), 1, "initWithSessionInfo: XPC connection invalidated"));
  EXPECT_TRUE(session->sendMessageWithCategory(1, 1));
  run();
  EXPECT_TRUE(hasLine(log(), LogLevel::Error, "sendMessageWithDictionary: Failed to get remote object proxy: "));
}

TEST_F(ClientSessionInitTest, usesTheSameConnectionAgainAfterAnInterruption) {
  const auto session = open();
  run();
  daemon().connection().invalidate();
  run();
  EXPECT_TRUE(hasLines(log(), 1, "initWithSessionInfo: XPC connection interrupted"));
  EXPECT_TRUE(session->sendMessageWithCategory(3, 1));
  run();
  EXPECT_EQ(daemon().connectionCount(), 2u);
  EXPECT_EQ(daemon().operations(), (Operations{Operation::SetSessionInfo, Operation::SendMessageWithDictionary}))
      << "the daemon's new session is told nothing";
  daemon().answer(Operation::SendMessageWithDictionary, Array{Value()});
  daemon().dropReplies();
  log().expectError("sendMessageWithDictionary: Failed to get remote object proxy");
  run();
}

TEST_F(ClientSessionInitTest, givesAggregatedMessagesToTheBlock) {
  std::vector<Array> received;
  const auto session =
      open(sessionInfo(), {}, {},
           [&](const Value& sender, double timestamp, uint16_t category, uint16_t type, const Value& payload) {
             received.push_back({sender, timestamp, category, type, payload});
           });
  run();
  const Array arguments{sessionInfo(9), 1.5, 40000, 2, Dictionary{{Key("a"), 1}}};
  daemon().connection().send({static_cast<uint16_t>(ClientSessionReplyOperation::SendMessageToClient), arguments, {}},
                             {});
  run();
  ASSERT_EQ(received.size(), 1u);
  EXPECT_EQ(received[0], arguments);
}

}  // namespace
}  // namespace telvane::testing
