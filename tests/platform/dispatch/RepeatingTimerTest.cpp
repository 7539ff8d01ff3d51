#include "platform/dispatch/RepeatingTimer.h"

#include <gmock/gmock.h>
#include <gtest/gtest.h>

#include <atomic>
#include <cerrno>
#include <functional>
#include <system_error>
#include <vector>

#include "platform/dispatch/SystemClock.h"
#include "platform/dispatch/ThreadedDispatch.h"
#include "tests/platform/dispatch/Waiting.h"
#include "tests/support/PassingDispatch.h"
#include "tests/support/SimulatedWorld.h"

namespace telvane::testing {
namespace {

using namespace std::chrono_literals;
using ::testing::ElementsAre;

// Another dispatch, whose timers the test may refuse, or hold back on the way to who asked for them.
class OtherTimers final : public PassingDispatch {
 public:
  using PassingDispatch::PassingDispatch;
  // Before a new timer is handed over.
  std::function<void()> onNewTimer;
  bool refuses = false;
  bool throws = false;  // when it refuses

  std::unique_ptr<Timer> newTimer(std::shared_ptr<SerialQueue> queue, std::chrono::nanoseconds delay,
                                  std::chrono::nanoseconds leeway, Job onFire, Job onCancel) override {
    if (refuses && throws) throw std::system_error(EAGAIN, std::generic_category());
    if (refuses) return nullptr;
    auto timer = PassingDispatch::newTimer(std::move(queue), delay, leeway, std::move(onFire), std::move(onCancel));
    if (onNewTimer) std::exchange(onNewTimer, nullptr)();
    return timer;
  }
};

class RepeatingTimerTest : public ::testing::Test {
 protected:
  ~RepeatingTimerTest() override { _world.end(); }

  // A timer that notes when it fires and is cancelled, in milliseconds since the start, and then does what the test
  // says.
  std::unique_ptr<RepeatingTimer> start(std::chrono::nanoseconds delay, std::chrono::nanoseconds interval,
                                        std::chrono::nanoseconds leeway = 0ns) {
    RepeatingTimer::Handlers handlers;
    handlers.onFire = [this] {
      EXPECT_TRUE(_queue->isCurrent());
      EXPECT_EQ(_cancellations.size(), 0u) << "it fires behind its cancel handler";
      _firings.push_back(elapsed());
      if (_onFire) _onFire();
    };
    handlers.onCancel = [this] {
      EXPECT_TRUE(_queue->isCurrent());
      _cancellations.push_back(elapsed());
    };
    handlers.onLost = [this] {
      EXPECT_TRUE(_queue->isCurrent());
      _losses.push_back(elapsed());
      if (_onLost) _onLost();
    };
    return RepeatingTimer::start(_dispatch, _world.clock(), _queue,
                                 {.delay = delay, .interval = interval, .leeway = leeway}, std::move(handlers));
  }
  int64_t elapsed() {
    return std::chrono::duration_cast<std::chrono::milliseconds>(_world.scheduler().now() - SimulatedScheduler::kStart)
        .count();
  }
  void sleep(std::chrono::nanoseconds duration) { _world.scheduler().sleep(duration); }
  // Lets the queue be busy for that long from now on, and then does the rest.
  void keepQueueBusy(std::chrono::nanoseconds duration, std::function<void()> rest = {}) {
    _queue->async([this, duration, rest = std::move(rest)] {
      sleep(duration);
      if (rest) rest();
    });
  }

