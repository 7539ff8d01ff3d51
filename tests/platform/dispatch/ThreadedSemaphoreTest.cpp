#include "platform/dispatch/ThreadedSemaphore.h"

#include <gtest/gtest.h>

#include <thread>

#include "platform/dispatch/ThreadedDispatch.h"
#include "tests/platform/dispatch/Waiting.h"

namespace telvane::testing {
namespace {

using namespace std::chrono_literals;

TEST(ThreadedSemaphoreTest, letsAsManyPassAsItCounts) {
  ThreadedDispatch dispatch;
  const auto semaphore = dispatch.newSemaphore(2);
  semaphore->signal();
  for (int i = 0; i < 3; ++i) EXPECT_TRUE(semaphore->waitFor(0ns)) << "pass " << i;
  EXPECT_FALSE(semaphore->waitFor(0ns));
}

TEST(ThreadedSemaphoreTest, givesUpWhenTheTimeHasPassed) {
  ThreadedDispatch dispatch;
  const auto semaphore = dispatch.newSemaphore(0);
  const auto start = std::chrono::steady_clock::now();
  EXPECT_FALSE(semaphore->waitFor(3ms));
  EXPECT_GE(std::chrono::steady_clock::now() - start, 3ms);
  EXPECT_FALSE(semaphore->waitFor(-1s));
}

TEST(ThreadedSemaphoreTest, waitsForASignalFromAnotherThreadHoweverLongItMayTake) {
  ThreadedDispatch dispatch;
  const auto asked = dispatch.newSemaphore(0);
  const auto answered = dispatch.newSemaphore(0);
  std::thread other([&] {
    asked->wait();
    answered->signal();
  });
  asked->signal();
  EXPECT_TRUE(answered->waitFor(std::chrono::nanoseconds::max()));
  other.join();
}

// A waiter that owns the semaphore lets go of it as soon as it has been answered, while signal still runs.
TEST(ThreadedSemaphoreTest, mayBeLetGoOfByTheWaiterBeforeSignalReturns) {
  ThreadedDispatch dispatch;
  const auto queue = dispatch.newSerialQueue("answers", QualityOfService::Default);
  for (int i = 0; i < 2000; ++i) {
    auto answer = dispatch.newSemaphore(0);
    queue->async([semaphore = answer.get()] { semaphore->signal(); });
    answer->wait();
  }
  EXPECT_TRUE(drain(dispatch, *queue));
}

}  // namespace
}  // namespace telvane::testing
