#include "platform/dispatch/ThreadedSerialQueue.h"

#include <gtest/gtest.h>

#include <atomic>
#include <map>
#include <thread>
#include <vector>

#include "platform/dispatch/ThreadedDispatch.h"
#include "tests/platform/dispatch/Waiting.h"

namespace telvane::testing {
namespace {

using namespace std::chrono_literals;

class ThreadedSerialQueueTest : public ::testing::Test {
 protected:
  std::shared_ptr<SerialQueue> newQueue(std::string label) {
    return _dispatch.newSerialQueue(std::move(label), QualityOfService::Default);
  }
  // Occupies the queue until the semaphore that comes back is signalled.
  std::shared_ptr<Semaphore> block(SerialQueue& queue) {
    const auto started = _dispatch.newSemaphore(0);
    const auto mayGoOn = _dispatch.newSemaphore(0);
    queue.async([=] {
      started->signal();
      mayGoOn->wait();
    });
    EXPECT_TRUE(started->waitFor(kDeadline));
    return mayGoOn;
  }
  void expectDrained(SerialQueue& queue) { EXPECT_TRUE(drain(_dispatch, queue)) << queue.label() << " is stuck"; }

  ThreadedDispatch _dispatch;
  const std::shared_ptr<SerialQueue> _queue = newQueue("queue");
};

TEST_F(ThreadedSerialQueueTest, runsSyncOnAnIdleQueueInTheCallersThread) {
  std::thread::id thread;
  _queue->sync([&] { thread = std::this_thread::get_id(); });
  EXPECT_EQ(thread, std::this_thread::get_id());
}

TEST_F(ThreadedSerialQueueTest, runsSyncInTheCallersThreadAlsoAfterJobsOfWorkers) {
  expectDrained(*_queue);
  std::thread::id thread;
  _queue->sync([&] { thread = std::this_thread::get_id(); });
  EXPECT_EQ(thread, std::this_thread::get_id());
}

TEST_F(ThreadedSerialQueueTest, runsSyncBehindWhatWaitsAndStillInTheCallersThread) {
  const auto mayGoOn = block(*_queue);
  std::string order;
  _queue->async([&] { order += "a"; });
  _queue->async([&] { order += "b"; });
  std::thread opener([&] { mayGoOn->signal(); });
  std::thread::id thread;
  _queue->sync([&] {
    order += "c";
    thread = std::this_thread::get_id();
  });
  opener.join();
  EXPECT_EQ(order, "abc");
  EXPECT_EQ(thread, std::this_thread::get_id());
}

TEST_F(ThreadedSerialQueueTest, runsWhatComesAfterASyncBehindIt) {
  std::string order;
  _queue->sync([&] {
    _queue->async([&] { order += "b"; });
    order += "a";
  });
  expectDrained(*_queue);
  EXPECT_EQ(order, "ab");
}

TEST_F(ThreadedSerialQueueTest, runsASyncInsideItsOwnJobAtOnce) {
  std::string order;
  _queue->async([&] {
    order += "a";
    _queue->sync([&] { _queue->sync([&] { order += "b"; }); });
    order += "c";
  });
  expectDrained(*_queue);
  _queue->sync([&] { _queue->sync([&] { order += "d"; }); });
  EXPECT_EQ(order, "abcd");
}

// Asynchronous and synchronous calls of one thread keep their order, whatever other threads do meanwhile; jobs of all
// threads share a map without a lock.
TEST_F(ThreadedSerialQueueTest, runsOneAtATimeAndKeepsTheOrderOfEachProducer) {
  constexpr int kProducers = 6;
  constexpr int kCalls = 3000;
  std::map<int, int> next;
  std::atomic<int> outOfOrder{0};
  std::vector<std::thread> producers;
  for (int producer = 0; producer < kProducers; ++producer) {
    producers.emplace_back([&, producer] {
      for (int call = 0; call < kCalls; ++call) {
        const auto job = [&, producer, call] { outOfOrder += next[producer]++ != call; };
        if (call % 7 == producer % 7) {
          _queue->sync(job);
        } else {
          _queue->async(job);
        }
      }
    });
  }
  for (std::thread& producer : producers) producer.join();
  expectDrained(*_queue);
  EXPECT_EQ(outOfOrder, 0);
  for (int producer = 0; producer < kProducers; ++producer) EXPECT_EQ(next[producer], kCalls);
}

TEST_F(ThreadedSerialQueueTest, letsCallersOfSyncInOneAfterTheOther) {
  int count = 0;
  std::atomic<int> inAnotherThread{0};
  std::vector<std::thread> callers;
  for (int caller = 0; caller < 4; ++caller) {
    callers.emplace_back([&] {
      for (int i = 0; i < 3000; ++i) {
        _queue->sync([&, self = std::this_thread::get_id()] {
          ++count;
          inAnotherThread += std::this_thread::get_id() != self;
        });
      }
    });
  }
  for (std::thread& caller : callers) caller.join();
  EXPECT_EQ(count, 12000);
  EXPECT_EQ(inAnotherThread, 0);
}

TEST_F(ThreadedSerialQueueTest, knowsWhetherTheCallerWorksForIt) {
  const auto other = newQueue("other");
  EXPECT_FALSE(_queue->isCurrent());
  _queue->sync([&] {
    EXPECT_TRUE(_queue->isCurrent());
    EXPECT_FALSE(other->isCurrent());
    other->sync([&] {
      EXPECT_TRUE(_queue->isCurrent());
      EXPECT_TRUE(other->isCurrent());
    });
    EXPECT_FALSE(other->isCurrent());
  });
  EXPECT_FALSE(_queue->isCurrent());
  _queue->async([&] {
    _queue->assertOnQueue();
    EXPECT_FALSE(other->isCurrent());
  });
  expectDrained(*_queue);
}

TEST_F(ThreadedSerialQueueTest, keepsItsLabel) { EXPECT_EQ(newQueue("com.corvex.label")->label(), "com.corvex.label"); }

TEST_F(ThreadedSerialQueueTest, livesAsLongAsItsJobsWait) {
  auto queue = newQueue("dropped");
  const std::weak_ptr<SerialQueue> observer = queue;
  const auto mayGoOn = block(*queue);
  const auto hasRun = _dispatch.newSemaphore(0);
  queue->async([=] { hasRun->signal(); });
  queue.reset();
  mayGoOn->signal();
  EXPECT_TRUE(hasRun->waitFor(kDeadline)) << "the job was lost with the queue";
  EXPECT_TRUE(eventually([&] { return observer.expired(); })) << "the queue has leaked";
}

TEST_F(ThreadedSerialQueueTest, letsGoOfAJobBeforeTheNextOneRuns) {
  auto captured = std::make_shared<int>(1);
  const std::weak_ptr<int> observer = captured;
  bool isGone = false;
  _queue->async([held = std::move(captured)] { EXPECT_EQ(*held, 1); });
  _queue->async([&] { isGone = observer.expired(); });
  expectDrained(*_queue);
  EXPECT_TRUE(isGone);
}

TEST_F(ThreadedSerialQueueTest, runsADelayedJobOnTheQueueNotBeforeItsTime) {
  const auto hasRun = _dispatch.newSemaphore(0);
  const auto start = std::chrono::steady_clock::now();
  std::chrono::steady_clock::time_point end;
  bool isOnQueue = false;
  _queue->asyncAfter(5ms, [&] {
    end = std::chrono::steady_clock::now();
    isOnQueue = _queue->isCurrent();
    hasRun->signal();
  });
  ASSERT_TRUE(hasRun->waitFor(kDeadline));
  EXPECT_GE(end - start, 5ms);
  EXPECT_TRUE(isOnQueue);
}

TEST_F(ThreadedSerialQueueTest, runsJobsWithoutADelayInOrderWithTheOthers) {
  std::string order;
  _queue->asyncAfter(-1s, [&] { order += "a"; });
  _queue->async([&] { order += "b"; });
  _queue->asyncAfter(0s, [&] { order += "c"; });
  expectDrained(*_queue);
  EXPECT_EQ(order, "abc");
}

TEST_F(ThreadedSerialQueueTest, livesAsLongAsADelayedJobWaits) {
  const auto hasRun = _dispatch.newSemaphore(0);
  newQueue("dropped")->asyncAfter(1ms, [=] { hasRun->signal(); });
  EXPECT_TRUE(hasRun->waitFor(kDeadline));
}

// Two queues share the only worker; one of them never runs out of jobs until the other one has run.
TEST(ThreadedSerialQueueFairnessTest, givesItsWorkerToOthersAlthoughItIsNeverEmpty) {
  ThreadedDispatch dispatch({.concurrency = 1, .maximumWorkers = 1});
  const auto endless = dispatch.newSerialQueue("endless", QualityOfService::Default);
  const auto other = dispatch.newSerialQueue("other", QualityOfService::Default);
  const auto hasRun = dispatch.newSemaphore(0);
  std::atomic<bool> mustEnd{false};
  std::function<void()> again = [&] {
    if (!mustEnd) endless->async([&] { again(); });
  };
  again();
  other->async([&] { hasRun->signal(); });
  EXPECT_TRUE(hasRun->waitFor(kDeadline)) << "the endless queue kept the worker for itself";
  mustEnd = true;
  EXPECT_TRUE(drain(dispatch, *endless));
  EXPECT_TRUE(drain(dispatch, *endless));  // also the job that was given behind the first draining
}

TEST(ThreadedSerialQueueDeathTest, endsTheProcessWhenTheCallerIsNotOnTheQueue) {
  GTEST_FLAG_SET(death_test_style, "threadsafe");
  ThreadedDispatch dispatch;
  const auto queue = dispatch.newSerialQueue("com.corvex.state", QualityOfService::Default);
  EXPECT_DEATH(queue->assertOnQueue(), "does not run on the queue \"com.corvex.state\"");
  EXPECT_DEATH(dispatch.newSerialQueue("other", QualityOfService::Default)->sync([&] { queue->assertOnQueue(); }),
               "does not run on the queue \"com.corvex.state\"");
}

TEST(ThreadedSerialQueueDeathTest, endsTheProcessWhenAnExceptionLeavesASync) {
  GTEST_FLAG_SET(death_test_style, "threadsafe");
  EXPECT_DEATH(
      {
        ThreadedDispatch dispatch;
        const auto queue = dispatch.newSerialQueue("queue", QualityOfService::Default);
        try {
          queue->sync([] { throw std::runtime_error("left a sync"); });
        } catch (...) {
        }
      },
      "left a sync");
}

}  // namespace
}  // namespace telvane::testing
