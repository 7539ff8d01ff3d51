#include "platform/dispatch/ThreadedMonitor.h"

#include <gtest/gtest.h>

#include <thread>
#include <vector>

#include "platform/dispatch/ThreadedDispatch.h"
#include "tests/platform/dispatch/Waiting.h"

namespace telvane::testing {
namespace {

TEST(ThreadedMonitorTest, mayBeLockedAgainByItsHolder) NO_THREAD_SAFETY_ANALYSIS {
  ThreadedDispatch dispatch;
  const auto monitor = dispatch.newMonitor();
  monitor->lock();
  monitor->lock();
  monitor->unlock();
  bool wasFree = true;
  std::atomic<bool> isIn{false};
  std::thread other([&] {
    const MonitorLock lock(*monitor);
    isIn = true;
  });
  wasFree = isIn;
  monitor->unlock();
  other.join();
  EXPECT_FALSE(wasFree) << "one unlock for two locks must not let others in";
  EXPECT_TRUE(isIn);
}

TEST(ThreadedMonitorTest, letsOneThreadInAtATime) {
  ThreadedDispatch dispatch;
  const auto monitor = dispatch.newMonitor();
  int count = 0;
  std::vector<std::thread> threads;
  for (int t = 0; t < 4; ++t) {
    threads.emplace_back([&] {
      for (int i = 0; i < 2000; ++i) {
        const MonitorLock lock(*monitor);
        ++count;
      }
    });
  }
  for (std::thread& thread : threads) thread.join();
  EXPECT_EQ(count, 8000);
}

// The agent's lock is held during a download, while jobs of many sessions want it; the download's own jobs must run.
TEST(ThreadedMonitorTest, doesNotTakeTheWorkersThatItsHolderNeeds) {
  ThreadedDispatch dispatch;
  const auto monitor = dispatch.newMonitor();
  const auto sessions = dispatch.newConcurrentQueue("sessions", QualityOfService::Default);
  const auto answer = dispatch.newSemaphore(0);
  const auto done = dispatch.newSemaphore(0);
  constexpr int kSessions = 50;
  for (int i = 0; i < kSessions; ++i) {
    sessions->async([&, i] {
      {
        const MonitorLock lock(*monitor);
        sessions->async([answer] { answer->signal(); });
        EXPECT_TRUE(answer->waitFor(kDeadline)) << "session " << i << " got no answer";
      }
      done->signal();
    });
  }
  for (int i = 0; i < kSessions; ++i) ASSERT_TRUE(done->waitFor(kDeadline)) << "after " << i << " sessions";
}

}  // namespace
}  // namespace telvane::testing
