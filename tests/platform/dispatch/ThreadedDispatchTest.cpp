#include "platform/dispatch/ThreadedDispatch.h"

#include <gtest/gtest.h>
#include <sys/wait.h>
#include <unistd.h>

#include <atomic>

#include "tests/platform/dispatch/Waiting.h"

namespace telvane::testing {
namespace {

using namespace std::chrono_literals;

TEST(ThreadedDispatchTest, runsAllJobsThatWereGivenBeforeItEnds) {
  std::atomic<int> runs{0};
  {
    ThreadedDispatch dispatch;
    const auto first = dispatch.newSerialQueue("first", QualityOfService::Default);
    const auto second = dispatch.newSerialQueue("second", QualityOfService::Utility);
    const auto concurrent = dispatch.newConcurrentQueue("concurrent", QualityOfService::UserInitiated);
    for (int i = 0; i < 1000; ++i) {
      first->async([&runs, second] { second->async([&runs] { ++runs; }); });
      concurrent->async([&runs] { ++runs; });
    }
  }
  EXPECT_EQ(runs, 2000);
}

TEST(ThreadedDispatchTest, dropsWhatIsNotDueWhenItEnds) {
  std::atomic<int> runs{0};
  const auto captured = std::make_shared<int>(0);
  {
    ThreadedDispatch dispatch;
    const auto queue = dispatch.newSerialQueue("queue", QualityOfService::Default);
    queue->asyncAfter(1h, [&runs, captured] { ++runs; });
    // A job that runs while everything ends may still ask for a later one.
    queue->async([&runs, queue] { queue->asyncAfter(1h, [&runs] { ++runs; }); });
  }
  EXPECT_EQ(runs, 0);
  EXPECT_EQ(captured.use_count(), 1) << "the delayed job has leaked";
}

TEST(ThreadedDispatchTest, runsJobsOfAConcurrentQueueSideBySide) {
  ThreadedDispatch dispatch;
  const auto queue = dispatch.newConcurrentQueue("concurrent", QualityOfService::Default);
  const auto first = dispatch.newSemaphore(0);
  const auto second = dispatch.newSemaphore(0);
  const auto met = dispatch.newSemaphore(0);
  queue->async([=] {
    first->signal();
    if (second->waitFor(kDeadline)) met->signal();
  });
  queue->async([=] {
    second->signal();
    if (first->waitFor(kDeadline)) met->signal();
  });
  EXPECT_TRUE(met->waitFor(kDeadline));
  EXPECT_TRUE(met->waitFor(kDeadline));
}

// Each job of a hundred queues holds its thread until the job of the next one has run.
TEST(ThreadedDispatchTest, makesProgressThoughMoreQueuesWaitForEachOtherThanThereAreCores) {
  constexpr int kQueues = 100;
  ThreadedDispatch dispatch;
  std::vector<std::shared_ptr<SerialQueue>> queues;
  for (int i = 0; i < kQueues; ++i) {
    queues.push_back(dispatch.newSerialQueue("queue " + std::to_string(i), QualityOfService::Default));
  }
  int depth = 0;
  std::function<void(int)> goDeeper = [&](int level) {
    ++depth;
    if (level + 1 == kQueues) return;
    const auto done = dispatch.newSemaphore(0);
    queues[level + 1]->async([&, level] {
      goDeeper(level + 1);
      done->signal();
    });
    done->wait();
  };
  queues[0]->async([&] { goDeeper(0); });
  ASSERT_TRUE(drain(dispatch, *queues[0]));
  EXPECT_EQ(depth, kQueues);
}

// A host forks: its child has none of the threads, leaves the object alone and must be able to end.
TEST(ThreadedDispatchTest, mayBeLeakedByTheChildOfAFork) {
  ThreadedDispatch dispatch;
  const auto queue = dispatch.newSerialQueue("queue", QualityOfService::Default);
  ASSERT_TRUE(drain(dispatch, *queue));
  const pid_t child = fork();
  if (child == 0) _exit(7);
  int status = 0;
  ASSERT_EQ(waitpid(child, &status, 0), child);
  EXPECT_TRUE(WIFEXITED(status) && WEXITSTATUS(status) == 7) << "status " << status;
  EXPECT_TRUE(drain(dispatch, *queue)) << "the parent's queues stand still";
}

}  // namespace
}  // namespace telvane::testing