  SimulatedWorld _world;
  SimulatedPlatform& _process = _world.makeProcess("process");
  OtherTimers _dispatch{_process.dispatch()};
  std::shared_ptr<SerialQueue> _queue = _process.dispatch().newSerialQueue("timers");
  std::vector<int64_t> _firings;
  std::vector<int64_t> _cancellations;
  std::vector<int64_t> _losses;
  std::function<void()> _onFire;
  std::function<void()> _onLost;
};

TEST_F(RepeatingTimerTest, firesAfterTheDelayAndThenEveryInterval) {
  const auto timer = start(300ms, 1s);
  _world.advance(3500ms);
  EXPECT_THAT(_firings, ElementsAre(300, 1300, 2300, 3300));
  EXPECT_TRUE(_cancellations.empty());
}

TEST_F(RepeatingTimerTest, firesAtOnceWithoutADelayButNotInTheCall) {
  const auto timer = start(0s, 1s);
  EXPECT_TRUE(_firings.empty());
  _world.advance(1s);
  EXPECT_THAT(_firings, ElementsAre(0, 1000));
}

TEST_F(RepeatingTimerTest, doesNotDriftHoweverLateItFires) {
  _world.scheduler().setTimerLeeway(SimulatedScheduler::TimerLeeway::BySeed);
  const auto timer = start(0s, 1s, 100ms);
  _world.advance(500s);
  ASSERT_GE(_firings.size(), 500u);
  bool isLateAtTimes = false;
  for (size_t i = 0; i < _firings.size(); ++i) {
    const int64_t due = static_cast<int64_t>(i) * 1000;
    EXPECT_GE(_firings[i], due);
    EXPECT_LE(_firings[i], due + 100);
    isLateAtTimes = isLateAtTimes || _firings[i] > due;
  }
  EXPECT_TRUE(isLateAtTimes) << "the test must give the timer a chance to drift";
}

TEST_F(RepeatingTimerTest, leavesOutFiringsThatItsHandlerMisses) {
  _onFire = [this] {
    if (_firings.size() == 1) sleep(2500ms);
  };
  const auto timer = start(0s, 1s);
  _world.advance(5s);
  EXPECT_THAT(_firings, ElementsAre(0, 3000, 4000, 5000));
}

TEST_F(RepeatingTimerTest, isInTimeWhenItsHandlerTakesAWholeInterval) {
  _onFire = [this] {
    if (_firings.size() == 1) sleep(1s);
  };
  const auto timer = start(0s, 1s);
  _world.advance(2s);
  EXPECT_THAT(_firings, ElementsAre(0, 1000, 2000));
}

TEST_F(RepeatingTimerTest, firesOnceWhenItsQueueIsFreeAgainAndThenInStep) {
  const auto timer = start(0s, 1s);
  _world.advance(500ms);
  keepQueueBusy(3200ms);
  _world.advance(4500ms);
  EXPECT_THAT(_firings, ElementsAre(0, 3700, 4000, 5000));
}

TEST_F(RepeatingTimerTest, isCancelledInItsHandler) {
  std::unique_ptr<RepeatingTimer> timer;
  _onFire = [&] {
    if (_firings.size() == 2) timer->cancel();
    EXPECT_TRUE(_cancellations.empty()) << "the cancel handler runs behind the handler, not in it";
  };
  timer = start(0s, 1s);
  _world.advance(10s);
  EXPECT_THAT(_firings, ElementsAre(0, 1000));
  EXPECT_THAT(_cancellations, ElementsAre(1000));
}

TEST_F(RepeatingTimerTest, isLetGoInItsHandler) {
  std::unique_ptr<RepeatingTimer> timer;
  _onFire = [&] { timer.reset(); };
  timer = start(0s, 1s);
  _world.advance(10s);
  EXPECT_THAT(_firings, ElementsAre(0));
  EXPECT_THAT(_cancellations, ElementsAre(0));
}

TEST_F(RepeatingTimerTest, runsItsCancelHandlerOnce) {
  auto timer = start(1s, 1s);
  timer->cancel();
  timer->cancel();
  timer.reset();
  _world.advance(10s);
  EXPECT_TRUE(_firings.empty());
  EXPECT_THAT(_cancellations, ElementsAre(0));
}

TEST_F(RepeatingTimerTest, runsItsCancelHandlerOnceWhenItIsOnlyLetGo) {
  start(1s, 1s).reset();
  _world.advance(10s);
  EXPECT_TRUE(_firings.empty());
  EXPECT_THAT(_cancellations, ElementsAre(0));
}

// The second firing waits on the queue already, behind the job that cancels.
TEST_F(RepeatingTimerTest, doesNotFireAfterACancelOnItsQueue) {
  const auto timer = start(0s, 1s);
  _world.advance(500ms);
  keepQueueBusy(2s, [&] { timer->cancel(); });
  _world.advance(10s);
  EXPECT_THAT(_firings, ElementsAre(0));
  EXPECT_THAT(_cancellations, ElementsAre(2500));
}

TEST_F(RepeatingTimerTest, mayBeCancelledElsewhereWhileItsHandlerRuns) {
  const auto timer = start(0s, 1s);
  _onFire = [this] { sleep(500ms); };
  _process.spawn("other", [&] {
    sleep(200ms);
    timer->cancel();
  });
  _world.advance(10s);
  EXPECT_THAT(_firings, ElementsAre(0));
  EXPECT_THAT(_cancellations, ElementsAre(500));
}

TEST_F(RepeatingTimerTest, letsGoOfItsHandlersWhenItIsCancelled) {
  auto held = std::make_shared<int>(0);
  const std::weak_ptr<int> observer = held;
  const auto timer = RepeatingTimer::start(_dispatch, _world.clock(), _queue, {.interval = 1s},
                                           {.onFire = [held] {}, .onCancel = [held] {}, .onLost = [held] {}});
  held.reset();
  _world.advance(2s);
  EXPECT_FALSE(observer.expired());
  timer->cancel();
  _world.runUntilIdle();
  EXPECT_TRUE(observer.expired());
}

TEST_F(RepeatingTimerTest, needsNoCancelHandler) {
  int firings = 0;
  auto timer =
      RepeatingTimer::start(_dispatch, _world.clock(), _queue, {.interval = 1s}, {.onFire = [&] { ++firings; }});
  _world.advance(1s);
  timer.reset();
  _world.advance(5s);
  EXPECT_EQ(firings, 2);
}

TEST_F(RepeatingTimerTest, takesAnIntervalOfNothingForAMillisecond) {
  const auto timer = start(0s, 0s);
  _world.advance(3ms);
  EXPECT_THAT(_firings, ElementsAre(0, 1, 2, 3));
}

TEST_F(RepeatingTimerTest, bearsTimesThatNeverCome) {
  const auto once = start(1s, std::chrono::nanoseconds::max());
  const auto never = start(std::chrono::nanoseconds::max(), 1s);
  _world.advance(std::chrono::hours(24 * 365));
  EXPECT_THAT(_firings, ElementsAre(1000));
}

// There is no timer to be had, which the dispatch says in one of two ways.
class RepeatingTimerRefusedTest : public RepeatingTimerTest, public ::testing::WithParamInterface<bool> {
 protected:
  RepeatingTimerRefusedTest() { _dispatch.throws = GetParam(); }
};

TEST_P(RepeatingTimerRefusedTest, isNotMade) {
  _dispatch.refuses = true;
  EXPECT_EQ(start(0s, 1s), nullptr);
  _world.advance(2s);
  EXPECT_TRUE(_firings.empty());
  EXPECT_TRUE(_losses.empty()) << "who starts it is told by what is returned";
  EXPECT_TRUE(_cancellations.empty());
}

TEST_P(RepeatingTimerRefusedTest, saysOnceThatItsNextFiringIsLost) {
  const auto timer = start(0s, 1s);
  _onFire = [this] { _dispatch.refuses = _firings.size() == 3; };
  _world.advance(10s);
  EXPECT_THAT(_firings, ElementsAre(0, 1000, 2000));
  EXPECT_THAT(_losses, ElementsAre(2000));
  _dispatch.refuses = false;
  _world.advance(10s);
  EXPECT_EQ(_firings.size(), 3u) << "nobody starts it again by himself";
  timer->cancel();
  _world.advance(10s);
  EXPECT_THAT(_cancellations, ElementsAre(20000));
  EXPECT_EQ(_losses.size(), 1u);
}

TEST_P(RepeatingTimerRefusedTest, mayBeLetGoWhenItIsLost) {
  auto timer = start(0s, 1s);
  _onFire = [this] { _dispatch.refuses = true; };
  _onLost = [&timer] { timer.reset(); };
  _world.advance(5s);
  EXPECT_EQ(timer, nullptr);
  EXPECT_THAT(_losses, ElementsAre(0));
  EXPECT_THAT(_cancellations, ElementsAre(0));
}

TEST_P(RepeatingTimerRefusedTest, isNotLostWhenItsHandlerCancels) {
  auto timer = start(0s, 1s);
  _onFire = [&] {
    _dispatch.refuses = true;
    timer->cancel();
  };
  _world.advance(5s);
  EXPECT_TRUE(_losses.empty());
  EXPECT_THAT(_cancellations, ElementsAre(0));
}

INSTANTIATE_TEST_SUITE_P(Ways, RepeatingTimerRefusedTest, ::testing::Bool(),
                         [](const auto& way) { return way.param ? "thrown" : "null"; });

// Who starts the timer may be slower than its first firing, which then has set the second one already.
TEST_F(RepeatingTimerTest, goesOnWhenItsFirstFiringOvertakesItsStart) {
  _dispatch.onNewTimer = [this] { _world.advance(1ms); };
  const auto timer = start(0s, 1s);
  EXPECT_THAT(_firings, ElementsAre(0));
  _world.advance(3s);
  EXPECT_THAT(_firings, ElementsAre(0, 1000, 2000, 3000));
  timer->cancel();
  _world.advance(3s);
  EXPECT_EQ(_firings.size(), 4u);
}

class RepeatingTimerThreadsTest : public ::testing::Test {
 protected:
  void TearDown() override { EXPECT_TRUE(drain(_dispatch, *_queue)); }

