#include "platform/dispatch/ThreadedTimer.h"

#include <gtest/gtest.h>

#include "platform/dispatch/ThreadedDispatch.h"
#include "tests/platform/dispatch/Waiting.h"

namespace telvane::testing {
namespace {

using namespace std::chrono_literals;

class ThreadedTimerTest : public ::testing::Test {
 protected:
  // Cancel handlers of timers that the test let go of still use the fixture.
  void TearDown() override { EXPECT_TRUE(drain(_dispatch, *_queue)); }
  // A timer that counts what it does; each firing and each cancel handler signals _happened.
  std::unique_ptr<Timer> startTimer(std::chrono::nanoseconds delay) {
    return _dispatch.newTimer(
        _queue, delay, 0ns,
        [this] {
          _firings += _queue->isCurrent() ? 1 : 100;
          _happened->signal();
        },
        [this] {
          _cancellations += _queue->isCurrent() ? 1 : 100;
          _happened->signal();
        });
  }
  void expectHappened(int firings, int cancellations) {
    EXPECT_TRUE(drain(_dispatch, *_queue));
    EXPECT_EQ(_firings, firings);
    EXPECT_EQ(_cancellations, cancellations);
  }

  ThreadedDispatch _dispatch;
  const std::shared_ptr<SerialQueue> _queue = _dispatch.newSerialQueue("timers", QualityOfService::Default);
  const std::shared_ptr<Semaphore> _happened = _dispatch.newSemaphore(0);
  // Confined to _queue. A call off the queue counts as a hundred.
  int _firings = 0;
  int _cancellations = 0;
};

TEST_F(ThreadedTimerTest, firesOnceOnItsQueueAndNotBeforeItsTime) {
  const auto start = std::chrono::steady_clock::now();
  const auto timer = startTimer(4ms);
  ASSERT_TRUE(_happened->waitFor(kDeadline));
  EXPECT_GE(std::chrono::steady_clock::now() - start, 4ms);
  // Due behind whatever else the first one had planned, and on the same queue.
  const std::shared_ptr<Semaphore> isLater = _dispatch.newSemaphore(0);
  const auto later = _dispatch.newTimer(_queue, 4ms, 0ns, [isLater] { isLater->signal(); }, {});
  ASSERT_TRUE(isLater->waitFor(kDeadline));
  expectHappened(1, 0);
}

TEST_F(ThreadedTimerTest, doesNotFireOnceCancelledAndCallsTheCancelHandlerOnce) {
  const auto timer = startTimer(1h);
  timer->cancel();
  timer->cancel();
  expectHappened(0, 1);
}

TEST_F(ThreadedTimerTest, callsTheCancelHandlerAlsoAfterItHasFired) {
  const auto timer = startTimer(0ns);
  ASSERT_TRUE(_happened->waitFor(kDeadline));
  timer->cancel();
  expectHappened(1, 1);
}

TEST_F(ThreadedTimerTest, isCancelledByLettingItGo) {
  startTimer(1h).reset();
  expectHappened(0, 1);
}

TEST_F(ThreadedTimerTest, callsTheCancelHandlerOnceWhenItIsCancelledAndLetGo) {
  auto timer = startTimer(1h);
  timer->cancel();
  timer.reset();
  expectHappened(0, 1);
}

// The firing already waits on the queue, behind the job that cancels.
TEST_F(ThreadedTimerTest, doesNotFireWhenAnEarlierJobOfItsQueueCancelsIt) {
  std::unique_ptr<Timer> timer;
  const auto firingIsQueued = _dispatch.newSemaphore(0);
  const auto probeQueue = _dispatch.newSerialQueue("probe", QualityOfService::Default);
  _queue->async([&] {
    timer = startTimer(0ns);
    // A later timer's job has come through, so the earlier one has been handed to its queue.
    const auto probe = _dispatch.newTimer(probeQueue, 1ms, 0ns, [=] { firingIsQueued->signal(); }, {});
    EXPECT_TRUE(firingIsQueued->waitFor(kDeadline));
    timer->cancel();
  });
  EXPECT_TRUE(drain(_dispatch, *_queue));  // the timer is cancelled now, its handler waits on the queue
  expectHappened(0, 1);
}

TEST_F(ThreadedTimerTest, mayBeLetGoOfWhileItFires) {
  std::unique_ptr<Timer> timer;
  const auto captured = std::make_shared<int>(5);
  int seen = 0;
  _queue->sync([&] {
    timer = _dispatch.newTimer(_queue, 0ns, 0ns,
                               [&, captured] {
                                 timer.reset();
                                 seen = *captured;
                                 _happened->signal();
                               },
                               {});
  });
  ASSERT_TRUE(_happened->waitFor(kDeadline));
  EXPECT_EQ(seen, 5);
}

TEST_F(ThreadedTimerTest, letsGoOfItsHandlerWhenItIsCancelled) {
  auto captured = std::make_shared<int>(0);
  const std::weak_ptr<int> observer = captured;
  const auto timer = _dispatch.newTimer(_queue, 1h, 0ns, [held = std::move(captured)] {}, {});
  timer->cancel();
  EXPECT_TRUE(observer.expired()) << "an owner that its own timer holds would never go away";
}

}  // namespace
}  // namespace telvane::testing
