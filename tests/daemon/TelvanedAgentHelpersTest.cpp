// The pool of connectivity helpers, and how the daemon comes to its end.
#include "tests/daemon/DaemonFixture.h"

namespace telvane::testing {
namespace {

using namespace std::chrono_literals;

constexpr char kCreating[] = "requestSharedConnectivityHelperForReportingSession: Creating shared connectivity helper ";
constexpr char kFound[] =
    "requestSharedConnectivityHelperForReportingSession: Found existing shared connectivity helper ";
constexpr char kZero[] = "reached zero. Invalidating the helper";

class TelvanedAgentHelpersTest : public DaemonFixture {};

TEST_F(TelvanedAgentHelpersTest, namesAreMatchedWithoutRegardToCase) {
  const auto first = openSession(sessionInfo(), userInfo("Foo", "Bar"));
  const auto second = openSession(sessionInfo(), userInfo("foo", "bar"));
  EXPECT_TRUE(hasLines(log(), 1, kCreating));
  EXPECT_TRUE(hasLines(log(), 1, std::string(kFound) + "for userInfoKey foo:bar"));
}

TEST_F(TelvanedAgentHelpersTest, aMissingNameIsEmptyInTheKey) {
  const auto client = openSession(sessionInfo(), Dictionary{{kTelvaneUserInfoClientName, "x"}});
  EXPECT_TRUE(hasLine(log(), std::string(kCreating) + "for userInfoKey x:"));
  EXPECT_TRUE(hasNoLine(log(), "for userInfoKey x::"));
}

TEST_F(TelvanedAgentHelpersTest, anotherServiceGetsAnotherHelper) {
  const auto first = openSession(sessionInfo(), userInfo("a", "b"));
  const auto second = openSession(sessionInfo(), userInfo("a", "c"));
  EXPECT_TRUE(hasLines(log(), 2, kCreating));
}

TEST_F(TelvanedAgentHelpersTest, aUserInfoWithoutNamesGetsNone) {
  const auto client = openSession(sessionInfo(), Dictionary{{Key("other"), "x"}});
  EXPECT_EQ(sessions()[0]->userInfo(), Value(Dictionary{{Key("other"), "x"}}));
  EXPECT_TRUE(hasNoLine(log(), "Requesting shared connectivity helper"));
  EXPECT_TRUE(hasNoLine(log(), "ReportingSessionConnectivityHelper created"));
}

TEST_F(TelvanedAgentHelpersTest, anUnusedHelperGoesAfterItsReleaseTimeout) {
  auto client = openSession();
  client->close();
  world.advance(29s);
  EXPECT_TRUE(hasNoLine(log(), kZero));
  world.advance(2s);
  EXPECT_TRUE(hasLines(log(), 1, kZero));
  EXPECT_TRUE(hasLines(log(), 1, "ReportingSessionConnectivityHelper dealloced with ID <inactive>"));
  EXPECT_EQ(process.transactions().open(), 0);
}

TEST_F(TelvanedAgentHelpersTest, aSessionInTimeKeepsTheHelper) {
  auto client = openSession();
  client->close();
  world.advance(29s);
  const auto next = openSession();
  world.advance(1h);
  EXPECT_TRUE(hasNoLine(log(), kZero));
  EXPECT_TRUE(hasLines(log(), 1, kCreating));
}

TEST_F(TelvanedAgentHelpersTest, theStorebagsReleaseTimeoutCounts) {
  log().expectError("TelvaneBackend(newBackendWithName): release_timeout");
  givenStorebag(StorebagBuilder().set(kStorebagReleaseTimeout, 120));
  auto client = startSession();
  client->close();
  world.advance(119s);
  EXPECT_EQ(process.transactions().open(), 1);
  world.advance(2s);
  EXPECT_TRUE(hasLine(log(), "release timer fired for NSURLSession with ID <"));
  EXPECT_TRUE(hasLine(log(), ">, timeout 120s"));
  EXPECT_EQ(process.transactions().open(), 0);
}

TEST_F(TelvanedAgentHelpersTest, aReleaseTimeoutOf0KeepsTheHelperForEverAndReturnsHoldsAtOnce) {
  log().expectError("TelvaneBackend(newBackendWithName): release_timeout");
  givenStorebag(StorebagBuilder().set(kStorebagReleaseTimeout, 0));
  auto client = startSession();
  client->close();
  EXPECT_EQ(process.transactions().open(), 0);
  world.advance(24h);
  EXPECT_TRUE(hasNoLine(log(), kZero));
}

TEST_F(TelvanedAgentHelpersTest, postsUnderWayHoldTheDaemonUntilTheyEnd) {
  givenStorebag();
  world.network().answer(StorebagBuilder::kPostURL, NetworkAnswer::ok().after(50s));
  auto client = startSession();
  client->close();
  world.advance(35s);
  EXPECT_TRUE(hasLines(log(), 1, kZero));
  EXPECT_EQ(process.transactions().open(), 1);
  world.advance(20s);
  EXPECT_EQ(process.transactions().open(), 0);
}

TEST_F(TelvanedAgentHelpersTest, shuttingDownEndsSessionsAndWaitsForNoReleaseTimer) {
  givenStorebag();
  const auto first = startSession();
  const auto second = startSession(sessionInfo(), userInfo("other"));
  service->shutDown();
  world.runUntilIdle();
  EXPECT_TRUE(first->isInvalidated());
  EXPECT_TRUE(sessions().empty());
  EXPECT_EQ(postedEvents(0, 1).size(), 2u);
  EXPECT_EQ(process.transactions().open(), 0);
  EXPECT_TRUE(hasNoLine(log(), "release timer fired"));
}

TEST_F(TelvanedAgentHelpersTest, shuttingDownLetsRunningPostsFinish) {
  givenStorebag();
  world.network().answer(StorebagBuilder::kPostURL, NetworkAnswer::ok().after(5s));
  const auto client = startSession();
  service->shutDown();
  service->shutDown();
  world.runUntilIdle();
  EXPECT_EQ(process.transactions().open(), 1);
  world.advance(6s);
  EXPECT_EQ(process.transactions().open(), 0);
  EXPECT_EQ(postedEvents(0, 1).size(), 1u);
}

TEST_F(TelvanedAgentHelpersTest, aDaemonThatEndsTakesNobodyIn) {
  startDaemon();
  service->shutDown();
  EXPECT_TRUE(connect()->isInvalidated());
  EXPECT_EQ(process.transactions().begun(), 0);
}

}  // namespace
}  // namespace telvane::testing
