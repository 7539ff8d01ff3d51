#include "platform/dispatch/TimerService.h"

#include <gtest/gtest.h>

#include <algorithm>
#include <filesystem>
#include <thread>
#include <vector>

#include "platform/dispatch/ThreadedSemaphore.h"
#include "tests/platform/dispatch/Waiting.h"

namespace telvane::testing {
namespace {

using namespace std::chrono_literals;

std::ptrdiff_t threadsOfThisProcess() {
  const std::filesystem::directory_iterator tasks("/proc/self/task");
  return std::distance(begin(tasks), end(tasks));
}

TEST(TimerServiceTest, startsItsThreadWithTheFirstJob) {
  // A sanitizer's own thread starts with a process's first one; it must not be counted below.
  std::thread([] {}).join();
  const auto before = threadsOfThisProcess();
  TimerService timers;
  EXPECT_EQ(threadsOfThisProcess(), before);
  timers.schedule(1h, 0ns, [] {});
  EXPECT_EQ(threadsOfThisProcess(), before + 1);
  timers.schedule(1h, 0ns, [] {});
  EXPECT_EQ(threadsOfThisProcess(), before + 1);
}

TEST(TimerServiceTest, runsJobsInTheOrderOfTheirTimes) {
  TimerService timers;
  std::vector<TimerService::Ticket> ran;
  const auto allAreScheduled = std::make_shared<ThreadedSemaphore>(0);
  const auto done = std::make_shared<ThreadedSemaphore>(0);
  timers.schedule(0ns, 0ns, [=] { allAreScheduled->wait(); });
  std::vector<TimerService::Ticket> scheduled(4);
  size_t index = 0;
  for (const auto delay : {9ms, 3ms, 6ms, 3ms}) {
    TimerService::Ticket& ticket = scheduled[index++];
    ticket = timers.schedule(delay, 0ns, [&ran, &ticket, done] {
      ran.push_back(ticket);
      done->signal();
    });
  }
  allAreScheduled->signal();
  for (int i = 0; i < 4; ++i) ASSERT_TRUE(done->waitFor(kDeadline));
  std::sort(scheduled.begin(), scheduled.end());
  EXPECT_EQ(ran, scheduled);
}

TEST(TimerServiceTest, runsASoonerJobAlthoughItSleepsForALaterOne) {
  TimerService timers;
  timers.schedule(1h, 0ns, [] {});
  const auto done = std::make_shared<ThreadedSemaphore>(0);
  timers.schedule(1ms, 0ns, [=] { done->signal(); });
  EXPECT_TRUE(done->waitFor(kDeadline));
}

TEST(TimerServiceTest, takesJobsFromItsOwnJobs) {
  TimerService timers;
  const auto done = std::make_shared<ThreadedSemaphore>(0);
  timers.schedule(0ns, 0ns, [&timers, done] { timers.schedule(1ms, 0ns, [done] { done->signal(); }); });
  EXPECT_TRUE(done->waitFor(kDeadline));
}

TEST(TimerServiceTest, gathersJobsWithinTheirLeeway) {
  TimerService timers;
  const auto start = std::chrono::steady_clock::now();
  const TimerService::Ticket first = timers.schedule(10h, 1h, [] {});
  const TimerService::Ticket second = timers.schedule(10h + 1us, 1h, [] {});
  EXPECT_EQ(first.due, second.due);
  EXPECT_GE(second.due, start + 10h + 1us);
  EXPECT_LE(first.due, std::chrono::steady_clock::now() + 11h);
}

TEST(TimerServiceTest, dropsACancelledJobAtOnceAndSaysSo) {
  TimerService timers;
  auto captured = std::make_shared<int>(0);
  const std::weak_ptr<int> observer = captured;
  const TimerService::Ticket ticket = timers.schedule(1h, 0ns, [held = std::move(captured)] {});
  EXPECT_TRUE(timers.cancel(ticket));
  EXPECT_TRUE(observer.expired());
  EXPECT_FALSE(timers.cancel(ticket));
}

TEST(TimerServiceTest, cannotCancelWhatHasRun) {
  TimerService timers;
  const auto done = std::make_shared<ThreadedSemaphore>(0);
  const TimerService::Ticket ticket = timers.schedule(0ns, 0ns, [=] { done->signal(); });
  ASSERT_TRUE(done->waitFor(kDeadline));
  EXPECT_FALSE(timers.cancel(ticket));
}

TEST(TimerServiceTest, neverRunsAJobWhoseTimeCannotCome) {
  TimerService timers;
  const TimerService::Ticket ticket = timers.schedule(std::chrono::nanoseconds::max(), 1h, [] {});
  EXPECT_TRUE(timers.cancel(ticket));
}

TEST(TimerServiceTest, dropsWhatHasNotRunWhenItStopsAndTakesNothingMore) {
  TimerService timers;
  bool hasRun = false;
  auto captured = std::make_shared<int>(0);
  const std::weak_ptr<int> observer = captured;
  timers.schedule(1h, 0ns, [&hasRun, held = std::move(captured)] { hasRun = true; });
  timers.stop();
  EXPECT_TRUE(observer.expired());
  timers.schedule(-1h, 0ns, [&hasRun] { hasRun = true; });
  timers.stop();
  EXPECT_FALSE(hasRun);
}

}  // namespace
}  // namespace telvane::testing
