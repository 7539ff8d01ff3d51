#include "client/PeriodicTasks.h"

#include <gmock/gmock.h>

#include <algorithm>
#include <functional>
#include <stdexcept>

#include "tests/client/ClientFixture.h"

namespace telvane::testing {
namespace {

using namespace std::chrono_literals;
using ::testing::ElementsAre;

constexpr Key kA{"a"};
constexpr uint64_t kSecond = 1;  // a timeout is meant in seconds

// Runs each job in the call that gives it, so that the order in which jobs are given shows.
class InlineQueue final : public ConcurrentQueue {
 public:
  void async(Job job) override { job(); }
};

// One tick after the other, as the test calls them, with whatever timeout.
class PeriodicTasksTest : public ClientFixture {
 protected:
  using Block = Telvane::PeriodicTaskBlock;

  PeriodicTasksTest() { use(client().platform().dispatch.newConcurrentQueue("periodic")); }
  void use(std::shared_ptr<ConcurrentQueue> periodicQueue) {
    _tasks =
        std::make_shared<PeriodicTasks>(_context, PeriodicTasks::Queues{_reporting, _serial, std::move(periodicQueue)},
                                        [this](const Dictionary& message) { _sent.push_back(message); });
  }
  void add(uint32_t number, bool needToUpdate, bool needToReport, Block block) {
    _reporting->async(
        [this, number,
         module = std::make_shared<const UpdateAndReportServices>(needToUpdate, needToReport, std::move(block))] {
          _tasks->registerPeriodicTaskForModule(number, module);
        });
  }
  void addUpdating(uint32_t number, std::function<void()> act) {
    add(number, true, false, [this, act = std::move(act)](Dictionary* metrics) {
      EXPECT_EQ(metrics, nullptr);
      act();
      _ended.push_back(elapsed());
    });
  }
  void addReporting(uint32_t number, std::function<void(Dictionary& metrics)> act) {
    add(number, false, true, [this, act = std::move(act)](Dictionary* metrics) {
      ASSERT_NE(metrics, nullptr);
      EXPECT_TRUE(metrics->empty());
      act(*metrics);
      _ended.push_back(elapsed());
    });
  }
  void remove(uint32_t number) {
    _reporting->async(
        [this, number] { const PeriodicTasks::Module removed = _tasks->unregisterPeriodTaskForModule(number); });
  }
  // Returns how long the tick took.
  std::chrono::milliseconds tick(int32_t multiplier, uint64_t timeout) {
    const int64_t begin = elapsed();
    int64_t end = -1;
    _reporting->async([&, multiplier, timeout] {
      _tasks->myPeriodicTask(5, 6, multiplier, timeout);
      end = elapsed();
    });
    EXPECT_TRUE(_world.runUntil([&] { return end >= 0; }));
    return std::chrono::milliseconds(end - begin);
  }
  std::chrono::milliseconds update(uint64_t timeout = kSecond) { return tick(0, timeout); }
  std::chrono::milliseconds report(uint64_t timeout = kSecond) { return tick(1, timeout); }

  int64_t elapsed() {
    return std::chrono::duration_cast<std::chrono::milliseconds>(_world.scheduler().now() - SimulatedScheduler::kStart)
        .count();
  }
  void sleep(std::chrono::nanoseconds duration) { _world.scheduler().sleep(duration); }
  Dictionary lastPayload() {
    if (_sent.empty()) return {};
    const Value& payload = _sent.back()[kTelvaneMessageParametersPayload];
    return payload.isDictionary() ? *payload.dictionary() : Dictionary();
  }
  void expectTimeout(const char* text) { log().expectError(text); }

