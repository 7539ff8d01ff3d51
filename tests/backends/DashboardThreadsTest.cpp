// Dashboard backends on real threads and sockets: sessions that send as fast as they can, acknowledgements that come
// from everywhere at once, and ends in the midst of it.
#include <atomic>
#include <filesystem>
#include <functional>
#include <thread>

#include "platform/datagram/DatagramServer.h"
#include "platform/datagram/SystemDatagramSockets.h"
#include "platform/dispatch/SystemClock.h"
#include "platform/dispatch/ThreadedDispatch.h"
#include "tests/backends/DashboardFixture.h"
#include "tests/support/PlatformWith.h"

namespace telvane::testing {
namespace {

constexpr int kBackends = 4;
constexpr int kEvents = 500;
constexpr auto kPatience = std::chrono::seconds(30);

size_t descriptorCount() {
  size_t count = 0;
  for ([[maybe_unused]] const auto& entry : std::filesystem::directory_iterator("/proc/self/fd")) ++count;
  return count;
}

bool eventually(const std::function<bool()>& condition) {
  const auto deadline = std::chrono::steady_clock::now() + kPatience;
  while (!condition()) {
    if (std::chrono::steady_clock::now() > deadline) return false;
    std::this_thread::yield();
  }
  return true;
}

// The fixture's platform, on threads and with the system's sockets, and a dashboard that loses every third datagram.
class DashboardThreadsTest : public DashboardFixture {
 protected:
  DashboardThreadsTest() {
    auto server = DatagramServer::start(
        {{127, 0, 0, 1}, 0},
        [this](const DatagramServer& self, std::span<const uint8_t> datagram, const IPv4SocketAddress& peer) {
          if (++_arrived % 3 != 0) self.send(peer, datagram.first(62));
        });
    _server = std::move(*server);
    _profile = Dictionary{{kProfileIP, "127.0.0.1"}, {kProfilePort, _server->address().port}, {kProfileReliable, 10}};
    // The loop of the read sources keeps two descriptors from its start on.
    threadedBackend()->cleanup();
    EXPECT_TRUE(eventually([this] { return transactions().open() == 0; }));
  }
  std::shared_ptr<TelvaneBackend> threadedBackend() {
    return TelvaneBackend::newBackendWithName(_threadedContext, "dashboard", _profile, String("Box"), 6);
  }
  const CountingTransactions& transactions() { return _process.transactions(); }
  // Runs the job side by side on as many threads as there are backends, and waits for all.
  void sideBySide(const std::function<void()>& job) {
    const auto queue = _dispatch.newConcurrentQueue("sessions", QualityOfService::Default);
    const auto done = _dispatch.newSemaphore(0);
    for (int n = 0; n < kBackends; ++n) {
      queue->async([&job, done] {
        job();
        done->signal();
      });
    }
    for (int n = 0; n < kBackends; ++n) ASSERT_TRUE(done->waitFor(std::chrono::seconds(60)));
  }
  void sendAll(TelvaneBackend& backend) {
    for (int n = 0; n < kEvents; ++n) {
      EXPECT_TRUE(backend.sendMessage({{Key("n"), n}}, _clock.now(), 7, 2, 0).has_value());
    }
  }

  SystemClock _clock;
  RecordingLog _log;
  ThreadedDispatch _threads;
  Dispatch& _dispatch = _threads;
  SystemDatagramSockets _sockets;
  Platform _threaded = platformWith(_process.platform(), _clock, _log, _threads, _sockets);
  ProcessContext _threadedContext{_threaded};
  std::atomic<int> _arrived{0};
  std::unique_ptr<DatagramServer> _server;
};

TEST_F(DashboardThreadsTest, sessionsSideBySideCloseAllTheirSocketsWhenTheyAreThrough) {
  const size_t before = descriptorCount();
  sideBySide([this] {
    const auto backend = threadedBackend();
    ASSERT_NE(backend, nullptr);
    sendAll(*backend);
    backend->cleanup();
  });
  EXPECT_TRUE(eventually([this, before] { return descriptorCount() <= before && transactions().open() == 0; }));
  EXPECT_EQ(transactions().begun(), kBackends * kEvents);
  EXPECT_EQ(transactions().surplusEnds(), 0);
  EXPECT_GT(_arrived, kBackends * 50);
}

TEST_F(DashboardThreadsTest, sessionsThatAreForgottenCloseTheirsToo) {
  const size_t before = descriptorCount();
  sideBySide([this] {
    for (int round = 0; round < 20; ++round) {
      const auto backend = threadedBackend();
      ASSERT_NE(backend, nullptr);
      for (int n = 0; n < 10; ++n) backend->sendMessage({{Key("n"), n}}, _clock.now(), 7, 2, 0);
    }
  });
  EXPECT_TRUE(eventually([this, before] { return descriptorCount() <= before && transactions().open() == 0; }));
  EXPECT_EQ(transactions().surplusEnds(), 0);
}

}  // namespace
}  // namespace telvane::testing
