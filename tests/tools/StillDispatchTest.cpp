#include "tools/StillDispatch.h"

#include <gmock/gmock.h>

#include <string>

#include "platform/dispatch/ThreadedDispatch.h"

namespace telvane::testing {
namespace {

using std::chrono_literals::operator""h;

class StillDispatchTest : public ::testing::Test {
 protected:
  std::shared_ptr<SerialQueue> newQueue() { return dispatch.newSerialQueue("queue", QualityOfService::Default); }
  void note(char letter) { happened += letter; }

  ThreadedDispatch system;
  StillDispatch dispatch{system};
  std::string happened;
};

TEST_F(StillDispatchTest, aJobHasRunWhenItWasGiven) {
  const auto queue = newQueue();
  EXPECT_FALSE(queue->isCurrent());
  queue->async([this, &queue] {
    queue->assertOnQueue();
    note('a');
  });
  EXPECT_EQ(happened, "a");
  EXPECT_FALSE(queue->isCurrent());
  EXPECT_EQ(queue->label(), "queue");
}

TEST_F(StillDispatchTest, aJobThatAJobGivesRunsBehindIt) {
  const auto queue = newQueue();
  queue->async([this, &queue] {
    queue->async([this] { note('c'); });
    queue->sync([this] { note('a'); });
    note('b');
  });
  queue->sync([this, &queue] {
    queue->async([this] { note('e'); });
    note('d');
  });
  EXPECT_EQ(happened, "abcde");
}

TEST_F(StillDispatchTest, aQueueMayGoWithItsLastJob) {
  auto queue = newQueue();
  SerialQueue& theQueue = *queue;
  const std::weak_ptr<SerialQueue> weak = queue;
  theQueue.async([this, held = std::move(queue)] { note('a'); });
  EXPECT_EQ(happened, "a");
  EXPECT_TRUE(weak.expired());
}

TEST_F(StillDispatchTest, nothingHappensLater) {
  const auto queue = newQueue();
  auto held = std::make_shared<int>();
  const std::weak_ptr<int> weak = held;
  queue->asyncAfter(1h, [this, held] { note('a'); });
  const auto timer = dispatch.newTimer(queue, 1h, 0h, [this, held = std::move(held)] { note('b'); }, {});
  EXPECT_TRUE(weak.expired()) << "what will not run holds nothing";
  EXPECT_EQ(happened, "");
}

TEST_F(StillDispatchTest, aTimerSaysOnceThatItIsCancelled) {
  const auto queue = newQueue();
  auto timer = dispatch.newTimer(
      queue, 1h, 0h, [] {},
      [this, &queue] {
        queue->assertOnQueue();
        note('c');
      });
  timer->cancel();
  timer->cancel();
  timer.reset();
  EXPECT_EQ(happened, "c");
  dispatch
      .newTimer(
          queue, 1h, 0h, [] {}, [this] { note('d'); })
      .reset();
  EXPECT_EQ(happened, "cd") << "also when it is let go of";
}

TEST_F(StillDispatchTest, concurrentJobsRunAtOnceToo) {
  dispatch.newConcurrentQueue("side by side", QualityOfService::Default)->async([this] { note('a'); });
  EXPECT_EQ(happened, "a");
}

}  // namespace
}  // namespace telvane::testing
