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

// The pool is told that nobody is left by a job that has long been queued when a session asks for the helper. Which of
// the two comes first is the seed's choice, so it is tried often.
TEST_F(TelvanedAgentHelpersTest, aHelperThatIsAskedForWhenItsTimerFiresServesWhoAsked) {
  constexpr int kAttempts = 40;
  givenStorebag(StorebagBuilder().set(kStorebagReleaseTimeout, 1));
  log().expectError("newBackendWithName): release_timeout");
  for (int i = 0; i < kAttempts; ++i) {
    const auto first = startSession();
    const auto second = connect();
    first->close();
    world.scheduler().startTimer(SimulatedScheduler::kNoProcess, 1s, [&second] {
      second->askInPassing(ClientSessionOperation::SetSessionInfo, {sessionInfo(), userInfo(), Value(), false});
    });
    world.advance(1s);
    second->start();
    second->send(7);
    second->flush();
    EXPECT_EQ(postedEvents(7, 1).size(), static_cast<size_t>(i) + 1);
    second->close();
    world.advance(1min);
    ASSERT_EQ(process.transactions().open(), 0) << "attempt " << i;
  }
}

TEST_F(TelvanedAgentHelpersTest, userInfoThatIsSentAgainAndAgainLosesNoEvent) {
  constexpr int kAttempts = 40;
  constexpr int kTimesInARow = 4;
  givenStorebag(StorebagBuilder().set(kStorebagReleaseTimeout, 1));
  log().expectError("newBackendWithName): release_timeout");
  world.scheduler().setInterleaving(SimulatedScheduler::Interleaving::AtCalls);
  for (int i = 0; i < kAttempts; ++i) {
    const auto client = startSession();
    for (int times = 0; times < kTimesInARow; ++times) {
      client->askInPassing(ClientSessionOperation::FetchStates, {userInfo()});
    }
    client->send(7);
    client->flush();
    EXPECT_EQ(postedEvents(7, 1).size(), static_cast<size_t>(i) + 1);
    client->close();
    world.advance(1min);
    ASSERT_EQ(process.transactions().open(), 0) << "attempt " << i;
  }
}

// The pool may give the helper up between its release and the new request, and the new one has no URL session before
// somebody activates it: everything posted until then was dropped without a word.
TEST_F(TelvanedAgentHelpersTest, aSessionInfoThatIsSentAgainAndAgainLosesNoEvent) {
  constexpr int kAttempts = 40;
  constexpr int kTimesInARow = 4;
  givenStorebag(StorebagBuilder().set(kStorebagReleaseTimeout, 1));
  log().expectError("newBackendWithName): release_timeout");
  world.scheduler().setInterleaving(SimulatedScheduler::Interleaving::AtCalls);
  for (int i = 0; i < kAttempts; ++i) {
    const auto client = startSession();
    for (int times = 0; times < kTimesInARow; ++times) {
      client->askInPassing(ClientSessionOperation::SetSessionInfo, {sessionInfo(), userInfo(), Value(), false});
    }
    client->send(7);
    client->flush();
    EXPECT_EQ(postedEvents(7, 1).size(), static_cast<size_t>(i) + 1);
    client->close();
    world.advance(1min);
    ASSERT_EQ(process.transactions().open(), 0) << "attempt " << i;
  }
}

// Two sessions that end together may have the pool told at once that nobody is left, and once more by the release
// timer.
TEST_F(TelvanedAgentHelpersTest, aHelperThatIsGoneDoesNotTakeItsSuccessorAlong) {
  constexpr int kAttempts = 50;
  givenStorebag(StorebagBuilder().set(kStorebagReleaseTimeout, 2));
  log().expectError("newBackendWithName): release_timeout");
  startDaemon();
  for (int i = 0; i < kAttempts; ++i) {
    SimulatedPlatform& other = world.makeProcess("other", {.entitlements = {kTelvanedEntitlement}});
    DaemonClient first(world, other);
    DaemonClient second(world, other);
    for (DaemonClient* client : {&first, &second}) {
      client->setSessionInfo(sessionInfo(), userInfo());
      client->start();
    }
    other.kill();
    world.advance(1s);
    const auto successor = startSession();
    world.advance(3s);
    successor->send(7);
    successor->flush();
    ASSERT_EQ(postedEvents(7, 1).size(), static_cast<size_t>(i) + 1) << "attempt " << i;
    successor->close();
    world.advance(1min);
    ASSERT_EQ(process.transactions().open(), 0) << "attempt " << i;
  }
}

}  // namespace
}  // namespace telvane::testing
