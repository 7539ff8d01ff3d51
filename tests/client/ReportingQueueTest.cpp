#include "client/ReportingQueue.h"

#include <gtest/gtest.h>

#include <atomic>
#include <functional>
#include <thread>

#include "platform/dispatch/ThreadedDispatch.h"
#include "tests/support/Matchers.h"
#include "tests/support/SimulatedWorld.h"

namespace telvane::testing {
namespace {

class ReportingQueueTest : public ::testing::Test {
 protected:
  ~ReportingQueueTest() override { _world.end(); }

  SimulatedWorld _world;
  SimulatedPlatform& _process = _world.makeProcess("client");
  std::shared_ptr<SerialQueue> _serial = _process.platform().dispatch.newSerialQueue("test");
  std::shared_ptr<ReportingQueue> _queue = std::make_shared<ReportingQueue>(_serial, _process.log());
};

TEST_F(ReportingQueueTest, runsAStepAtOnceWhenNothingWaits) {
  bool hasRun = false;
  auto step = [&] { hasRun = true; };
  EXPECT_TRUE(_queue->tryPerform(step));
  EXPECT_TRUE(hasRun);
}

TEST_F(ReportingQueueTest, runsAStepBehindWhatWaits) {
  std::vector<int> order;
  _queue->async([&] { order.push_back(1); });
  auto step = [&] { order.push_back(0); };
  EXPECT_FALSE(_queue->tryPerform(step));
  _queue->perform([&] { order.push_back(2); });
  EXPECT_TRUE(order.empty()) << "nothing may overtake what waits";
  _world.runUntilIdle();
  EXPECT_EQ(order, (std::vector<int>{1, 2}));
  EXPECT_TRUE(_queue->tryPerform(step)) << "idle again";
}

TEST_F(ReportingQueueTest, runsWaitingStepsOnTheSerialQueue) {
  bool isOnQueue = false;
  _queue->async([&] { isOnQueue = _serial->isCurrent(); });
  _world.runUntilIdle();
  EXPECT_TRUE(isOnQueue);
}

TEST_F(ReportingQueueTest, letsOtherJobsOfItsQueueHaveTheirTurnUnderALoadWithoutAnEnd) {
  bool hasRun = false;
  int steps = 0;
  std::function<void()> step = [&] {
    if (steps == 0) _serial->async([&] { hasRun = true; });
    ++steps;
    if (!hasRun && steps < 10000) _queue->async([&] { step(); });
  };
  _queue->async([&] { step(); });
  _world.runUntilIdle();
  EXPECT_TRUE(hasRun);
  EXPECT_LT(steps, 1000) << "steps before the other job's turn";
}

TEST_F(ReportingQueueTest, runsAStepThatAStepAddsBehindIt) {
  std::vector<int> order;
  _queue->perform([&] {
    _queue->perform([&] { order.push_back(2); });
    order.push_back(1);
  });
  _world.runUntilIdle();
  EXPECT_EQ(order, (std::vector<int>{1, 2}));
}

TEST_F(ReportingQueueTest, goesOnAfterAStepThatThrows) {
  auto step = [] { throw 1; };
  EXPECT_ANY_THROW(_queue->tryPerform(step));
  bool hasRun = false;
  _queue->perform([&] { hasRun = true; });
  EXPECT_TRUE(hasRun);
}

TEST_F(ReportingQueueTest, keepsItselfAliveUntilAllHasRun) {
  bool hasRun = false;
  _queue->async([&] { hasRun = true; });
  _queue.reset();
  _world.runUntilIdle();
  EXPECT_TRUE(hasRun);
}

TEST_F(ReportingQueueTest, letsGoOfAStepAsSoonAsItIsDone) {
  auto held = std::make_shared<int>(0);
  const std::weak_ptr<int> weak = held;
  bool isGone = false;
  _queue->async([held = std::move(held)] {});
  _queue->async([&] { isGone = weak.expired(); });
  _world.runUntilIdle();
  EXPECT_TRUE(isGone);
}

TEST_F(ReportingQueueTest, dropsTheNewestMessagesBeyondTheBoundWithOneLine) {
  _process.log().expectError("Dropped 2 events: more than 8388608 bytes were waiting to be handed to the daemon");
  std::vector<int> run;
  const uint64_t third = ReportingQueue::kMaximumWaitingBytes / 3;
  for (int i = 0; i < 5; ++i) _queue->asyncMessage([&run, i] { run.push_back(i); }, third);
  _queue->async([&run] { run.push_back(100); });
  _world.runUntilIdle();
  EXPECT_EQ(run, (std::vector<int>{0, 1, 2, 100})) << "only messages count";
  _queue->async([] {});
  _queue->asyncMessage([&run] { run.push_back(5); }, third);
  _world.runUntilIdle();
  EXPECT_EQ(run.back(), 5) << "there is room again";
  EXPECT_EQ(_process.log().count("Dropped"), 1u);
}

TEST_F(ReportingQueueTest, countsAMessageUntilTheStepsThatItIsRunWithAreDone) {
  _process.log().expectError("Dropped 1 events");
  std::vector<int> run;
  const uint64_t half = ReportingQueue::kMaximumWaitingBytes / 2;
  _queue->asyncMessage(
      [&] {
        run.push_back(1);
        _queue->asyncMessage([&run] { run.push_back(3); }, half);
        _queue->asyncMessage([&run] { run.push_back(4); }, half);
      },
      half);
  _world.runUntilIdle();
  EXPECT_EQ(run, (std::vector<int>{1, 3})) << "what is being run still takes its memory";
  for (int i : {5, 6}) _queue->asyncMessage([&run, i] { run.push_back(i); }, half);
  _world.runUntilIdle();
  EXPECT_EQ(run, (std::vector<int>{1, 3, 5, 6})) << "there is room for all of it again";
}

TEST_F(ReportingQueueTest, aDroppedNoticeIsNotADroppedEvent) {
  _process.log().expectError("Dropped 1 notices of filtered events");
  bool hasRun = false;
  _queue->asyncNotice([] {}, ReportingQueue::kMaximumWaitingBytes);
  _queue->asyncNotice([&hasRun] { hasRun = true; }, 1);
  _world.runUntilIdle();
  EXPECT_FALSE(hasRun);
  EXPECT_TRUE(hasLines(_process.log(), 1, "Dropped")) << "no line may speak of a dropped event";
}

TEST_F(ReportingQueueTest, dropsACallThatFindsNoRoomAndRunsOneThatFindsNothingBeforeIt) {
  _process.log().expectError("Dropped 1 calls: more than 8388608 bytes were waiting to be handed to the daemon");
  std::vector<int> run;
  const uint64_t all = ReportingQueue::kMaximumWaitingBytes;
  _queue->performCall([&run] { run.push_back(1); }, 2 * all);
  EXPECT_EQ(run, std::vector<int>{1}) << "it does not wait, so it takes no room";
  _queue->async([] {});
  _queue->performCall([&run] { run.push_back(2); }, all);
  _queue->performCall([&run] { run.push_back(3); }, 1);
  _world.runUntilIdle();
  EXPECT_EQ(run, (std::vector<int>{1, 2}));
}

// Many threads at once: nothing is lost, each thread's own order is kept, and no two steps overlap.
TEST(ReportingQueueThreadsTest, keepsTheOrderOfEachThread) {
  constexpr int kThreads = 4;
  constexpr int kSteps = 5000;
  RecordingLog log;
  ThreadedDispatch dispatch;
  auto queue = std::make_shared<ReportingQueue>(dispatch.newSerialQueue("test", QualityOfService::Default), log);
  std::vector<int> last(kThreads, 0);  // guarded by the queue itself; tsan would tell
  std::atomic<int> disorder = 0;
  std::vector<std::thread> threads;
  for (int thread = 0; thread < kThreads; ++thread) {
    threads.emplace_back([&, thread] {
      for (int i = 1; i <= kSteps; ++i) {
        queue->perform([&, thread, i] {
          if (last[static_cast<size_t>(thread)] != i - 1) ++disorder;
          last[static_cast<size_t>(thread)] = i;
        });
      }
    });
  }
  for (std::thread& thread : threads) thread.join();
  const auto isDone = dispatch.newSemaphore(0);
  queue->async([&] { isDone->signal(); });
  ASSERT_TRUE(isDone->waitFor(std::chrono::seconds(30)));
  EXPECT_EQ(disorder, 0);
  EXPECT_EQ(last, std::vector<int>(kThreads, kSteps));
}

}  // namespace
}  // namespace telvane::testing
