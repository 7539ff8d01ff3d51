#include <gmock/gmock.h>
#include <gtest/gtest.h>
#include <net/if.h>
#include <sched.h>
#include <sys/ioctl.h>
#include <sys/socket.h>
#include <unistd.h>

#include <atomic>
#include <chrono>
#include <condition_variable>
#include <mutex>
#include <thread>

#include "tests/platform/url/Peers.h"
#include "tests/platform/url/URLSessionFixture.h"
#include "tests/support/PassingDispatch.h"

namespace telvane::testing {

using namespace std::chrono_literals;
using ::testing::ElementsAre;

// Connecting to a multicast address fails everywhere for want of a route.
constexpr const char* kUnreachable = "http://224.0.0.1:9/";

// No name service knows a label of more than 63 characters, so none is asked.
std::string unresolvableURL() { return "http://" + std::string(64, 'a') + ".example/"; }

class FixedProbe final : public ConnectivityProbe {
 public:
  bool hasNetwork() override {
    ++_questions;
    return _hasNetwork;
  }
  std::atomic<bool> _hasNetwork = false;
  std::atomic<int> _questions = 0;
};

// Threads as ever, but timers fire when the test says so.
class TimerlessDispatch final : public PassingDispatch {
 public:
  using PassingDispatch::PassingDispatch;

  std::unique_ptr<Timer> newTimer(std::shared_ptr<SerialQueue> queue, std::chrono::nanoseconds delay,
                                  std::chrono::nanoseconds, Job onFire, Job) override {
    const std::lock_guard lock(_mutex);
    _delays.push_back(std::chrono::duration_cast<std::chrono::milliseconds>(delay));
    _pending = [queue = std::move(queue), job = std::move(onFire)]() mutable { queue->async(std::move(job)); };
    _changed.notify_all();
    return std::make_unique<NoTimer>();
  }

  // Waits for the next timer and fires it.
  void fireNext() {
    std::unique_lock lock(_mutex);
    ASSERT_TRUE(_changed.wait_for(lock, 30s, [this] { return static_cast<bool>(_pending); })) << "no timer was made";
    std::exchange(_pending, nullptr)();
  }
  std::vector<std::chrono::milliseconds> waitForDelays(size_t count) {
    std::unique_lock lock(_mutex);
    EXPECT_TRUE(_changed.wait_for(lock, 30s, [&] { return _delays.size() >= count; }));
    return _delays;
  }

 private:
  struct NoTimer final : Timer {
    void cancel() override {}
  };

