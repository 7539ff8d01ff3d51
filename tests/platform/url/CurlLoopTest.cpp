#include "platform/url/CurlLoop.h"

#include <dirent.h>
#include <gtest/gtest.h>
#include <sys/syscall.h>
#include <unistd.h>

#include <algorithm>
#include <atomic>
#include <chrono>
#include <condition_variable>
#include <csignal>
#include <fstream>
#include <functional>
#include <mutex>
#include <sstream>
#include <string>
#include <thread>
#include <vector>

#include "tests/platform/url/URLSessionFixture.h"

namespace telvane::testing {

namespace {

// The thread of this process with that name; empty when there is none.
std::string threadNamed(const std::string& name) {
  std::string found;
  DIR* threads = opendir("/proc/self/task");
  while (const dirent* entry = readdir(threads)) {
    std::string comm;
    std::ifstream("/proc/self/task/" + std::string(entry->d_name) + "/comm") >> comm;
    if (comm == name) found = entry->d_name;
  }
  closedir(threads);
  return found;
}

// What the thread waits in: the number of the system call and its fourth argument, the time-out of epoll_wait.
struct Wait {
  std::string call;
  std::string fourth;
};

Wait waitOf(const std::string& thread) {
  std::ifstream file("/proc/self/task/" + thread + "/syscall");
  std::string line;
  std::getline(file, line);
  std::istringstream words(line);
  Wait wait;
  std::string skipped;
  words >> wait.call >> skipped >> skipped >> skipped >> wait.fourth;
  return wait;
}

bool sleepsForever(const std::string& thread) {
  const Wait wait = waitOf(thread);
  return wait.fourth == "0xffffffff" || wait.fourth == "0xffffffffffffffff";
}

bool comesTrue(const std::function<bool()>& condition) {
  const auto deadline = std::chrono::steady_clock::now() + std::chrono::seconds(30);
  while (!condition()) {
    if (std::chrono::steady_clock::now() > deadline) return false;
    std::this_thread::yield();
  }
  return true;
}

}  // namespace

class CurlLoopTest : public URLSessionFixture {};

TEST_F(CurlLoopTest, makesNoThreadBeforeThereIsWork) {
  session();
  EXPECT_EQ(threadNamed("telvane-url"), "");
}

TEST_F(CurlLoopTest, sleepsWithoutATimeoutWhenOnlyKeptConnectionsAreLeft) {
  _handler = [](const Server::Request&, const std::shared_ptr<Server::Responder>& responder) { responder->send({}); };
  get();
  const std::string thread = threadNamed("telvane-url");
  ASSERT_NE(thread, "");
  if (waitOf(thread).call.empty()) GTEST_SKIP() << "the system does not tell what a thread waits in";
  EXPECT_TRUE(comesTrue([&] { return sleepsForever(thread); })) << "waits in " << waitOf(thread).fourth;
}

TEST_F(CurlLoopTest, runsJobsInOrderFromManyThreads) {
  CurlLoop loop;
  constexpr int kThreads = 4;
  constexpr int kJobs = 2000;
  std::vector<std::vector<int>> ran(kThreads);
  std::vector<std::thread> threads;
  threads.reserve(kThreads);
  for (int t = 0; t < kThreads; ++t) {
    threads.emplace_back([&loop, &ran, t] {
      for (int i = 0; i < kJobs; ++i) loop.post([&ran, t, i] { ran[static_cast<size_t>(t)].push_back(i); });
    });
  }
  for (std::thread& thread : threads) thread.join();
  loop.stop();
  for (const std::vector<int>& jobs : ran) {
    ASSERT_EQ(jobs.size(), static_cast<size_t>(kJobs));
    EXPECT_TRUE(std::is_sorted(jobs.begin(), jobs.end()));
  }
}

TEST_F(CurlLoopTest, dropsJobsAfterItsEnd) {
  CurlLoop loop;
  loop.stop();
  bool ran = false;
  loop.post([&ran] { ran = true; });
  loop.stop();
  EXPECT_FALSE(ran);
}

TEST_F(CurlLoopTest, blocksSignalsOnItsThread) {
  CurlLoop loop;
  sigset_t blocked;
  sigemptyset(&blocked);
  loop.post([&blocked] { pthread_sigmask(SIG_BLOCK, nullptr, &blocked); });
  loop.stop();
  for (const int signal : {SIGPIPE, SIGTERM, SIGINT, SIGCHLD, SIGALRM}) EXPECT_EQ(sigismember(&blocked, signal), 1);
}

namespace {

class CountingMember final : public CurlLoop::Member {
 public:
  void socketReady(int, int) override { ++_sockets; }
  void timerFired() override { ++_timers; }
  void turnEnded() override { ++_turns; }
  void loopEnded() override { ++_ends; }
  int _sockets = 0;
  int _timers = 0;
  int _turns = 0;
  int _ends = 0;
};

}  // namespace

TEST_F(CurlLoopTest, endsATurnOnceForAllThatHappenedInIt) {
  CurlLoop loop;
  const auto member = std::make_shared<CountingMember>();
  loop.post([&] {
    loop.join(member);
    for (int i = 0; i < 10; ++i) loop.noteChanged(*member);
  });
  loop.stop();
  EXPECT_EQ(member->_turns, 1);
  EXPECT_EQ(member->_ends, 1);
  EXPECT_EQ(member.use_count(), 1);
}

TEST_F(CurlLoopTest, firesATimerOnceAndForgetsOneThatWasTakenAway) {
  CurlLoop loop;
  const auto fires = std::make_shared<CountingMember>();
  const auto doesNot = std::make_shared<CountingMember>();
  std::atomic<bool> isDone = false;
  loop.post([&] {
    loop.join(fires);
    loop.join(doesNot);
    loop.setTimer(*doesNot, std::chrono::milliseconds(0));
    loop.setTimer(*doesNot, std::nullopt);
    loop.setTimer(*fires, std::chrono::milliseconds(1));
  });
  EXPECT_TRUE(comesTrue([&] {
    loop.post([&] { isDone = fires->_timers > 0; });
    return isDone.load();
  }));
  loop.stop();
  EXPECT_EQ(fires->_timers, 1);
  EXPECT_EQ(doesNot->_timers, 0);
}

TEST_F(CurlLoopTest, letsAMemberGoWhenItLeaves) {
  CurlLoop loop;
  const auto member = std::make_shared<CountingMember>();
  loop.post([&] {
    loop.join(member);
    loop.leave(*member);
  });
  loop.post([] {});
  loop.stop();
  EXPECT_EQ(member->_ends, 0);
  EXPECT_EQ(member.use_count(), 1);
}

TEST_F(CurlLoopTest, tellsOfASocketWhileItIsWatched) {
  CurlLoop loop;
  int pipeEnds[2];
  ASSERT_EQ(pipe(pipeEnds), 0);
  const auto member = std::make_shared<CountingMember>();
  std::atomic<int> sockets = 0;
  loop.post([&] {
    loop.join(member);
    loop.watch(pipeEnds[0], 1, *member);
  });
  ASSERT_EQ(write(pipeEnds[1], "x", 1), 1);
  EXPECT_TRUE(comesTrue([&] {
    loop.post([&] { sockets = member->_sockets; });
    return sockets > 0;
  }));
  loop.post([&] {
    loop.unwatch(pipeEnds[0]);
    member->_sockets = 0;
  });
  loop.post([] {});
  loop.stop();
  EXPECT_EQ(member->_sockets, 0);
  close(pipeEnds[0]);
  close(pipeEnds[1]);
}

}  // namespace telvane::testing
