#include "platform/dispatch/WorkerPool.h"

#include <gtest/gtest.h>
#include <pthread.h>

#include <csignal>
#include <functional>
#include <future>
#include <thread>
#include <vector>

#include "platform/dispatch/ThreadedSemaphore.h"
#include "tests/platform/dispatch/Waiting.h"

namespace telvane::testing {
namespace {

using namespace std::chrono_literals;

TEST(WorkerPoolTest, startsNoThreadBeforeTheFirstJob) {
  WorkerPool pool;
  EXPECT_EQ(pool.workerCount(), 0u);
}

TEST(WorkerPoolTest, makesProgressWithMoreAnnouncedWaitsThanCores) {
  constexpr unsigned kJobs = 100;
  WorkerPool pool;
  const auto mayGoOn = std::make_shared<ThreadedSemaphore>(0);
  const auto done = std::make_shared<ThreadedSemaphore>(0);
  for (unsigned i = 0; i < kJobs; ++i) {
    pool.submit([=] {
      mayGoOn->wait();
      done->signal();
    });
  }
  pool.submit([=] {
    for (unsigned i = 0; i < kJobs; ++i) mayGoOn->signal();
  });
  for (unsigned i = 0; i < kJobs; ++i) ASSERT_TRUE(done->waitFor(kDeadline)) << "after " << i << " jobs";
}

TEST(WorkerPoolTest, makesProgressWithMoreWaitsThatNobodyAnnouncedThanCores) {
  constexpr unsigned kJobs = 40;
  WorkerPool pool;
  std::promise<void> mayGoOn;
  const std::shared_future<void> opened = mayGoOn.get_future().share();
  const auto done = std::make_shared<ThreadedSemaphore>(0);
  for (unsigned i = 0; i < kJobs; ++i) {
    pool.submit([=] {
      opened.wait();
      done->signal();
    });
  }
  pool.submit([&mayGoOn] { mayGoOn.set_value(); });
  for (unsigned i = 0; i < kJobs; ++i) ASSERT_TRUE(done->waitFor(kDeadline)) << "after " << i << " jobs";
}

// A job that a running job submits is left for the same worker, which may never come to it.
TEST(WorkerPoolTest, runsAJobThatTheSubmittingJobWaitsForWithoutSayingSo) {
  WorkerPool pool;
  const auto done = std::make_shared<ThreadedSemaphore>(0);
  pool.submit([&pool, done] {
    std::promise<void> inner;
    pool.submit([&inner] { inner.set_value(); });
    inner.get_future().wait();
    done->signal();
  });
  EXPECT_TRUE(done->waitFor(kDeadline));
}

TEST(WorkerPoolTest, runsAJobThatTheSubmittingJobAnnouncesToWaitFor) {
  WorkerPool pool;
  const auto done = std::make_shared<ThreadedSemaphore>(0);
  pool.submit([&pool, done] {
    const auto inner = std::make_shared<ThreadedSemaphore>(0);
    pool.submit([inner] { inner->signal(); });
    inner->wait();
    done->signal();
  });
  EXPECT_TRUE(done->waitFor(kDeadline));
}

TEST(WorkerPoolTest, runsAChainOfJobsThatHandOverToOneAnother) {
  constexpr int kLinks = 1000;
  WorkerPool pool;
  const auto done = std::make_shared<ThreadedSemaphore>(0);
  int left = kLinks;  // each link runs after the one before it
  std::function<void()> link = [&] {
    if (--left == 0) {
      done->signal();
    } else {
      pool.submit([&link] { link(); });
    }
  };
  pool.submit([&link] { link(); });
  EXPECT_TRUE(done->waitFor(kDeadline)) << left << " links are left";
}

TEST(WorkerPoolTest, hasNoMoreThreadsThanAllowedAndRefusesNoJob) {
  WorkerPool pool({.concurrency = 2, .maximumWorkers = 3});
  const auto mayGoOn = std::make_shared<ThreadedSemaphore>(0);
  const auto started = std::make_shared<ThreadedSemaphore>(0);
  const auto done = std::make_shared<ThreadedSemaphore>(0);
  const auto submit = [&] {
    pool.submit([=] {
      started->signal();
      mayGoOn->wait();
      done->signal();
    });
  };
  for (int i = 0; i < 10; ++i) submit();
  for (int i = 0; i < 3; ++i) ASSERT_TRUE(started->waitFor(kDeadline)) << "the third worker comes for the blocked ones";
  // With every worker in a job that waits, whoever submits brings in one more, if there may be one.
  submit();
  EXPECT_EQ(pool.workerCount(), 3u);
  for (int i = 0; i < 11; ++i) mayGoOn->signal();
  for (int i = 0; i < 11; ++i) ASSERT_TRUE(done->waitFor(kDeadline)) << "after " << i << " jobs";
}

// A worker that had been woken and was still on its way was once taken for the one that stalls the others, and then
// belonged to no state that it knew.
TEST(WorkerPoolTest, losesNoJobWhileStallsAndWakeUpsMix) {
  constexpr int kProducers = 4;
  constexpr int kJobs = 300;
  std::atomic<int> runs{0};
  WorkerPool pool({.concurrency = 2, .idleTime = 1ms});
  const auto stall = [] {
    const auto end = std::chrono::steady_clock::now() + WorkerPool::kStallTime * 3 / 2;
    while (std::chrono::steady_clock::now() < end) {
    }
  };
  std::vector<std::thread> producers;
  for (int producer = 0; producer < kProducers; ++producer) {
    producers.emplace_back([&] {
      for (int job = 0; job < kJobs; ++job) {
        pool.submit([&, job] {
          if (job % 16 == 0) stall();
          ++runs;
        });
        if (job % 16 == 0) eventually([&] { return !pool.hasWaitingJobs(); });
      }
    });
  }
  for (std::thread& producer : producers) producer.join();
  EXPECT_TRUE(eventually([&] { return runs == kProducers * kJobs; })) << runs << " jobs have run";
}

TEST(WorkerPoolTest, shrinksToTheKeptWorkersAndGrowsAgain) {
  WorkerPool pool({.keptWorkers = 1, .idleTime = 1ms});
  for (int round = 0; round < 3; ++round) {
    const auto started = std::make_shared<ThreadedSemaphore>(0);
    const auto mayGoOn = std::make_shared<ThreadedSemaphore>(0);
    for (int i = 0; i < 8; ++i) {
      pool.submit([=] {
        started->signal();
        mayGoOn->wait();
      });
    }
    for (int i = 0; i < 8; ++i) ASSERT_TRUE(started->waitFor(kDeadline));
    EXPECT_GE(pool.workerCount(), 8u);
    for (int i = 0; i < 8; ++i) mayGoOn->signal();
    EXPECT_TRUE(eventually([&] { return pool.workerCount() == 1; })) << "has " << pool.workerCount() << " workers";
  }
}

TEST(WorkerPoolTest, mayEndAllWorkersWhenNoneIsKept) {
  WorkerPool pool({.keptWorkers = 0, .idleTime = 1ms});
  for (int round = 0; round < 3; ++round) {
    const auto done = std::make_shared<ThreadedSemaphore>(0);
    pool.submit([=] { done->signal(); });
    ASSERT_TRUE(done->waitFor(kDeadline));
    EXPECT_TRUE(eventually([&] { return pool.workerCount() == 0; })) << "has " << pool.workerCount() << " workers";
  }
}

TEST(WorkerPoolTest, namesItsWorkersAndBlocksSignalsInThem) {
  sigset_t before;
  pthread_sigmask(SIG_SETMASK, nullptr, &before);
  WorkerPool pool;
  sigset_t inWorker;
  char name[16] = "";
  const auto done = std::make_shared<ThreadedSemaphore>(0);
  pool.submit([&] {
    pthread_sigmask(SIG_SETMASK, nullptr, &inWorker);
    pthread_getname_np(pthread_self(), name, sizeof name);
    done->signal();
  });
  ASSERT_TRUE(done->waitFor(kDeadline));
  EXPECT_STREQ(name, "telvane-worker");
  for (int signal : {SIGPIPE, SIGTERM, SIGINT, SIGCHLD, SIGALRM, SIGUSR1}) {
    EXPECT_EQ(sigismember(&inWorker, signal), 1) << "signal " << signal << " is not blocked in the worker";
  }
  EXPECT_EQ(sigismember(&inWorker, SIGSEGV), 0) << "a fault must reach the crash handler";
  sigset_t after;
  pthread_sigmask(SIG_SETMASK, nullptr, &after);
  for (int signal : {SIGPIPE, SIGTERM}) {
    EXPECT_EQ(sigismember(&after, signal), sigismember(&before, signal)) << "the caller's mask has changed";
  }
}

TEST(WorkerPoolTest, runsAllItWasGivenAndWhatThatGivesBeforeItEnds) {
  std::atomic<int> runs{0};
  {
    WorkerPool pool;
    for (int i = 0; i < 100; ++i) {
      pool.submit([&] {
        pool.submit([&] { ++runs; });
        ++runs;
      });
    }
  }
  EXPECT_EQ(runs, 200);
}

TEST(WorkerPoolTest, endsAlsoWithSleepingWorkers) {
  WorkerPool pool({.keptWorkers = 8});
  const auto meeting = std::make_shared<ThreadedSemaphore>(0);
  const auto met = std::make_shared<ThreadedSemaphore>(0);
  for (int i = 0; i < 4; ++i) {
    pool.submit([=] {
      met->signal();
      meeting->wait();
    });
  }
  for (int i = 0; i < 4; ++i) ASSERT_TRUE(met->waitFor(kDeadline));
  for (int i = 0; i < 4; ++i) meeting->signal();
}

TEST(WorkerPoolDeathTest, endsTheProcessWhenAnExceptionLeavesAJob) {
  GTEST_FLAG_SET(death_test_style, "threadsafe");
  EXPECT_DEATH(
      {
        WorkerPool pool;
        pool.submit([] { throw std::runtime_error("left a job"); });
      },
      "left a job");
}

}  // namespace
}  // namespace telvane::testing