  std::mutex _mutex;
  std::condition_variable _changed;
  std::vector<std::chrono::milliseconds> _delays;
  Job _pending;
};

class ConnectivityTest : public URLSessionFixture {
 protected:
  ConnectivityTest() {
    _configuration.waitsForConnectivity = true;
    _options.connectivityProbe = _probe;
  }
  const std::shared_ptr<FixedProbe> _probe = std::make_shared<FixedProbe>();
};

TEST_F(ConnectivityTest, waitsWithoutARouteUntilTheRequestsTimeIsOver) {
  _options.firstRetryDelay = 5ms;
  expectError(run({.url = kUnreachable, .timeout = 60ms}), URLErrorCode::TimedOut);
}

TEST_F(ConnectivityTest, waitsWithoutANameServiceUntilTheRequestsTimeIsOver) {
  _options.firstRetryDelay = 5ms;
  expectError(run({.url = unresolvableURL(), .timeout = 60ms}), URLErrorCode::TimedOut);
}

TEST_F(ConnectivityTest, waitsAtMostTheLongestTimeWithoutATimeoutOfItsOwn) {
  _options.firstRetryDelay = 5ms;
  _options.resourceTimeout = 60ms;
  expectError(run({.url = kUnreachable}), URLErrorCode::TimedOut);
}

TEST_F(ConnectivityTest, reportsTheWantOfARouteAtOnceWhenItDoesNotWait) {
  _configuration.waitsForConnectivity = false;
  expectError(run({.url = kUnreachable}), URLErrorCode::NotConnectedToNetwork);
  expectError(run({.url = unresolvableURL()}), URLErrorCode::CannotFindHost);
  EXPECT_EQ(_probe->_questions, 0);
}

TEST_F(ConnectivityTest, triesAgainLessAndLessOften) {
  TimerlessDispatch dispatch(_dispatch);
  _sessionDispatch = &dispatch;
  _options.firstRetryDelay = 1s;
  _options.longestRetryDelay = 5s;
  const auto task = start({.url = kUnreachable});
  for (int i = 0; i < 4; ++i) dispatch.fireNext();
  EXPECT_THAT(dispatch.waitForDelays(5), ElementsAre(1s, 2s, 4s, 5s, 5s));
  EXPECT_EQ(_probe->_questions, 4);
  dropSession();
  expectError(delegate().waitFor(task), URLErrorCode::Cancelled);
  dropProvider();
}

TEST_F(ConnectivityTest, neverWaitsBeyondTheRequestsTimeout) {
  TimerlessDispatch dispatch(_dispatch);
  _sessionDispatch = &dispatch;
  _options.firstRetryDelay = 3600s;
  const auto task = start({.url = kUnreachable, .timeout = 25s});
  const std::chrono::milliseconds delay = dispatch.waitForDelays(1).front();
  EXPECT_GT(delay, 0ms);
  EXPECT_LE(delay, 25s);
  dropSession();
  expectError(delegate().waitFor(task), URLErrorCode::Cancelled);
  dropProvider();
}

TEST_F(ConnectivityTest, holdsTheRequestInTheFlowGateWhileItWaits) {
  TimerlessDispatch dispatch(_dispatch);
  _sessionDispatch = &dispatch;
  const auto task = start(post(kUnreachable, "body"));
  dispatch.waitForDelays(1);
  EXPECT_EQ(_gate.bytes(), std::string_view(kUnreachable).size() + 4);
  dropSession();
  expectError(delegate().waitFor(task), URLErrorCode::Cancelled);
  EXPECT_EQ(_gate.bytes(), 0u);
  dropProvider();
}

TEST_F(ConnectivityTest, keepsWaitingTasksOfAnInvalidatedSession) {
  TimerlessDispatch dispatch(_dispatch);
  _sessionDispatch = &dispatch;
  const auto task = start({.url = kUnreachable});
  dispatch.waitForDelays(1);
  session().finishTasksAndInvalidate();
  dispatch.fireNext();
  dispatch.waitForDelays(2);
  EXPECT_FALSE(delegate().isInvalid());
  EXPECT_EQ(delegate().outcome(task.get()).completions, 0);
  dropProvider();
  EXPECT_TRUE(delegate().waitUntilInvalid());
}

// A network of its own, which the calling thread and those that it starts see alone; its only interface is down.
bool enterEmptyNetwork() { return unshare(CLONE_NEWNET) == 0; }

void bringUpLoopback() {
  const int control = socket(AF_INET, SOCK_DGRAM | SOCK_CLOEXEC, 0);
  ifreq request{};
  request.ifr_name[0] = 'l';
  request.ifr_name[1] = 'o';
  request.ifr_flags = IFF_UP | IFF_RUNNING;
  EXPECT_EQ(ioctl(control, SIOCSIFFLAGS, &request), 0);
  close(control);
}

TEST_F(ConnectivityTest, startsWhenThereIsANetwork) {
  TimerlessDispatch dispatch(_dispatch);
  _sessionDispatch = &dispatch;
  _serverOptions.host = "0.0.0.0";
  _handler = [](const Server::Request& request, const std::shared_ptr<Server::Responder>& responder) {
    responder->send({.body = request.body});
  };
  bool isAllowed = false;
  std::thread inside([&] {
    isAllowed = enterEmptyNetwork();
    if (!isAllowed) return;
    const auto task = start(post("https://127.0.0.1:" + std::to_string(server().port()) + "/", "at last"));
    dispatch.fireNext();
    EXPECT_EQ(dispatch.waitForDelays(2).size(), 2u) << "the probe tells of no network: not tried";
    bringUpLoopback();
    _probe->_hasNetwork = true;
    dispatch.fireNext();
    const TaskOutcome outcome = delegate().waitFor(task);
    EXPECT_FALSE(outcome.error.has_value()) << outcome.error->description();
    EXPECT_EQ(outcome.body(), "at last");
    EXPECT_EQ(server().acceptedConnections(), 1u);
  });
  inside.join();
  if (!isAllowed) GTEST_SKIP() << "making a network needs privileges";
  dropSession();
  dropProvider();
}

TEST(InterfaceConnectivityProbeTest, seesNoNetworkWhereThereIsOnlyALoopback) {
  bool isAllowed = false;
  bool hasNetwork = true;
  std::thread inside([&] {
    isAllowed = enterEmptyNetwork();
    if (!isAllowed) return;
    bringUpLoopback();
    hasNetwork = InterfaceConnectivityProbe().hasNetwork();
  });
  inside.join();
  if (!isAllowed) GTEST_SKIP() << "making a network needs privileges";
  EXPECT_FALSE(hasNetwork);
}

}  // namespace telvane::testing
