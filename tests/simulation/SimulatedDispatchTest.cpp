#include "tests/support/SimulatedDispatch.h"

#include <gmock/gmock.h>
#include <gtest/gtest.h>

#include <memory>
#include <string>
#include <vector>

#include "tests/support/Seeds.h"

namespace telvane::testing {
namespace {

using namespace std::chrono_literals;
using ::testing::ElementsAre;
using ::testing::HasSubstr;

class SimulatedDispatchTest : public ::testing::Test {
 protected:
  SimulatedScheduler::Time start() const { return SimulatedScheduler::kStart; }

  SimulatedScheduler _scheduler{1};
  SimulatedDispatch _dispatch{_scheduler, "app"};
  std::shared_ptr<SerialQueue> _queue = _dispatch.newSerialQueue("com.example.queue");
};

TEST_F(SimulatedDispatchTest, runsAQueuesJobsInTheirOrderUnderEverySeed) {
  forEachSeed(20, [](uint64_t seed) {
    SimulatedScheduler scheduler(seed);
    SimulatedDispatch dispatch(scheduler, "app");
    const auto queue = dispatch.newSerialQueue("queue");
    std::string order;
    for (char name = 'a'; name <= 'j'; ++name) queue->async([&order, name] { order += name; });
    scheduler.runUntilIdle();
    EXPECT_EQ(order, "abcdefghij");
  });
}

TEST_F(SimulatedDispatchTest, runsNoJobBesideOneThatWaits) {
  std::string story;
  const auto semaphore = _dispatch.newSemaphore(0);
  _queue->async([&] {
    story += "1[";
    semaphore->wait();
    story += "]";
  });
  _queue->async([&story] { story += "2"; });
  _scheduler.runUntilIdle();
  EXPECT_EQ(story, "1[");
  semaphore->signal();
  _scheduler.runUntilIdle();
  EXPECT_EQ(story, "1[]2");
}

TEST_F(SimulatedDispatchTest, runsSyncAtOnceOnAnIdleQueue) {
  bool hasRun = false;
  const auto* caller = _scheduler.current();
  _queue->sync([&] {
    hasRun = true;
    EXPECT_EQ(_scheduler.current(), caller);
    EXPECT_TRUE(_queue->isCurrent());
    _queue->assertOnQueue();
  });
  EXPECT_TRUE(hasRun);
  EXPECT_FALSE(_queue->isCurrent());
}

TEST_F(SimulatedDispatchTest, runsSyncBehindWhatWaits) {
  std::string story;
  _queue->async([&story] { story += "1"; });
  _queue->async([&story] { story += "2"; });
  _queue->sync([&story] { story += "sync"; });
  EXPECT_EQ(story, "12sync");
}

TEST_F(SimulatedDispatchTest, keepsASyncsPlaceBeforeLaterJobs) {
  std::string story;
  const auto semaphore = _dispatch.newSemaphore(0);
  _queue->async([&] { semaphore->wait(); });
  _dispatch.spawn("caller", [&] { _queue->sync([&story] { story += "sync;"; }); });
  _scheduler.runUntilIdle();
  _queue->async([&story] { story += "later;"; });
  semaphore->signal();
  _scheduler.runUntilIdle();
  EXPECT_EQ(story, "sync;later;");
}

TEST_F(SimulatedDispatchTest, isReentrantInSync) {
  int depth = 0;
  _queue->async([&] { _queue->sync([&] { _queue->sync([&depth] { depth = 3; }); }); });
  _scheduler.runUntilIdle();
  EXPECT_EQ(depth, 3);
}

TEST_F(SimulatedDispatchTest, isOnBothQueuesInANestedSync) {
  const auto other = _dispatch.newSerialQueue("other");
  bool wasOnBoth = false;
  _queue->async([&] { other->sync([&] { wasOnBoth = other->isCurrent() && _queue->isCurrent(); }); });
  _scheduler.runUntilIdle();
  EXPECT_TRUE(wasOnBoth);
}

TEST_F(SimulatedDispatchTest, keepsAQueueAliveThroughItsJobs) {
  bool hasRun = false;
  _queue->asyncAfter(5s, [&hasRun] { hasRun = true; });
  _queue = nullptr;
  _scheduler.advance(5s);
  EXPECT_TRUE(hasRun);
}

TEST_F(SimulatedDispatchTest, delaysAJobInVirtualTime) {
  SimulatedScheduler::Time ranAt{};
  _queue->asyncAfter(900s, [&] { ranAt = _scheduler.now(); });
  _scheduler.advance(899s);
  EXPECT_EQ(ranAt, SimulatedScheduler::Time{});
  _scheduler.advance(1s);
  EXPECT_EQ(ranAt, start() + 900s);
}

TEST_F(SimulatedDispatchTest, letsAConcurrentQueuesJobsOverlap) {
  const auto queue = _dispatch.newConcurrentQueue("concurrent");
  const auto semaphore = _dispatch.newSemaphore(0);
  int waiting = 0;
  for (int i = 0; i < 10; ++i) {
    queue->async([&] {
      ++waiting;
      semaphore->wait();
      --waiting;
    });
  }
  _scheduler.runUntilIdle();
  EXPECT_EQ(waiting, 10);
  for (int i = 0; i < 10; ++i) semaphore->signal();
  _scheduler.runUntilIdle();
  EXPECT_EQ(waiting, 0);
}

TEST_F(SimulatedDispatchTest, firesATimerOnItsQueueAfterTheDelay) {
  std::vector<SimulatedScheduler::Time> fired;
  const auto timer = _dispatch.newTimer(
      _queue, 30s, 5s,
      [&] {
        _queue->assertOnQueue();
        fired.push_back(_scheduler.now());
      },
      nullptr);
  _scheduler.advance(1h);
  EXPECT_THAT(fired, ElementsAre(start() + 30s));
}

TEST_F(SimulatedDispatchTest, firesWithinTheLeewayBySeed) {
  std::set<SimulatedScheduler::Time> times;
  for (uint64_t seed = 1; seed <= 10; ++seed) {
    SimulatedScheduler scheduler(seed);
    scheduler.setTimerLeeway(SimulatedScheduler::TimerLeeway::BySeed);
    SimulatedDispatch dispatch(scheduler, "app");
    SimulatedScheduler::Time fired{};
    const auto timer = dispatch.newTimer(
        dispatch.newSerialQueue("queue"), 30s, 5s, [&] { fired = scheduler.now(); }, nullptr);
    scheduler.advance(35s);
    EXPECT_GE(fired, start() + 30s);
    EXPECT_LE(fired, start() + 35s);
    times.insert(fired);
  }
  EXPECT_GE(times.size(), 9u);
}

TEST_F(SimulatedDispatchTest, runsTheCancelHandlerOnceInsteadOfFiring) {
  std::string story;
  const auto timer = _dispatch.newTimer(
      _queue, 30s, 0s, [&story] { story += "fired;"; }, [&story] { story += "cancelled;"; });
  timer->cancel();
  timer->cancel();
  EXPECT_EQ(story, "");
  _scheduler.advance(1h);
  EXPECT_EQ(story, "cancelled;");
}

TEST_F(SimulatedDispatchTest, runsTheCancelHandlerAlsoAfterItFired) {
  std::string story;
  auto timer = _dispatch.newTimer(
      _queue, 30s, 0s, [&story] { story += "fired;"; }, [&story] { story += "cancelled;"; });
  _scheduler.advance(30s);
  timer = nullptr;
  _scheduler.runUntilIdle();
  EXPECT_EQ(story, "fired;cancelled;");
}

TEST_F(SimulatedDispatchTest, cancelsATimerWhoseFiringWaitsOnTheQueue) {
  std::string story;
  const auto semaphore = _dispatch.newSemaphore(0);
  const auto timer = _dispatch.newTimer(
      _queue, 30s, 0s, [&story] { story += "fired;"; }, nullptr);
  _queue->async([&semaphore] { semaphore->wait(); });
  _scheduler.advance(31s);
  timer->cancel();
  semaphore->signal();
  _scheduler.runUntilIdle();
  EXPECT_EQ(story, "");
}

TEST_F(SimulatedDispatchTest, cancelsATimerThatIsLetGo) {
  bool hasFired = false;
  auto timer = _dispatch.newTimer(
      _queue, 30s, 0s, [&hasFired] { hasFired = true; }, nullptr);
  timer = nullptr;
  _scheduler.advance(1h);
  EXPECT_FALSE(hasFired);
}

TEST_F(SimulatedDispatchTest, timesOutAWaitInVirtualTime) {
  const auto semaphore = _dispatch.newSemaphore(0);
  EXPECT_FALSE(semaphore->waitFor(15s));
  EXPECT_EQ(_scheduler.now(), start() + 15s);
  _scheduler.startTimer(SimulatedScheduler::kNoProcess, 3s, [&semaphore] { semaphore->signal(); });
  EXPECT_TRUE(semaphore->waitFor(15s));
  EXPECT_EQ(_scheduler.now(), start() + 18s);
}

TEST_F(SimulatedDispatchTest, keepsASignalForALaterWait) {
  const auto semaphore = _dispatch.newSemaphore(1);
  semaphore->signal();
  semaphore->wait();
  semaphore->wait();
  EXPECT_FALSE(semaphore->waitFor(0s));
}

TEST_F(SimulatedDispatchTest, waitsForEverWithTheLongestTimeout) {
  const auto semaphore = _dispatch.newSemaphore(0);
  _scheduler.startTimer(SimulatedScheduler::kNoProcess, 24h * 365, [&semaphore] { semaphore->signal(); });
  EXPECT_TRUE(semaphore->waitFor(std::chrono::nanoseconds::max()));
}

TEST_F(SimulatedDispatchTest, letsOneStrandIntoAMonitorAtATime) {
  forEachSeed(20, [](uint64_t seed) {
    SimulatedScheduler scheduler(seed);
    SimulatedDispatch dispatch(scheduler, "app");
    const auto monitor = dispatch.newMonitor();
    int inside = 0;
    int most = 0;
    int visits = 0;
    for (int i = 0; i < 5; ++i) {
      dispatch.spawn("visitor", [&] {
        MonitorLock lock(*monitor);
        most = std::max(most, ++inside);
        scheduler.sleep(1s);
        --inside;
        ++visits;
      });
    }
    scheduler.advance(5s);
    EXPECT_EQ(most, 1);
    EXPECT_EQ(visits, 5);
  });
}

TEST_F(SimulatedDispatchTest, isReentrantInAMonitor) NO_THREAD_SAFETY_ANALYSIS {
  const auto monitor = _dispatch.newMonitor();
  bool hasEntered = false;
  monitor->lock();
  monitor->lock();
  monitor->unlock();
  _dispatch.spawn("other", [&] {
    MonitorLock lock(*monitor);
    hasEntered = true;
  });
  _scheduler.runUntilIdle();
  EXPECT_FALSE(hasEntered);
  EXPECT_THAT(_scheduler.waiting(), HasSubstr("app/other waits for monitor app/1, which main has"));
  monitor->unlock();
  _scheduler.runUntilIdle();
  EXPECT_TRUE(hasEntered);
}

TEST_F(SimulatedDispatchTest, refusesToUnlockWhatIsNotLocked) NO_THREAD_SAFETY_ANALYSIS {
  const auto monitor = _dispatch.newMonitor();
  EXPECT_THROW(monitor->unlock(), SimulationFailure);
}

TEST_F(SimulatedDispatchTest, freesAMonitorWhoseHolderEnds) {
  SimulatedDispatch other(_scheduler, "other");
  const auto monitor = _dispatch.newMonitor();
  const auto semaphore = other.newSemaphore(0);
  other.spawn("holder", [&] {
    MonitorLock lock(*monitor);
    semaphore->wait();
  });
  _scheduler.runUntilIdle();
  other.end();
  bool hasEntered = false;
  _dispatch.spawn("next", [&] {
    MonitorLock lock(*monitor);
    hasEntered = true;
  });
  _scheduler.runUntilIdle();
  EXPECT_TRUE(hasEntered);
}

TEST_F(SimulatedDispatchTest, dropsWhatIsGivenToAnEndedProcess) {
  const auto held = std::make_shared<int>(1);
  const auto semaphore = _dispatch.newSemaphore(0);
  _queue->async([&semaphore, held] { semaphore->wait(); });
  _queue->async([held] {});
  _scheduler.runUntilIdle();
  _dispatch.end();
  _queue->async([held] {});
  _queue->asyncAfter(1s, [held] {});
  _scheduler.advance(1h);
  EXPECT_EQ(held.use_count(), 1);
  bool hasRun = false;
  _queue->sync([&hasRun] { hasRun = true; });
  EXPECT_TRUE(hasRun);
}

using SimulatedDispatchDeathTest = SimulatedDispatchTest;

TEST_F(SimulatedDispatchDeathTest, endsTheProcessOffTheQueue) {
  EXPECT_DEATH(_queue->assertOnQueue(), "com.example.queue");
}

}  // namespace
}  // namespace telvane::testing
