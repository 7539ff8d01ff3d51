#include "tests/platform/ipc/PeerProcess.h"

#include "tests/platform/ipc/HostilePeer.h"
#include "tests/platform/ipc/LocalServiceFixture.h"

namespace telvane::testing {
namespace {

using Operation = TalkingObject::Operation;

// The local connection between two processes.
class PeerProcessTest : public LocalServiceFixture {};

TEST_F(PeerProcessTest, aCallCrossesFromOneProcessToAnother) {
  serve();
  PeerProcess peer({"call", scratch.path(), "hello"});
  EXPECT_EQ(peer.readLine(), "reply hello");
  EXPECT_EQ(peer.wait(), 0);
}

TEST_F(PeerProcessTest, theDescriptionNamesTheOtherProcess) {
  PeerProcess peer({"serve", scratch.path()});
  ASSERT_EQ(peer.readLine(), "ready");
  const auto connection = connected();
  ASSERT_TRUE(callAndWait(*connection, Operation::kEcho, {}).values);
  EXPECT_EQ(connection->description(), "service com.corvex.test");
}

TEST_F(PeerProcessTest, aKilledPeerInterruptsAndTheNextCallConnectsAgain) {
  auto peer = std::make_unique<PeerProcess>(std::vector<std::string>{"serve", scratch.path()});
  ASSERT_EQ(peer->readLine(), "ready");
  const auto connection = connected();
  ASSERT_TRUE(callAndWait(*connection, Operation::kEcho, {Value("one")}).values);
  call(*connection, Operation::kKeep, {});
  peer->kill();
  const auto inFlight = outcomes.take(2);
  ASSERT_EQ(inFlight.size(), 2u);
  EXPECT_EQ(inFlight[1].error.code(), ECONNRESET) << inFlight[1].error.description();
  ASSERT_TRUE(clientEvents.waitFor(1));
  EXPECT_EQ(clientEvents.items(), std::vector<std::string>{"interrupted"});

  peer = std::make_unique<PeerProcess>(std::vector<std::string>{"serve", scratch.path()});
  ASSERT_EQ(peer->readLine(), "ready") << "a stale socket kept it from starting";
  const auto again = callAndWait(*connection, Operation::kEcho, {Value("two")});
  ASSERT_TRUE(again.values) << again.error.description();
  EXPECT_EQ(clientEvents.size(), 1u);
}

TEST_F(PeerProcessTest, aKilledClientIsToldToTheDaemonAfterItsCalls) {
  serve();
  PeerProcess peer({"fork", scratch.path()});
  EXPECT_EQ(peer.readLine(), "before reply one");
  peer.kill();
  EXPECT_TRUE(delegate.events.waitFor(2));
  peer.wait();
}

TEST_F(PeerProcessTest, aForkedChildLeavesTheParentsConnectionAloneAndMakesItsOwn) {
#ifdef __SANITIZE_THREAD__
  GTEST_SKIP() << "the thread sanitizer ends a forked child that starts threads";
#endif
  serve();
  PeerProcess peer({"fork", scratch.path()});
  EXPECT_EQ(peer.readLine(), "before reply one");
  EXPECT_EQ(peer.readLine(), "child reply of my own");
  EXPECT_EQ(peer.readLine(), "child status 0");
  EXPECT_EQ(peer.readLine(), "parent reply two");
  EXPECT_EQ(peer.wait(), 0);
}

TEST_F(PeerProcessTest, aSecondProcessDoesNotTakeALiveSocket) {
  serve();
  PeerProcess peer({"serve", scratch.path()});
  EXPECT_EQ(peer.readLine().find("error " + std::to_string(EADDRINUSE) + " Another process serves "), 0u);
  EXPECT_EQ(peer.wait(), 1);
  expectServing();
}

TEST_F(PeerProcessTest, theServiceManagersSocketIsUsedAndLeftInPlace) {
  auto passed = ipc::unixsocket::listenAt(socketPath());
  ASSERT_TRUE(passed) << passed.error().description();
  const auto connection = connected();  // waits in the backlog of a service that has not been started
  call(*connection, Operation::kEcho, {Value("early")});
  PeerProcess peer({"serve", scratch.path()}, passed->get());
  ASSERT_EQ(peer.readLine(), "ready");
  const auto all = outcomes.take(1);
  ASSERT_EQ(all.size(), 1u);
  EXPECT_TRUE(all[0].values) << all[0].error.description();
  peer.closeInput();
  EXPECT_EQ(peer.wait(), 0);
  EXPECT_FALSE(ipc::unixsocket::identityOf(socketPath()).empty()) << "the manager's socket was removed";
}

TEST_F(PeerProcessTest, acceptingPausesAtTheDescriptorLimitAndGoesOnAfterIt) {
#ifdef __SANITIZE_ADDRESS__
  GTEST_SKIP() << "the sanitizers need descriptors of their own when they meet a type for the first time";
#endif
  PeerProcess peer({"serve", scratch.path(), "40"});
  ASSERT_EQ(peer.readLine(), "ready");
  std::vector<std::unique_ptr<HostilePeer>> crowd;
  for (int i = 0; i < 60; ++i) crowd.push_back(std::make_unique<HostilePeer>(socketPath()));
  EXPECT_EQ(peer.readLine().find("log localConnection: accepting pauses"), 0u);
  crowd.clear();
  expectServing();
  peer.closeInput();
  EXPECT_EQ(peer.readAll(), "") << "one line tells of a pause";
  EXPECT_EQ(peer.wait(), 0);
}

}  // namespace
}  // namespace telvane::testing