  std::shared_ptr<SerialQueue> _serial = client().platform().dispatch.newSerialQueue("main");
  std::shared_ptr<ReportingQueue> _reporting = std::make_shared<ReportingQueue>(_serial, log());
  std::shared_ptr<PeriodicTasks> _tasks;
  std::vector<Dictionary> _sent;
  std::vector<int64_t> _ended;  // when blocks returned, in milliseconds since the start
};

TEST_F(PeriodicTasksTest, waitsForAPartOfItsTimeoutWhichWrapsAndIsConvertedTwice) {
  EXPECT_EQ(PeriodicTasks::waitLimit(0), 0ns);
  EXPECT_EQ(PeriodicTasks::waitLimit(1), 950ms);
  EXPECT_EQ(PeriodicTasks::waitLimit(60), 57s);
  // What the timer gives: the interval in nanoseconds, converted once more.
  EXPECT_EQ(PeriodicTasks::waitLimit(1'000'000'000), std::chrono::nanoseconds(950'000'000'000'000'000));
  EXPECT_EQ(PeriodicTasks::waitLimit(10'000'000'000), std::chrono::nanoseconds::max());
  // 19e18 - 2^64 = 553255926290448384
  EXPECT_EQ(PeriodicTasks::waitLimit(19'000'000'000), std::chrono::nanoseconds(525'593'129'975'925'952));
  EXPECT_EQ(PeriodicTasks::waitLimit(uint64_t{1} << 55), 0ns);
  EXPECT_EQ(PeriodicTasks::waitLimit(~uint64_t{0}), std::chrono::nanoseconds::max());
}

TEST_F(PeriodicTasksTest, callsAtMostFourBlocksAtATime) {
  int running = 0;
  int most = 0;
  for (uint32_t number = 1; number <= 10; ++number) {
    addUpdating(number, [&] {
      most = std::max(most, ++running);
      sleep(100ms);
      --running;
    });
  }
  EXPECT_EQ(update(), 300ms);
  EXPECT_EQ(most, 4);
  EXPECT_EQ(_ended.size(), 10u);
  EXPECT_TRUE(hasLines(log(), 1, "_myPeriodicTask: Started RT periodic task"));
  EXPECT_TRUE(hasLines(log(), 1, "_myPeriodicTask: Finished RT updates for all registered modules."));
}

TEST_F(PeriodicTasksTest, asksInTheOrderOfTheNumbers) {
  use(std::make_shared<InlineQueue>());
  std::vector<uint32_t> order;
  for (const uint32_t number : {4294967295u, 7u, 2147483648u, 0u, 1u}) {
    addReporting(number, [&order, number](Dictionary&) { order.push_back(number); });
  }
  report();
  EXPECT_THAT(order, ElementsAre(0u, 1u, 7u, 2147483648u, 4294967295u));
}

TEST_F(PeriodicTasksTest, asksEachModuleForWhatItWants) {
  std::vector<std::string> calls;
  const auto module = [&](const char* name) {
    return [&calls, name](Dictionary* metrics) {
      calls.push_back(std::string(name) + (metrics == nullptr ? " update" : " report"));
    };
  };
  use(std::make_shared<InlineQueue>());
  add(1, true, true, module("both"));
  add(2, true, false, module("updated"));
  add(3, false, true, module("reporting"));
  add(4, false, false, module("neither"));
  tick(2, kSecond);
  EXPECT_THAT(calls, ElementsAre("both update", "updated update"));
  calls.clear();
  tick(2, kSecond);
  EXPECT_THAT(calls, ElementsAre("both report", "reporting report"));
}

TEST_F(PeriodicTasksTest, appendsArraysInTheOrderInWhichTheBlocksEnd) {
  addReporting(1, [&](Dictionary& metrics) {
    sleep(200ms);
    metrics.set(kA, Array{1});
  });
  addReporting(2, [&](Dictionary& metrics) {
    sleep(100ms);
    metrics.set(kA, Array{2});
  });
  report();
  EXPECT_EQ(lastPayload(), (Dictionary{{kA, Array{2, 1}}}));
}

TEST_F(PeriodicTasksTest, sendsOneRealTimeEvent) {
  addReporting(1, [](Dictionary& metrics) { metrics.set(kA, 1); });
  report();
  EXPECT_THAT(_sent, ElementsAre(Dictionary{{kTelvaneMessageParametersFlag, 1},
                                            {kTelvaneMessageParametersCategory, 5},
                                            {kTelvaneMessageParametersType, 6},
                                            {kTelvaneMessageParametersPayload, Dictionary{{kA, 1}}}}));
  EXPECT_TRUE(hasLines(log(), 1, "_myPeriodicTask: All RT metrics collected"));
  EXPECT_TRUE(hasLines(log(), 1, "_myPeriodicTask: Sent realtime event after collection all RT metrics"));
  EXPECT_TRUE(hasLines(log(), 1, "_myPeriodicTask: Finished RT metrics collection"));
  EXPECT_TRUE(hasNoLine(log(), "Finished RT updates"));
}

TEST_F(PeriodicTasksTest, sendsNothingWhenNothingIsReported) {
  addReporting(1, [](Dictionary&) {});
  report();
  EXPECT_TRUE(_sent.empty());
  EXPECT_EQ(_ended.size(), 1u);
  EXPECT_TRUE(hasLines(log(), 1, "_myPeriodicTask: All RT metrics collected"));
  EXPECT_TRUE(hasNoLine(log(), "Sent realtime event"));
  EXPECT_TRUE(hasLines(log(), 1, "_myPeriodicTask: Finished RT metrics collection"));
}

TEST_F(PeriodicTasksTest, doesNotWaitWithoutModules) {
  EXPECT_EQ(update(), 0ms);
  EXPECT_EQ(report(), 0ms);
  EXPECT_TRUE(_sent.empty());
}

TEST_F(PeriodicTasksTest, givesUpWaitingForUpdates) {
  expectTimeout("_myPeriodicTask: Timeout during RT metrics update");
  addUpdating(1, [&] { sleep(2s); });
  EXPECT_EQ(update(), 950ms);
  EXPECT_TRUE(hasLines(log(), 1, "_myPeriodicTask: Finished RT updates for all registered modules."));
  EXPECT_TRUE(_ended.empty());
  _world.advance(2s);
  EXPECT_THAT(_ended, ElementsAre(2000)) << "the block goes on";
}

TEST_F(PeriodicTasksTest, givesUpSchedulingUpdatesAndDoesNotWaitForTheOthersThen) {
  expectTimeout("_myPeriodicTask: Timeout scheduling RT metrics update tasks");
  for (uint32_t number = 1; number <= 4; ++number) addUpdating(number, [&] { sleep(2s); });
  for (uint32_t number = 5; number <= 9; ++number) addUpdating(number, [] {});
  EXPECT_EQ(update(), 950ms);
  EXPECT_TRUE(hasNoLine(log(), "Timeout during"));
  EXPECT_TRUE(hasLines(log(), 1, "_myPeriodicTask: Finished RT updates for all registered modules."));
  _world.advance(5s);
  EXPECT_THAT(_ended, ElementsAre(2000, 2000, 2000, 2000)) << "the others are left out";
}

TEST_F(PeriodicTasksTest, givesUpWaitingForReportsAndSendsWhatThereIs) {
  expectTimeout("_myPeriodicTask: Timeout during periodic tasks metrics collection. Not all stats will be reported");
  addReporting(1, [&](Dictionary& metrics) {
    sleep(2s);
    metrics.set(kA, "late");
  });
  addReporting(2, [](Dictionary& metrics) { metrics.set(kA, "in time"); });
  EXPECT_EQ(report(), 950ms);
  EXPECT_TRUE(hasLines(log(), 1, "_myPeriodicTask: Finished RT metrics collection"));
  _world.advance(2s);
  EXPECT_EQ(_sent.size(), 1u);
  EXPECT_EQ(lastPayload(), (Dictionary{{kA, "in time"}}));
}

TEST_F(PeriodicTasksTest, givesUpSchedulingReportsAndDoesNotWaitForTheOthersThen) {
  expectTimeout("_myPeriodicTask: Timeout scheduling RT metrics report tasks");
  for (uint32_t number = 1; number <= 4; ++number) {
    addReporting(number, [&](Dictionary& metrics) {
      sleep(2s);
      metrics.set(kA, "late");
    });
  }
  addReporting(5, [](Dictionary& metrics) { metrics.set(kA, "left out"); });
  EXPECT_EQ(report(), 950ms);
  EXPECT_TRUE(hasNoLine(log(), "Timeout during"));
  EXPECT_TRUE(hasLines(log(), 1, "_myPeriodicTask: All RT metrics collected"));
  EXPECT_TRUE(hasLines(log(), 1, "_myPeriodicTask: Finished RT metrics collection"));
  _world.advance(2s);
  EXPECT_THAT(_ended, ElementsAre(2000, 2000, 2000, 2000));
  EXPECT_TRUE(_sent.empty());
}

TEST_F(PeriodicTasksTest, waitsForEachSlotAnew) {
  for (uint32_t number = 1; number <= 12; ++number) addUpdating(number, [&] { sleep(900ms); });
  EXPECT_EQ(update(), 2700ms);
  EXPECT_EQ(_ended.size(), 12u);
}

TEST_F(PeriodicTasksTest, aLateReportChangesNeitherItsTickNorTheNextOne) {
  expectTimeout("_myPeriodicTask: Timeout during periodic tasks metrics collection");
  addReporting(1, [&](Dictionary& metrics) {
    sleep(1500ms);
    metrics.set(kA, "late");
  });
  report();
  remove(1);
  addReporting(2, [&](Dictionary& metrics) {
    sleep(900ms);
    metrics.set("b", 1);
  });
  report();
  ASSERT_THAT(_ended, ElementsAre(1500, 1850)) << "the late one must end in the midst of the second tick";
  EXPECT_THAT(_sent, ElementsAre(::testing::_));
  EXPECT_EQ(lastPayload(), (Dictionary{{Key("b"), 1}}));
}

TEST_F(PeriodicTasksTest, waitsForNothingWithATimeoutOfZero) {
  expectTimeout("_myPeriodicTask: Timeout during RT metrics update");
  addUpdating(1, [&] { sleep(1ms); });
  EXPECT_EQ(update(0), 0ms);
  _world.advance(1s);
  EXPECT_EQ(_ended.size(), 1u);
}

TEST_F(PeriodicTasksTest, countsTicksFromOneReportToTheNext) {
  addReporting(1, [](Dictionary& metrics) { metrics.set(kA, 1); });
  std::vector<size_t> sent;
  for (int i = 0; i < 7; ++i) {
    tick(3, kSecond);
    sent.push_back(_sent.size());
  }
  EXPECT_THAT(sent, ElementsAre(0u, 0u, 1u, 1u, 1u, 2u, 2u));
}

TEST_F(PeriodicTasksTest, reportsWithEachTickForAMultiplierOfOneAndNeverForZero) {
  addReporting(1, [](Dictionary& metrics) { metrics.set(kA, 1); });
  for (int i = 0; i < 5; ++i) tick(1, kSecond);
  EXPECT_EQ(_sent.size(), 5u);
  for (int i = 0; i < 100; ++i) tick(0, kSecond);
  EXPECT_EQ(_sent.size(), 5u);
}

TEST_F(PeriodicTasksTest, reportsNothingBehindACountThatHasPassedTheMultiplier) {
  addReporting(1, [](Dictionary& metrics) { metrics.set(kA, 1); });
  for (int i = 0; i < 5; ++i) tick(0, kSecond);
  for (int i = 0; i < 5; ++i) tick(2, kSecond);
  EXPECT_TRUE(_sent.empty()) << "the count is equal to the multiplier once, or never";
}

TEST_F(PeriodicTasksTest, logsWhatABlockThrowsAndGoesOnWithoutWhatItFilledIn) {
  log().expectError("_myPeriodicTask: Exception in a block of the client: no metrics today");
  log().expectError("_myPeriodicTask: Exception in a block of the client");
  for (uint32_t number = 1; number <= 6; ++number) {
    addReporting(number, [number](Dictionary& metrics) {
      metrics.set(kA, "half");
      if (number % 2 == 0) throw std::runtime_error("no metrics today");
      throw 5;
    });
  }
  addReporting(7, [](Dictionary& metrics) { metrics.set("b", 1); });
  EXPECT_EQ(report(), 0ms) << "each must give its slot back";
  EXPECT_EQ(lastPayload(), (Dictionary{{Key("b"), 1}}));
  EXPECT_EQ(log().count(LogLevel::Error, "Exception in a block of the client"), 6u);
}

TEST_F(PeriodicTasksTest, goesOnAfterAnUpdateThatThrows) {
  log().expectError("_myPeriodicTask: Exception in a block of the client: no");
  addUpdating(1, [] { throw std::runtime_error("no"); });
  addUpdating(2, [] {});
  EXPECT_EQ(update(), 0ms);
  EXPECT_EQ(_ended.size(), 1u);
}

TEST_F(PeriodicTasksTest, aBlockThatNeverReturnsTakesASlotOfItsOwnTickOnly) {
  expectTimeout("_myPeriodicTask: Timeout during RT metrics update");
  const std::shared_ptr<Semaphore> never = client().platform().dispatch.newSemaphore(0);
  for (uint32_t number = 1; number <= 4; ++number) addUpdating(number, [never] { never->wait(); });
  EXPECT_EQ(update(), 950ms);
  for (uint32_t number = 1; number <= 4; ++number) remove(number);
  int running = 0;
  int most = 0;
  for (uint32_t number = 11; number <= 18; ++number) {
    addUpdating(number, [&] {
      most = std::max(most, ++running);
      sleep(100ms);
      --running;
    });
  }
  EXPECT_EQ(update(), 200ms);
  EXPECT_EQ(most, 4);
  for (int i = 0; i < 4; ++i) never->signal();
  run();
  EXPECT_EQ(_ended.size(), 12u);
}

TEST_F(PeriodicTasksTest, callsNoBlockAnyMoreOnceTheProcessEnds) {
  addReporting(1, [](Dictionary& metrics) { metrics.set(kA, 1); });
  addUpdating(2, [] {});
  run();
  _context.stopCallingOut();
  update();
  tick(2, kSecond);
  EXPECT_TRUE(_ended.empty());
  EXPECT_TRUE(_sent.empty());
}

TEST_F(PeriodicTasksTest, replacesAModuleAndForgetsOne) {
  int first = 0;
  int second = 0;
  addUpdating(7, [&] { ++first; });
  addUpdating(7, [&] { ++second; });
  update();
  EXPECT_EQ(first, 0);
  EXPECT_EQ(second, 1);
  remove(7);
  remove(7);
  update();
  EXPECT_EQ(second, 1);
  EXPECT_TRUE(hasLines(log(), 1, "unregisterPeriodTaskForModule: 7 removed"));
  EXPECT_TRUE(hasLines(log(), 1, "unregisterPeriodTaskForModule: 7 doesn't exist"));
}

TEST_F(PeriodicTasksTest, tellsWhetherACallerIsInsideABlock) {
  std::vector<bool> isInside;
  ModuleBlocks& blocks = _context.moduleBlocks();
  addUpdating(1, [&] {
    isInside.push_back(blocks.isInside());
    sleep(100ms);
    isInside.push_back(blocks.isInside());
  });
  client().spawn("other", [&] {
    sleep(50ms);
    isInside.push_back(blocks.isInside());
  });
  update();
  EXPECT_THAT(isInside, ElementsAre(true, false, true));
  EXPECT_FALSE(blocks.isInside());
}

}  // namespace
}  // namespace telvane::testing
