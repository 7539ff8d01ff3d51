#include "tests/support/SimulatedScheduler.h"

#include <gmock/gmock.h>
#include <gtest/gtest.h>

#include <chrono>
#include <memory>
#include <set>
#include <string>
#include <vector>

#include "tests/support/Seeds.h"
#include "tests/support/SimulatedDispatch.h"

namespace telvane::testing {
namespace {

using namespace std::chrono_literals;
using ::testing::ElementsAre;
using ::testing::HasSubstr;
using ::testing::Not;
using ::testing::StartsWith;

constexpr auto kWorld = SimulatedScheduler::kNoProcess;

// The text of the failure that the action throws; empty when it throws none.
template <class Action>
std::string failureOf(Action action) {
  try {
    action();
  } catch (const SimulationFailure& failure) {
    return failure.what();
  }
  return "";
}

class SimulatedSchedulerTest : public ::testing::Test {
 protected:
  // Runs ten jobs that could all run at once, and says in which order the seed put them.
  static std::string orderUnder(uint64_t seed) {
    SimulatedScheduler scheduler(seed);
    std::string order;
    for (char name = 'a'; name <= 'j'; ++name) {
      scheduler.schedule(kWorld, "job", [&order, name] { order += name; });
    }
    scheduler.runUntilIdle();
    return order;
  }