  SystemClock _clock;
  ThreadedDispatch _dispatch;
  const std::shared_ptr<SerialQueue> _queue = _dispatch.newSerialQueue("timers", QualityOfService::Default);
};

TEST_F(RepeatingTimerThreadsTest, firesOnItsQueueUntilItIsCancelled) {
  std::atomic<int> firings = 0;
  std::atomic<int> cancellations = 0;
  const auto begin = _clock.monotonicNow();
  const auto timer = RepeatingTimer::start(_dispatch, _clock, _queue, {.delay = 1ms, .interval = 2ms},
                                           {.onFire = [&] { firings += _queue->isCurrent() ? 1 : 1000; },
                                            .onCancel = [&] { cancellations += _queue->isCurrent() ? 1 : 1000; }});
  ASSERT_TRUE(eventually([&] { return firings >= 10; }));
  EXPECT_GE(_clock.monotonicNow() - begin, 1ms + 9 * 2ms);
  timer->cancel();
  ASSERT_TRUE(drain(_dispatch, *_queue));
  EXPECT_EQ(cancellations, 1);
  const int firingsThen = firings;
  EXPECT_LT(firingsThen, 1000);
  // Whatever the cancelled one had planned is due before the second firing of this one, and on the same queue.
  std::atomic<int> laterFirings = 0;
  const auto later = RepeatingTimer::start(_dispatch, _clock, _queue, {.delay = 1ms, .interval = 2ms},
                                           {.onFire = [&] { ++laterFirings; }});
  EXPECT_TRUE(eventually([&] { return laterFirings >= 3; }));
  later->cancel();
  EXPECT_TRUE(drain(_dispatch, *_queue));
  EXPECT_EQ(firings, firingsThen);
}

TEST_F(RepeatingTimerThreadsTest, goesOnHoweverFastItsFirstFiringIs) {
  constexpr int kTimers = 100;
  std::vector<std::atomic<int>> firings(kTimers);
  std::vector<std::unique_ptr<RepeatingTimer>> timers;
  for (std::atomic<int>& count : firings) {
    timers.push_back(
        RepeatingTimer::start(_dispatch, _clock, _queue, {.interval = 1ms}, {.onFire = [&count] { ++count; }}));
  }
  for (std::atomic<int>& count : firings) EXPECT_TRUE(eventually([&] { return count >= 3; }));
  timers.clear();
  EXPECT_TRUE(drain(_dispatch, *_queue));
}

TEST_F(RepeatingTimerThreadsTest, isCancelledAtAnyMoment) {
  for (int round = 0; round < 300; ++round) {
    std::atomic<int> cancellations = 0;
    int firingsBehind = 0;
    auto timer = RepeatingTimer::start(
        _dispatch, _clock, _queue, {.interval = 1ms},
        {.onFire = [&] { firingsBehind += cancellations; }, .onCancel = [&] { ++cancellations; }});
    // Now, after a hand-over to the queue, or after some firings.
    if (round % 3 == 1) {
      ASSERT_TRUE(drain(_dispatch, *_queue));
    }
    if (round % 30 == 2) _dispatch.newSemaphore(0)->waitFor(2ms);
    timer.reset();
    ASSERT_TRUE(drain(_dispatch, *_queue));
    ASSERT_EQ(cancellations, 1);
    ASSERT_EQ(firingsBehind, 0);
  }
}

}  // namespace
}  // namespace telvane::testing
