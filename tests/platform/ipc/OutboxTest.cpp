#include "platform/ipc/Outbox.h"

#include <gtest/gtest.h>

namespace telvane::testing {
namespace {

using Admission = ipc::Outbox::Admission;

class OutboxTest : public ::testing::Test {
 protected:
  OutboxTest() { outbox.take(0); }  // the loop's first look

  Admission add(size_t wireBytes = 100) {
    ipc::OutgoingCall call;
    return outbox.add(call, wireBytes, 0);
  }
  Admission addMany(size_t count) {
    Admission last = Admission::Queued;
    for (size_t i = 0; i < count; ++i) last = add();
    return last;
  }

  ipc::Limits limits{.maximumBatchCalls = 4, .maximumBatchBytes = 100'000, .maximumWaitingBytes = 200'000};
  ipc::Outbox outbox{limits};
};

TEST_F(OutboxTest, wakesTheLoopOnceForManyCalls) {
  EXPECT_EQ(add(), Admission::QueuedMustPump);
  EXPECT_EQ(addMany(10), Admission::Queued);
}

TEST_F(OutboxTest, sendsAtOnceWhenNothingIsUnderWay) {
  add();
  const auto batch = outbox.take(0);
  ASSERT_TRUE(batch);
  EXPECT_EQ(batch->calls.size(), 1u);
  EXPECT_FALSE(outbox.take(1));
}

TEST_F(OutboxTest, gathersWhileABatchIsUnderWay) {
  EXPECT_FALSE(outbox.take(1));
  EXPECT_EQ(addMany(3), Admission::Queued);
  EXPECT_FALSE(outbox.take(1));
  EXPECT_EQ(add(), Admission::QueuedMustPump) << "a full batch may follow the one that is under way";
  const auto batch = outbox.take(1);
  ASSERT_TRUE(batch);
  EXPECT_EQ(batch->calls.size(), 4u);
}

TEST_F(OutboxTest, keepsAtMostTwoBatchesUnderWay) {
  addMany(20);
  EXPECT_TRUE(outbox.take(0));
  EXPECT_TRUE(outbox.take(1));
  EXPECT_FALSE(outbox.take(2));
  EXPECT_EQ(add(), Admission::Queued) << "the loop comes by itself when a batch is answered";
}

TEST_F(OutboxTest, aLargeCallHasABatchOfItsOwn) {
  add(10);
  add(150'000);
  add(10);
  for (const size_t calls : {1u, 1u, 1u}) {
    const auto batch = outbox.take(0);
    ASSERT_TRUE(batch);
    EXPECT_EQ(batch->calls.size(), calls);
  }
  EXPECT_FALSE(outbox.take(0));
}

TEST_F(OutboxTest, countsWhatIsUnderWayUntilItIsSettled) {
  EXPECT_EQ(add(150'000), Admission::QueuedMustPump);
  const auto batch = outbox.take(0);
  ASSERT_TRUE(batch);
  EXPECT_EQ(add(150'000), Admission::Full);
  EXPECT_EQ(outbox.settle(batch->memoryBytes), 1u) << "the end of the burst tells how many were dropped";
  EXPECT_NE(add(150'000), Admission::Full);
}

TEST_F(OutboxTest, aBurstEndsOnlyWhenThereIsRoomAgain) {
  add(90'000);
  add(90'000);
  const auto first = outbox.take(0);
  const auto second = outbox.take(0);
  ASSERT_TRUE(first && second);
  EXPECT_EQ(add(90'000), Admission::Full);
  EXPECT_EQ(add(90'000), Admission::Full);
  EXPECT_EQ(outbox.settle(0), 0u);
  EXPECT_EQ(outbox.settle(first->memoryBytes), 2u);
  EXPECT_EQ(outbox.takeDropped(), 0u);
}

TEST_F(OutboxTest, takesNothingAfterItWasClosedButKeepsWhatWaits) {
  add();
  outbox.close();
  EXPECT_EQ(add(), Admission::Closed);
  EXPECT_TRUE(outbox.take(0));
  EXPECT_TRUE(outbox.isEmpty());
}

TEST_F(OutboxTest, handlersCanBeTakenFromCallsThatStay) {
  int errors = 0;
  ipc::OutgoingCall call;
  call.onError = [&errors](const Error&) { ++errors; };
  outbox.add(call, 10, 0);
  add();
  auto handlers = outbox.takeHandlers();
  ASSERT_EQ(handlers.size(), 1u);
  handlers[0].onError(Error());
  EXPECT_EQ(errors, 1);
  const auto batch = outbox.take(0);
  ASSERT_TRUE(batch);
  EXPECT_EQ(batch->calls.size(), 2u);
  EXPECT_FALSE(batch->calls[0].onError);
}

}  // namespace
}  // namespace telvane::testing
