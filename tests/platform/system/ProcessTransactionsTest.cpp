#include "platform/system/ProcessTransactions.h"

#include <gtest/gtest.h>

#include <thread>
#include <vector>

namespace telvane {
namespace {

using namespace std::chrono_literals;

// A clock and a queue that move by hand: jobs run when the test says so, delayed ones when the time has come.
class HandDrivenQueue final : public SerialQueue, public Clock {
 public:
  void async(Job job) override { _delayed.push_back({_now, std::move(job)}); }
  void sync(UniqueFunction<void()> job) override { job(); }
  void asyncAfter(std::chrono::nanoseconds delay, Job job) override {
    ++scheduled;
    _delayed.push_back({_now + delay, std::move(job)});
  }
  bool isCurrent() const noexcept override { return true; }
  const std::string& label() const noexcept override { return _label; }
  Date now() const override { return Date(); }
  MonotonicTime monotonicNow() const override { return _now; }

  void advance(std::chrono::nanoseconds time) {
    const MonotonicTime end = _now + time;
    while (runFirstUntil(end)) {
    }
    _now = end;
  }

  size_t scheduled = 0;

 private:
  struct Delayed {
    MonotonicTime time;
    Job job;
  };

  bool runFirstUntil(MonotonicTime end) {
    auto first = _delayed.end();
    for (auto one = _delayed.begin(); one != _delayed.end(); ++one) {
      if (one->time <= end && (first == _delayed.end() || one->time < first->time)) first = one;
    }
    if (first == _delayed.end()) return false;
    Delayed due = std::move(*first);
    _delayed.erase(first);
    _now = std::max(_now, due.time);
    due.job();
    return true;
  }

  const std::string _label = "test";
  MonotonicTime _now{};
  std::vector<Delayed> _delayed;
};

class ProcessTransactionsTest : public ::testing::Test {
 protected:
  void exitWhenIdleFor(std::chrono::nanoseconds time) {
    _transactions.whenIdleFor(time, _queue, [this] { ++_idleCalls; });
  }

  std::shared_ptr<HandDrivenQueue> _queue = std::make_shared<HandDrivenQueue>();
  ProcessTransactions _transactions{*_queue};
  int _idleCalls = 0;
};

TEST_F(ProcessTransactionsTest, countsAndIgnoresAnEndWithoutABegin) {
  _transactions.end();
  EXPECT_EQ(_transactions.count(), 0u);
  _transactions.begin();
  _transactions.begin();
  _transactions.end();
  EXPECT_EQ(_transactions.count(), 1u);
}

TEST_F(ProcessTransactionsTest, countsFromAllThreads) {
  std::vector<std::thread> threads;
  for (int i = 0; i < 4; ++i) {
    threads.emplace_back([this] {
      for (int k = 0; k < 1000; ++k) _transactions.begin();
      for (int k = 0; k < 999; ++k) _transactions.end();
    });
  }
  for (std::thread& thread : threads) thread.join();
  EXPECT_EQ(_transactions.count(), 4u);
}

TEST_F(ProcessTransactionsTest, isIdleWhenTheTimeHasPassedWithoutATransaction) {
  exitWhenIdleFor(15s);
  _queue->advance(14999ms);
  EXPECT_EQ(_idleCalls, 0);
  _queue->advance(1ms);
  EXPECT_EQ(_idleCalls, 1);
  _queue->advance(1h);
  EXPECT_EQ(_idleCalls, 1) << "the handler runs once";
}

TEST_F(ProcessTransactionsTest, isNotIdleWhileATransactionIsHeld) {
  exitWhenIdleFor(15s);
  _transactions.begin();
  _queue->advance(1h);
  EXPECT_EQ(_idleCalls, 0);
  _transactions.end();
  _queue->advance(14999ms);
  EXPECT_EQ(_idleCalls, 0);
  _queue->advance(1ms);
  EXPECT_EQ(_idleCalls, 1);
}

TEST_F(ProcessTransactionsTest, countsTheTimeFromTheEndOfTheLastTransaction) {
  exitWhenIdleFor(15s);
  _queue->advance(10s);
  _transactions.begin();
  _queue->advance(1s);
  _transactions.end();
  _queue->advance(14999ms);
  EXPECT_EQ(_idleCalls, 0);
  _queue->advance(1ms);
  EXPECT_EQ(_idleCalls, 1);
}

TEST_F(ProcessTransactionsTest, schedulesOneCheckHoweverManyTransactionsComeAndGo) {
  exitWhenIdleFor(15s);
  for (int i = 0; i < 1000; ++i) {
    _transactions.begin();
    _transactions.end();
  }
  EXPECT_EQ(_queue->scheduled, 1u);
  _transactions.begin();
  _queue->advance(1h);
  EXPECT_EQ(_queue->scheduled, 1u) << "a process that is held does not wake up";
}

TEST_F(ProcessTransactionsTest, takesTheLastHandler) {
  exitWhenIdleFor(10s);
  int replaced = 0;
  _queue->advance(5s);
  _transactions.whenIdleFor(10s, _queue, [&replaced] { ++replaced; });
  _queue->advance(9s);
  EXPECT_EQ(replaced, 0);
  _queue->advance(1s);
  EXPECT_EQ(replaced, 1);
  EXPECT_EQ(_idleCalls, 0);
}

TEST_F(ProcessTransactionsTest, tellsWhenTheLastTransactionEnded) {
  int calls = 0;
  _transactions.begin();
  _transactions.begin();
  _transactions.whenNoneHeld(_queue, [&calls] { ++calls; });
  _transactions.end();
  _queue->advance(1h);
  EXPECT_EQ(calls, 0);
  _transactions.end();
  _queue->advance(0s);
  EXPECT_EQ(calls, 1);
  _transactions.whenNoneHeld(_queue, [&calls] { ++calls; });
  _queue->advance(0s);
  EXPECT_EQ(calls, 2) << "none is held already";
}

TEST_F(ProcessTransactionsTest, letsGoOfItsHandlersAtItsEnd) {
  const auto held = std::make_shared<int>(0);
  {
    ProcessTransactions transactions(*_queue);
    transactions.begin();
    transactions.whenIdleFor(1s, _queue, [held] { ++*held; });
    transactions.whenNoneHeld(_queue, [held] { ++*held; });
  }
  EXPECT_EQ(held.use_count(), 1);
  _queue->advance(1h);
  EXPECT_EQ(*held, 0);
}

}  // namespace
}  // namespace telvane
