// Acceptance, the registry of sessions, and the holds on the process.
#include "tests/daemon/DaemonFixture.h"

namespace telvane::testing {
namespace {

class TelvanedAgentTest : public DaemonFixture {
 protected:
  std::unique_ptr<DaemonClient> connectWith(std::set<std::string> entitlements) {
    startDaemon();
    return std::make_unique<DaemonClient>(world,
                                          world.makeProcess("stranger", {.entitlements = std::move(entitlements)}));
  }
};

TEST_F(TelvanedAgentTest, theFirstConnectionBeginsTheTransactionAndTheSecondJoinsIt) {
  const auto first = connect();
  EXPECT_TRUE(hasLines(log(), 1, "createReportingSessionWithDelegate: XPC transaction started with session "));
  EXPECT_TRUE(hasLines(log(), 1, "createReportingSessionWithDelegate: retained XPC Transaction. Ref count is 1"));
  const auto second = connect();
  EXPECT_TRUE(hasLines(log(), 1, "createReportingSessionWithDelegate: retained XPC Transaction. Ref count is 2"));
  EXPECT_TRUE(hasLines(log(), 1, "XPC transaction started with session "));
  EXPECT_EQ(process.transactions().begun(), 1);
  EXPECT_EQ(process.transactions().open(), 1);
}

TEST_F(TelvanedAgentTest, releasingMoreHoldsThanThereAreEndsTheTransactionOnce) {
  const auto first = connect();
  const auto second = connect();
  agent().releaseXPCTransactions(3);
  EXPECT_TRUE(hasLine(log(), "releaseXPCTransactions: XPC transaction ref count is -1, decremented by 3"));
  EXPECT_TRUE(hasLines(log(), 1, "releaseXPCTransactions: XPC transaction ended"));
  EXPECT_EQ(process.transactions().open(), 0);
  const auto third = connect();
  EXPECT_TRUE(hasLine(log(), "retained XPC Transaction. Ref count is 0"));
  EXPECT_EQ(process.transactions().begun(), 1);
  EXPECT_EQ(process.transactions().surplusEnds(), 0);
}

TEST_F(TelvanedAgentTest, releasingWithoutHoldsDoesNothing) {
  agent().releaseXPCTransactions(1);
  EXPECT_TRUE(hasNoLine(log(), "releaseXPCTransactions"));
  EXPECT_EQ(process.transactions().surplusEnds(), 0);
}

TEST_F(TelvanedAgentTest, refusesAConnectionWithoutTheEntitlement) {
  const auto stranger = connectWith({"com.example.other"});
  EXPECT_TRUE(stranger->isInvalidated());
  EXPECT_TRUE(hasLines(log(), 1, "does not have required telvane entitlement. Closing connection..."));
  EXPECT_TRUE(sessions().empty());
  EXPECT_EQ(process.transactions().begun(), 0);
}

TEST_F(TelvanedAgentTest, acceptsAConnectionWithTheEntitlement) {
  const auto client = connectWith({kTelvanedEntitlement});
  EXPECT_FALSE(client->isInvalidated());
  EXPECT_EQ(sessions().size(), 1u);
  EXPECT_TRUE(hasLine(log(), "as it has proper entitlement, 0(0) connections."));
}

TEST_F(TelvanedAgentTest, theSecondFigureOfAcceptanceCountsHierarchies) {
  const auto first = openSession();
  const auto second = openSession();
  const auto third = openSession(sessionInfoIn("a", 0));
  EXPECT_TRUE(hasLine(log(), "as it has proper entitlement, 2(0) connections."));
  const auto fourth = openSession(sessionInfoIn("a", 1));
  EXPECT_TRUE(hasLine(log(), "as it has proper entitlement, 3(1) connections."));
  const auto fifth = connect();
  EXPECT_TRUE(hasLine(log(), "as it has proper entitlement, 4(1) connections."));
}

TEST_F(TelvanedAgentTest, aConnectionThatEndsUnlistsItsSessionAndGivesItsHoldBack) {
  auto client = connect();
  client->close();
  EXPECT_TRUE(sessions().empty());
  EXPECT_TRUE(hasLines(log(), 2, "listener: XPC connection to <TelvanedSession 0 "));
  EXPECT_TRUE(hasLines(log(), 1, "invalidateReportingSession: TelvanedSession <TelvanedSession "));
  EXPECT_TRUE(hasLine(log(),
                      "TelvanedSession dealloc: release XPC transaction for session without connectivity helper "
                      "for session 0"));
  EXPECT_EQ(process.transactions().open(), 0);
}

TEST_F(TelvanedAgentTest, aKilledClientEndsItsSessionToo) {
  SimulatedPlatform& killed = world.makeProcess("victim", {.entitlements = {kTelvanedEntitlement}});
  startDaemon();
  const DaemonClient client(world, killed);
  EXPECT_EQ(sessions().size(), 1u);
  killed.kill();
  world.runUntilIdle();
  EXPECT_TRUE(sessions().empty());
  EXPECT_TRUE(hasLine(log(), "was interrupted"));
  EXPECT_EQ(process.transactions().open(), 0);
}

TEST_F(TelvanedAgentTest, aHoldEndsWithTheSessionObjectAndNotWithItsConnection) {
  auto client = connect();
  auto kept = sessions();
  client->close();
  EXPECT_EQ(process.transactions().open(), 1);
  kept.clear();
  EXPECT_EQ(process.transactions().open(), 0);
}

TEST_F(TelvanedAgentTest, aSessionWithAHelperLeavesItsHoldToIt) {
  givenStorebag();
  auto client = startSession();
  client->close();
  world.runUntilIdle();
  EXPECT_TRUE(hasLine(log(), "TelvanedSession dealloc: incrementing total sessions count for session 42"));
  EXPECT_EQ(process.transactions().open(), 1);
  world.advance(std::chrono::seconds(29));
  EXPECT_EQ(process.transactions().open(), 1);
  world.advance(std::chrono::seconds(2));
  EXPECT_EQ(process.transactions().open(), 0);
  EXPECT_TRUE(hasLine(log(), "releaseXPCTransactions: XPC transaction ref count is 0, decremented by 1"));
}

TEST_F(TelvanedAgentTest, theLastSessionOfAHierarchyTakesItsSharedDataAlong) {
  auto parent = openSession(sessionInfoIn("a", 0));
  auto child = openSession(sessionInfoIn("a", 1));
  parent->tell(ClientSessionOperation::UpdateSharedDataForKey, {"k", 1});
  parent->close();
  {
    const auto kept = sessions();
    EXPECT_EQ(agent().sharedDataForSession(*kept[0]), (Dictionary{{Key("k"), 1}}));
  }
  child->close();
  const auto again = openSession(sessionInfoIn("a", 0));
  EXPECT_EQ(agent().sharedDataForSession(*sessions()[0]), std::nullopt);
  EXPECT_TRUE(hasLines(log(), 2, "as it has proper entitlement, 0(0) connections."));
}

TEST_F(TelvanedAgentTest, countersNeverGoBelowZero) {
  auto never = connect();
  never->close();
  EXPECT_TRUE(hasNoLine(log(), "got decremented"));
  auto counted = openSession();
  counted->close();
  EXPECT_TRUE(hasLines(log(), 1, "active session count for clientType 6 got decremented to 0"));
}

TEST_F(TelvanedAgentTest, aClientTypeThatIsNoneTakesNothingAwayFromAnother) {
  const auto counted = openSession();
  log().expectError("missing clientType in its sessionInfo");
  for (const Value& type : {Value(6 + (int64_t{1} << 32)), Value(-1), Value(40), Value(6 - (int64_t{1} << 32))}) {
    Dictionary info = sessionInfo();
    info.set(kTelvaneSessionInfoClientType, type);
    const auto wrong = openSession(info);
    EXPECT_TRUE(wrong->isInvalidated()) << description(type);
  }
  EXPECT_TRUE(hasNoLine(log(), "got decremented")) << log().text();
}

}  // namespace
}  // namespace telvane::testing
