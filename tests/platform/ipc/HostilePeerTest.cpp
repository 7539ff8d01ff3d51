#include "tests/platform/ipc/HostilePeer.h"

#include <fmt/format.h>

#include "tests/platform/ipc/LocalServiceFixture.h"

namespace telvane::testing {
namespace {

using Operation = TalkingObject::Operation;

// What a peer can do that is none of ours. After each the daemon serves the next client.
class HostilePeerTest : public LocalServiceFixture {
 protected:
  static std::string header(uint32_t segments, uint32_t words) {
    std::string bytes(8, '\0');
    for (int i = 0; i < 4; ++i) {
      bytes[static_cast<size_t>(i)] = static_cast<char>((segments - 1) >> (8 * i));
      bytes[static_cast<size_t>(i) + 4] = static_cast<char>(words >> (8 * i));
    }
    return bytes;
  }
};

TEST_F(HostilePeerTest, itsMessagesAreUnderstoodWhenTheyAreRight) {
  serve();
  HostilePeer peer(socketPath());
  ASSERT_TRUE(peer.open());
  ASSERT_TRUE(peer.deliver(Operation::kEcho, "by hand", 1));
  const auto calls = delegate.object->calls().take(1);
  ASSERT_EQ(calls.size(), 1u);
  EXPECT_EQ(calls[0], Array({Value("by hand")}));
}

TEST_F(HostilePeerTest, garbageEndsTheConnection) {
  log.allowErrors();
  serve();
  std::string garbage;
  uint32_t state = 1;
  for (int i = 0; i < 4096; ++i) garbage.push_back(static_cast<char>((state = state * 1664525 + 1013904223) >> 24));
  for (const auto& bytes :
       {garbage, std::string(4096, '\xff'), std::string("GET / HTTP/1.1\r\nHost: localhost\r\n\r\n"),
        header(1, 4) + garbage.substr(0, 32), header(1, 4) + std::string(32, '\xff')}) {
    HostilePeer peer(socketPath());
    peer.write(bytes);
    EXPECT_TRUE(peer.waitForEnd()) << "not ended after " << bytes.size() << " bytes";
  }
  expectServing();
  stopServing();
  EXPECT_GE(log.count(LogLevel::Error, "no message of this protocol"), 1u) << log.text();
}

TEST_F(HostilePeerTest, aPeerThatClosesInTheMiddleOfAMessageHarmsNobody) {
  log.expectError("closed in the middle of a message");
  serve();
  HostilePeer peer(socketPath());
  ASSERT_TRUE(peer.open());
  ASSERT_TRUE(peer.deliver(Operation::kRemember, "whole", 0));
  ASSERT_TRUE(delegate.object->calls().waitFor(1));
  ASSERT_TRUE(peer.write(header(1, 100) + "cut short"));
  peer.close();
  EXPECT_TRUE(delegate.events.waitFor(2)) << "the end of the connection was not told";
  expectServing();
}

TEST_F(HostilePeerTest, aMessageOf65MiBEndsTheConnection) {
  log.expectError("a message of 68157448 bytes is over the limit of 67108864");
  serve();
  HostilePeer peer(socketPath());
  ASSERT_TRUE(peer.open());
  ASSERT_TRUE(peer.write(header(1, (65u << 20) / 8)));
  EXPECT_TRUE(peer.waitForEnd());
  expectServing();
}

TEST_F(HostilePeerTest, anAnnouncedMessageThatNeverComesHoldsUpNobody) {
  log.expectError("closed in the middle of a message");
  serve();
  HostilePeer peer(socketPath());
  ASSERT_TRUE(peer.open());
  ASSERT_TRUE(peer.write(header(1, (60u << 20) / 8)));
  expectServing();
  peer.close();
  EXPECT_TRUE(delegate.events.waitFor(2));
}

TEST_F(HostilePeerTest, aValueNested1000DeepEndsTheConnection) {
  log.expectError("nested deeper than 64 levels");
  serve();
  HostilePeer peer(socketPath());
  ASSERT_TRUE(peer.open());
  ASSERT_TRUE(peer.deliverNested(1000));
  EXPECT_TRUE(peer.waitForEnd());
  EXPECT_EQ(delegate.object->calls().size(), 0u);
  expectServing();
}

TEST_F(HostilePeerTest, tooManyValuesInAMessageEndTheConnection) {
  log.expectError("a message holds too many values");
  daemonLimits.maximumValuesPerMessage = 1000;
  serve();
  HostilePeer peer(socketPath());
  ASSERT_TRUE(peer.open());
  ASSERT_TRUE(peer.deliverArguments(1000));
  ASSERT_TRUE(delegate.object->calls().waitFor(1));
  ASSERT_TRUE(peer.deliverArguments(1001));
  EXPECT_TRUE(peer.waitForEnd());
  expectServing();
}

TEST_F(HostilePeerTest, tooManyUnansweredBatchesEndTheConnection) {
  log.expectError("too many batches");
  serve();
  HostilePeer peer(socketPath());
  ASSERT_TRUE(peer.open());
  for (int i = 0; i < 20; ++i) peer.deliver(Operation::kBlock, "x", 0);
  EXPECT_TRUE(peer.waitForEnd());
  expectServing();
}

TEST_F(HostilePeerTest, tooManyUnansweredCallsEndTheConnection) {
  log.expectError("too many answers");
  daemonLimits.maximumUnansweredCalls = 100;
  daemonLimits.maximumIncomingBatches = 1000;
  serve();
  HostilePeer peer(socketPath());
  ASSERT_TRUE(peer.open());
  for (uint32_t i = 1; i <= 101; ++i) {
    peer.deliver(Operation::kKeep, "x", i);
    if (i == 101) break;
    ASSERT_TRUE(delegate.object->calls().waitFor(i)) << "call " << i;
  }
  EXPECT_TRUE(peer.waitForEnd());
  expectServing();
}

TEST_F(HostilePeerTest, aPeerThatNeverReadsItsRepliesIsEndedAndDelaysNobody) {
  log.expectError("leaves what we send unread");
  daemonLimits.maximumUnreadBytes = 4u << 20;
  daemonLimits.maximumIncomingBatches = 1'000'000;
  serve();
  HostilePeer peer(socketPath());
  ASSERT_TRUE(peer.open());
  const std::string text(64 << 10, 'x');
  bool isServed = true;
  for (uint32_t i = 1; i < 1000 && isServed; ++i) {
    isServed = peer.deliver(Operation::kEcho, text, i);
  }
  EXPECT_FALSE(isServed) << "it could send " << 1000 * text.size() << " bytes without reading one";
  expectServing();
}

TEST_F(HostilePeerTest, aPeerThatNeverReadsItsLateRepliesIsEnded) {
  log.expectError("unread");
  daemonLimits.maximumUnreadBytes = 1u << 20;
  daemonLimits.maximumIncomingBatches = 1'000'000;
  serve();
  HostilePeer peer(socketPath());
  ASSERT_TRUE(peer.open());
  constexpr uint32_t kCount = 5'000;
  for (uint32_t i = 1; i <= kCount; ++i) ASSERT_TRUE(peer.deliver(Operation::kKeep, "x", i));
  ASSERT_TRUE(delegate.object->calls().waitFor(kCount));
  delegate.object->answerKept({Value(std::string(1000, 'x'))});
  EXPECT_TRUE(delegate.events.waitFor(2));
  expectServing();
}

TEST_F(HostilePeerTest, aPeerThatNeverAsksForTheLineIsClosed) {
  log.expectError("did not ask for the line in time");
  daemonLimits.openTime = std::chrono::milliseconds(20);
  serve();
  HostilePeer peer(socketPath());
  EXPECT_TRUE(peer.waitForEnd());
  expectServing();
  EXPECT_EQ(delegate.connections.size(), 1u) << "the delegate was asked about it";
}

TEST_F(HostilePeerTest, aPeerThatWasNotAcceptedCannotFillTheDaemon) {
  log.expectError("sent too much before it was accepted");
  serve();
  HostilePeer many(socketPath());
  for (int i = 0; i < 17; ++i) many.askAgain();
  EXPECT_TRUE(many.waitForEnd());
  HostilePeer large(socketPath());
  large.write(header(1, (1u << 20) / 8));
  EXPECT_TRUE(large.waitForEnd());
  expectServing();
  stopServing();
  EXPECT_EQ(log.count(LogLevel::Error, "sent too much before it was accepted"), 2u);
}

TEST_F(HostilePeerTest, aPeerThatConnectsAndLeavesIsNotTalkedAbout) {
  serve();
  for (int i = 0; i < 100; ++i) HostilePeer peer(socketPath());
  expectServing();
  EXPECT_EQ(delegate.connections.size(), 1u);
}

}  // namespace
}  // namespace telvane::testing