  SimulatedScheduler _scheduler{1};
  SimulatedDispatch _dispatch{_scheduler, "app"};
};

TEST_F(SimulatedSchedulerTest, runsTheSameOrderForTheSameSeed) {
  for (uint64_t seed = 1; seed <= 20; ++seed) EXPECT_EQ(orderUnder(seed), orderUnder(seed));
}

TEST_F(SimulatedSchedulerTest, runsOtherOrdersForOtherSeeds) {
  std::set<std::string> orders;
  for (uint64_t seed = 1; seed <= 20; ++seed) orders.insert(orderUnder(seed));
  EXPECT_GE(orders.size(), 19u);
}

TEST_F(SimulatedSchedulerTest, runsEveryJobExactlyOnce) {
  std::string order = orderUnder(7);
  std::sort(order.begin(), order.end());
  EXPECT_EQ(order, "abcdefghij");
}

TEST_F(SimulatedSchedulerTest, letsNoTimePassWhileThingsRun) {
  bool hasFired = false;
  _scheduler.startTimer(kWorld, 1ns, [&hasFired] { hasFired = true; });
  _scheduler.schedule(kWorld, "job", [] {});
  _scheduler.runUntilIdle();
  EXPECT_FALSE(hasFired);
  EXPECT_EQ(_scheduler.now(), SimulatedScheduler::kStart);
}

TEST_F(SimulatedSchedulerTest, firesTimersInTheOrderOfTheirTimes) {
  std::vector<std::pair<int, SimulatedScheduler::Time>> fired;
  for (int seconds : {30, 10, 20}) {
    _scheduler.startTimer(kWorld, std::chrono::seconds(seconds),
                          [this, &fired, seconds] { fired.emplace_back(seconds, _scheduler.now()); });
  }
  _scheduler.advance(20s);
  const auto start = SimulatedScheduler::kStart;
  EXPECT_THAT(fired, ElementsAre(std::pair(10, start + 10s), std::pair(20, start + 20s)));
  EXPECT_EQ(_scheduler.now(), start + 20s);
  _scheduler.advance(24h);
  EXPECT_EQ(fired.size(), 3u);
}

TEST_F(SimulatedSchedulerTest, firesEqualTimesInTheOrderInWhichTheyWereStarted) {
  std::string fired;
  for (char name : {'x', 'y', 'z'}) _scheduler.startTimer(kWorld, 5s, [&fired, name] { fired += name; });
  _scheduler.advance(5s);
  EXPECT_EQ(fired, "xyz");
}

TEST_F(SimulatedSchedulerTest, firesTimersThatTimersStarted) {
  std::vector<SimulatedScheduler::Time> fired;
  std::function<void()> again = [&] {
    fired.push_back(_scheduler.now());
    if (fired.size() < 3) _scheduler.startTimer(kWorld, 10s, again);
  };
  _scheduler.startTimer(kWorld, 10s, again);
  _scheduler.advance(25s);
  EXPECT_EQ(fired.size(), 2u);
}

TEST_F(SimulatedSchedulerTest, forgetsACancelledTimer) {
  bool hasFired = false;
  const auto timer = _scheduler.startTimer(kWorld, 1s, [&hasFired] { hasFired = true; });
  _scheduler.cancelTimer(timer);
  _scheduler.cancelTimer(timer);
  _scheduler.advance(10s);
  EXPECT_FALSE(hasFired);
}

TEST_F(SimulatedSchedulerTest, keepsADelayBeyondTheEndOfTimeForEver) {
  bool hasFired = false;
  _scheduler.startTimer(kWorld, std::chrono::nanoseconds::max(), [&hasFired] { hasFired = true; });
  _scheduler.advance(24h * 365);
  EXPECT_FALSE(hasFired);
}

TEST_F(SimulatedSchedulerTest, runsUntilTheConditionHoldsAndNoFurther) {
  int steps = 0;
  for (int i = 0; i < 5; ++i) _scheduler.schedule(kWorld, "job", [&steps] { ++steps; });
  EXPECT_TRUE(_scheduler.runUntil([&steps] { return steps == 3; }, 0s));
  EXPECT_EQ(steps, 3);
}

TEST_F(SimulatedSchedulerTest, letsTimePassToMeetACondition) {
  bool hasFired = false;
  _scheduler.startTimer(kWorld, 900s, [&hasFired] { hasFired = true; });
  EXPECT_TRUE(_scheduler.runUntil([&hasFired] { return hasFired; }, 1h));
  EXPECT_EQ(_scheduler.now(), SimulatedScheduler::kStart + 900s);
}

TEST_F(SimulatedSchedulerTest, saysWhoStillWaitsWhenAConditionIsNotMet) {
  const auto semaphore = _dispatch.newSemaphore(0);
  _dispatch.spawn("reader", [&semaphore] { semaphore->wait(); });
  const auto met = _scheduler.runUntil([] { return false; }, 10s);
  EXPECT_FALSE(met);
  EXPECT_THAT(met.message(), HasSubstr("seed 1, 10.000000 s after the start"));
  EXPECT_THAT(met.message(), HasSubstr("app/reader waits for semaphore app/1"));
  EXPECT_EQ(_scheduler.now(), SimulatedScheduler::kStart + 10s);
  _dispatch.end();  // before the semaphore goes
}

TEST_F(SimulatedSchedulerTest, runsOthersWhileAJobWaits) {
  std::string story;
  const auto semaphore = _dispatch.newSemaphore(0);
  _dispatch.spawn("waiter", [&] {
    story += "[";
    semaphore->wait();
    story += "]";
  });
  _scheduler.runUntilIdle();
  EXPECT_EQ(story, "[");
  _dispatch.spawn("other", [&] {
    story += "other";
    semaphore->signal();
  });
  _scheduler.runUntilIdle();
  EXPECT_EQ(story, "[other]");
}

TEST_F(SimulatedSchedulerTest, runsOthersWhileTheTestsBodyWaits) {
  const auto semaphore = _dispatch.newSemaphore(0);
  int answer = 0;
  _dispatch.spawn("other", [&] {
    answer = 42;
    semaphore->signal();
  });
  semaphore->wait();
  EXPECT_EQ(answer, 42);
}

TEST_F(SimulatedSchedulerTest, jumpsToTheNextTimerWhenTheTestsBodyWaits) {
  const auto semaphore = _dispatch.newSemaphore(0);
  _scheduler.startTimer(kWorld, 30s, [&semaphore] { semaphore->signal(); });
  semaphore->wait();
  EXPECT_EQ(_scheduler.now(), SimulatedScheduler::kStart + 30s);
}

TEST_F(SimulatedSchedulerTest, keepsManyWaitsApart) {
  constexpr int kStrands = 300;
  std::vector<std::shared_ptr<Semaphore>> semaphores;
  int finished = 0;
  for (int i = 0; i < kStrands; ++i) semaphores.push_back(_dispatch.newSemaphore(0));
  for (int i = 0; i < kStrands; ++i) {
    _dispatch.spawn("strand", [&, i] {
      const std::string local = "local " + std::to_string(i);
      semaphores[static_cast<size_t>(i)]->wait();
      if (local == "local " + std::to_string(i)) ++finished;
    });
  }
  _scheduler.runUntilIdle();
  EXPECT_EQ(finished, 0);
  for (auto semaphore = semaphores.rbegin(); semaphore != semaphores.rend(); ++semaphore) (*semaphore)->signal();
  _scheduler.runUntilIdle();
  EXPECT_EQ(finished, kStrands);
}

TEST_F(SimulatedSchedulerTest, sleepsUnderVirtualTime) {
  std::vector<std::string> story;
  _dispatch.spawn("sleeper", [&] {
    _scheduler.sleep(10s);
    story.push_back("sleeper");
  });
  _scheduler.sleep(5s);
  story.push_back("test");
  _scheduler.sleep(5s);
  _scheduler.runUntilIdle();
  EXPECT_THAT(story, ElementsAre("test", "sleeper"));
  EXPECT_EQ(_scheduler.now(), SimulatedScheduler::kStart + 10s);
}

TEST_F(SimulatedSchedulerTest, failsAWaitThatNothingCanAnswer) {
  const auto semaphore = _dispatch.newSemaphore(0);
  const auto other = _dispatch.newSemaphore(0);
  _dispatch.spawn("reader", [&other] { other->wait(); });
  const std::string failure = failureOf([&semaphore] { semaphore->wait(); });
  EXPECT_THAT(failure, HasSubstr("seed 1"));
  EXPECT_THAT(failure, HasSubstr("deadlock: nothing can run and no timer is set"));
  EXPECT_THAT(failure, HasSubstr("main waits for semaphore app/1"));
  EXPECT_THAT(failure, HasSubstr("app/reader waits for semaphore app/2"));
  _dispatch.end();
}

TEST_F(SimulatedSchedulerTest, goesOnAfterADeadlockWasReported) {
  const auto semaphore = _dispatch.newSemaphore(0);
  EXPECT_NE(failureOf([&semaphore] { semaphore->wait(); }), "");
  EXPECT_EQ(_scheduler.waiting(), "");
  semaphore->signal();
  EXPECT_EQ(failureOf([&semaphore] { semaphore->wait(); }), "");
}

// Each of two queues waits in sync for the other one: no timer and no later signal can ever help.
TEST_F(SimulatedSchedulerTest, failsACircleOfWaitsAtOnce) {
  forEachSeed(10, [](uint64_t seed) {
    SimulatedScheduler scheduler(seed);
    SimulatedDispatch dispatch(scheduler, "app");
    const auto first = dispatch.newSerialQueue("first");
    const auto second = dispatch.newSerialQueue("second");
    scheduler.startTimer(kWorld, 24h, [] {});
    auto cross = [&scheduler](SerialQueue& own, SerialQueue& other) {
      own.async([&scheduler, &other] {
        scheduler.sleep(1s);  // until the other one has its own too
        other.sync([] {});
      });
    };
    cross(*first, *second);
    cross(*second, *first);
    const std::string failure = failureOf([&scheduler] { scheduler.advance(10s); });
    EXPECT_THAT(failure, HasSubstr("each of these waits for what another one has"));
    EXPECT_THAT(failure, HasSubstr("app/first waits for its turn on queue app/second, which app/second has"));
    EXPECT_THAT(failure, HasSubstr("app/second waits for its turn on queue app/first, which app/first has"));
    dispatch.end();
  });
}

TEST_F(SimulatedSchedulerTest, failsARunThatNeverComesToRest) {
  const auto queue = _dispatch.newSerialQueue("busy");
  _scheduler.setMaximumStepsAtOneTime(10'000);
  std::function<void()> again = [&] { queue->async(again); };
  queue->async(again);
  const std::string failure = failureOf([this] { _scheduler.runUntilIdle(); });
  EXPECT_THAT(failure, HasSubstr("does not come to rest; next in turn: \"app/busy\""));
  _dispatch.end();
}

TEST_F(SimulatedSchedulerTest, handsAJobsExceptionToTheTest) {
  _dispatch.spawn("thrower", [] { throw std::runtime_error("out of a job"); });
  bool hasRun = false;
  _dispatch.spawn("other", [&hasRun] { hasRun = true; });
  EXPECT_THROW(
      {
        _scheduler.runUntilIdle();
        _scheduler.runUntilIdle();
      },
      std::runtime_error);
  _scheduler.runUntilIdle();
  EXPECT_TRUE(hasRun);
}

TEST_F(SimulatedSchedulerTest, keepsTheExceptionsOfStrandsApart) {
  std::string caught;
  const auto semaphore = _dispatch.newSemaphore(0);
  auto catchAndWait = [&](const char* text) {
    try {
      throw std::runtime_error(text);
    } catch (const std::runtime_error& error) {
      semaphore->wait();
      try {
        throw;
      } catch (const std::runtime_error& again) {
        caught += again.what();
      }
    }
  };
  _dispatch.spawn("a", [&] { catchAndWait("a"); });
  _scheduler.runUntilIdle();
  _dispatch.spawn("b", [&] { catchAndWait("b"); });
  _scheduler.runUntilIdle();
  semaphore->signal();
  semaphore->signal();
  _scheduler.runUntilIdle();
  std::sort(caught.begin(), caught.end());
  EXPECT_EQ(caught, "ab");
}

TEST_F(SimulatedSchedulerTest, refusesTheTestsVerbsInsideAJob) {
  std::string failure;
  _dispatch.spawn("job", [&] { failure = failureOf([this] { _scheduler.advance(1s); }); });
  _scheduler.runUntilIdle();
  EXPECT_THAT(failure, HasSubstr("advance is a verb of the test's body, but \"app/job\" called it"));
}

TEST_F(SimulatedSchedulerTest, clearsTheStacksOfAProcessThatEnds) {
  const auto alive = std::make_shared<int>(1);
  std::string story;
  const auto semaphore = _dispatch.newSemaphore(0);
  _dispatch.spawn("waiter", [&, held = alive] {
    const auto local = held;
    semaphore->wait();
    story += "went on";
  });
  _scheduler.startTimer(_dispatch.process(), 1s, [held = alive] {});
  _scheduler.runUntilIdle();
  _dispatch.spawn("never started", [held = alive] {});
  EXPECT_EQ(alive.use_count(), 5);
  _dispatch.end();
  EXPECT_EQ(alive.use_count(), 1);
  semaphore->signal();
  _scheduler.advance(1h);
  EXPECT_EQ(story, "");
}

TEST_F(SimulatedSchedulerTest, leavesOtherProcessesAloneWhenOneEnds) {
  SimulatedDispatch other(_scheduler, "other");
  const auto semaphore = other.newSemaphore(0);
  bool hasGoneOn = false;
  other.spawn("waiter", [&] {
    semaphore->wait();
    hasGoneOn = true;
  });
  _scheduler.runUntilIdle();
  _dispatch.end();
  semaphore->signal();
  _scheduler.runUntilIdle();
  EXPECT_TRUE(hasGoneOn);
}

TEST_F(SimulatedSchedulerTest, endsAProcessFromOneOfItsOwnJobs) {
  std::string story;
  const auto semaphore = _dispatch.newSemaphore(0);
  _dispatch.spawn("other", [&] {
    semaphore->wait();
    story += "other went on;";
  });
  _scheduler.runUntilIdle();
  _dispatch.spawn("suicide", [&] {
    _dispatch.end();
    story += "still running;";
    semaphore->wait();
    story += "waited;";
  });
  _scheduler.runUntilIdle();
  EXPECT_EQ(story, "still running;");
  EXPECT_EQ(_scheduler.waiting(), "");
}

TEST_F(SimulatedSchedulerTest, overtakesOnlyAtWaitsUnlessToldOtherwise) {
  forEachSeed(20, [](uint64_t seed) {
    SimulatedScheduler scheduler(seed);
    SimulatedDispatch dispatch(scheduler, "app");
    const auto queue = dispatch.newSerialQueue("queue");
    std::string story;
    dispatch.spawn("caller", [&] {
      queue->async([&story] { story += "job;"; });
      story += "caller;";
    });
    scheduler.runUntilIdle();
    EXPECT_EQ(story, "caller;job;");
  });
}

TEST_F(SimulatedSchedulerTest, overtakesACallerAtItsCallsWhenToldTo) {
  std::set<std::string> stories;
  for (uint64_t seed = 1; seed <= 20; ++seed) {
    SimulatedScheduler scheduler(seed);
    scheduler.setInterleaving(SimulatedScheduler::Interleaving::AtCalls);
    SimulatedDispatch dispatch(scheduler, "app");
    const auto queue = dispatch.newSerialQueue("queue");
    std::string story;
    dispatch.spawn("caller", [&] {
      queue->async([&story] { story += "job;"; });
      story += "caller;";
    });
    scheduler.runUntilIdle();
    stories.insert(story);
  }
  EXPECT_THAT(stories, ElementsAre("caller;job;", "job;caller;"));
}

// What a job holds may call out when it goes, and its strand is still in use then.
TEST_F(SimulatedSchedulerTest, overtakesAJobThatIsBeingDestroyed) {
  bool isOvertaken = false;
  for (uint64_t seed = 1; seed <= 20; ++seed) {
    SimulatedScheduler scheduler(seed);
    scheduler.setInterleaving(SimulatedScheduler::Interleaving::AtCalls);
    SimulatedDispatch dispatch(scheduler, "app");
    const auto semaphore = dispatch.newSemaphore(0);
    std::string story;
    {
      std::shared_ptr<int> held(new int(0), [&story, semaphore](int* number) {
        const std::unique_ptr<int> owned(number);
        story += "begin;";
        for (int i = 0; i < 3; ++i) semaphore->signal();
        story += "end;";
      });
      dispatch.spawn("held", [held = std::move(held)] {});
    }
    for (int i = 0; i < 3; ++i) dispatch.spawn("other", [&story] { story += "other;"; });
    scheduler.runUntilIdle();
    EXPECT_EQ(story.size(), std::string("begin;end;other;other;other;").size()) << story;
    isOvertaken = isOvertaken || story.find("begin;end;") == std::string::npos;
  }
  EXPECT_TRUE(isOvertaken);
}

using SimulatedSchedulerDeathTest = SimulatedSchedulerTest;

TEST_F(SimulatedSchedulerDeathTest, endsTheProcessWhenAnotherThreadReachesIt) {
  GTEST_FLAG_SET(death_test_style, "threadsafe");
  EXPECT_DEATH(std::thread([this] { _scheduler.schedule(kWorld, "job", [] {}); }).join(),
               "reached from another thread");
}

}  // namespace
}  // namespace telvane::testing
