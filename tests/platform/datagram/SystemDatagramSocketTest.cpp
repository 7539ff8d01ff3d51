#include <gtest/gtest.h>
#include <sys/resource.h>

#include <atomic>
#include <cerrno>
#include <filesystem>
#include <string>
#include <vector>

#include "platform/Mutex.h"
#include "platform/datagram/DatagramServer.h"
#include "platform/datagram/SystemDatagramSockets.h"
#include "platform/dispatch/ThreadedDispatch.h"
#include "tests/platform/dispatch/Waiting.h"

namespace telvane::testing {
namespace {

size_t threadCount() {
  size_t count = 0;
  for ([[maybe_unused]] const auto& entry : std::filesystem::directory_iterator("/proc/self/task")) ++count;
  return count;
}

size_t descriptorCount() {
  size_t count = 0;
  for ([[maybe_unused]] const auto& entry : std::filesystem::directory_iterator("/proc/self/fd")) ++count;
  return count;
}

// A connected socket, the server that it talks to, and the queue that hears of what comes.
class SystemDatagramSocketTest : public ::testing::Test {
 protected:
  SystemDatagramSocketTest() {
    auto server = DatagramServer::start(
        {{127, 0, 0, 1}, 0},
        [this](const DatagramServer&, std::span<const uint8_t> datagram, const IPv4SocketAddress& peer) {
          MutexLock lock(_mutex);
          _peer = peer;
          _datagrams.emplace_back(datagram.begin(), datagram.end());
        });
    _server = std::move(*server);
    _socket = newSocket();
    EXPECT_TRUE(_socket->bind().has_value());
    EXPECT_TRUE(_socket->connect(_server->address()).has_value());
  }
  std::unique_ptr<DatagramSocket> newSocket() { return *_sockets.newSocket(); }
  static Result<size_t> send(DatagramSocket& socket, const std::string& text) {
    return socket.send(reinterpret_cast<const uint8_t*>(text.data()), text.size());
  }
  static Result<size_t> receive(DatagramSocket& socket) {
    uint8_t byte = 0;
    return socket.receive(&byte, 1);
  }
  bool hasArrived(size_t count) {
    return eventually([this, count] {
      MutexLock lock(_mutex);
      return _datagrams.size() >= count;
    });
  }
  // Lets the server know the socket's address.
  void introduce() {
    ASSERT_TRUE(send(*_socket, "hello").has_value());
    ASSERT_TRUE(hasArrived(1));
  }
  void answer(const std::string& text, int times = 1) {
    MutexLock lock(_mutex);
    for (int n = 0; n < times; ++n) {
      _server->send(_peer, {reinterpret_cast<const uint8_t*>(text.data()), text.size()});
    }
  }

  ThreadedDispatch _threads;
  Dispatch& _dispatch = _threads;
  const std::shared_ptr<SerialQueue> _queue = _dispatch.newSerialQueue("reader");
  SystemDatagramSockets _sockets;
  std::unique_ptr<DatagramSocket> _socket;
  Mutex _mutex;
  IPv4SocketAddress _peer GUARDED_BY(_mutex);
  std::vector<std::string> _datagrams GUARDED_BY(_mutex);
  std::unique_ptr<DatagramServer> _server;  // last, so that it ends first: its thread writes what is above
};

TEST_F(SystemDatagramSocketTest, sendsWholeDatagrams) {
  const std::string longest(1087, 'x');
  for (const std::string& text : {std::string("text"), std::string(), longest}) {
    const auto sent = send(*_socket, text);
    ASSERT_TRUE(sent.has_value());
    EXPECT_EQ(*sent, text.size());
  }
  ASSERT_TRUE(hasArrived(3));
  MutexLock lock(_mutex);
  EXPECT_EQ(_datagrams, (std::vector<std::string>{"text", "", longest}));
}

TEST_F(SystemDatagramSocketTest, neverWaits) {
  EXPECT_EQ(receive(*_socket).error().code(), EAGAIN);
  const auto unconnected = newSocket();
  EXPECT_TRUE(send(*unconnected, "to nobody").has_error());
}

TEST_F(SystemDatagramSocketTest, saysWhatASystemRefuses) {
  const auto socket = newSocket();
  EXPECT_EQ(socket->connect({{255, 255, 255, 255}, 9}).error().code(), EACCES) << "no broadcasts";
  EXPECT_EQ(send(*_socket, std::string(70'000, 'x')).error().code(), EMSGSIZE);
}

TEST_F(SystemDatagramSocketTest, tellsThatNobodyListensOnceAndGoesOn) {
  const IPv4SocketAddress address = _server->address();
  _server.reset();
  ASSERT_TRUE(send(*_socket, "nobody").has_value());
  ASSERT_TRUE(eventually([this] {
    const auto received = receive(*_socket);
    return received.has_error() && received.error().code() == ECONNREFUSED;
  }));
  EXPECT_EQ(receive(*_socket).error().code(), EAGAIN);
  EXPECT_EQ(_socket->connect(address).has_value(), true);
}

TEST_F(SystemDatagramSocketTest, startsNoThreadBeforeTheFirstReadSource) {
  ASSERT_TRUE(drain(_dispatch, *_queue));  // the pool's worker is there
  const size_t before = threadCount();
  const auto socket = newSocket();
  EXPECT_EQ(threadCount(), before);
  const auto source = socket->newReadSource(_queue, [] {}, {});
  ASSERT_NE(source, nullptr);
  EXPECT_EQ(threadCount(), before + 1);
  const auto second = _socket->newReadSource(_queue, [] {}, {});
  EXPECT_EQ(threadCount(), before + 1);
}

TEST_F(SystemDatagramSocketTest, aHandlerThatTakesOneEachTimeSeesAll) {
  introduce();
  constexpr int kCount = 100;
  std::atomic<int> taken{0};
  std::atomic<int> calls{0};
  std::atomic<bool> isOnQueue{true};
  answer("before", kCount);  // also what came before the source
  const auto source = _socket->newReadSource(_queue,
                                             [this, &taken, &calls, &isOnQueue] {
                                               ++calls;
                                               if (!_queue->isCurrent()) isOnQueue = false;
                                               if (receive(*_socket).has_value()) ++taken;
                                             },
                                             {});
  ASSERT_TRUE(eventually([&taken] { return taken == kCount; }));
  answer("after", kCount);
  ASSERT_TRUE(eventually([&taken] { return taken == 2 * kCount; }));
  EXPECT_TRUE(isOnQueue);
  EXPECT_EQ(calls, 2 * kCount) << "no call without a datagram";
  source->cancel();
  EXPECT_TRUE(drain(_dispatch, *_queue));
}

TEST_F(SystemDatagramSocketTest, tellsOfErrorsToo) {
  std::atomic<int> refused{0};
  _server.reset();
  const auto source = _socket->newReadSource(_queue,
                                             [this, &refused] {
                                               const auto received = receive(*_socket);
                                               if (received.has_error() && received.error().code() == ECONNREFUSED)
                                                 ++refused;
                                             },
                                             {});
  for (int n = 1; n <= 3; ++n) {
    ASSERT_TRUE(send(*_socket, "nobody").has_value());
    ASSERT_TRUE(eventually([&refused, n] { return refused == n; }));
  }
  source->cancel();
  EXPECT_TRUE(drain(_dispatch, *_queue));
}

TEST_F(SystemDatagramSocketTest, isSilentBehindACancelAndRunsTheHandlerOnce) {
  introduce();
  std::atomic<int> cancelled{0};
  std::atomic<int> calls{0};
  std::unique_ptr<ReadSource> source;
  _queue->sync([this, &source, &calls, &cancelled] {
    source = _socket->newReadSource(
        _queue, [&calls] { ++calls; }, [&cancelled] { ++cancelled; });
    answer("unheard");
    source->cancel();
    source->cancel();
  });
  ASSERT_TRUE(eventually([&cancelled] { return cancelled == 1; }));
  source.reset();
  answer("unheard");
  EXPECT_TRUE(drain(_dispatch, *_queue));
  EXPECT_EQ(calls, 0);
  EXPECT_EQ(cancelled, 1);
}

TEST_F(SystemDatagramSocketTest, aHandlerMayCancelItsOwnSource) {
  introduce();
  std::atomic<int> calls{0};
  std::atomic<bool> isCancelled{false};
  std::unique_ptr<ReadSource> source;
  _queue->sync([this, &source, &calls, &isCancelled] {
    source = _socket->newReadSource(
        _queue,
        [&calls, &source] {
          ++calls;
          source.reset();
        },
        [&isCancelled] { isCancelled = true; });
  });
  answer("first", 3);
  ASSERT_TRUE(eventually([&isCancelled] { return isCancelled.load(); }));
  EXPECT_EQ(calls, 1);
}

TEST_F(SystemDatagramSocketTest, closesNothingTooEarlyWhenManySourcesComeAndGo) {
  introduce();
  const size_t before = descriptorCount();
  std::atomic<int> ended{0};
  constexpr int kRounds = 200;
  for (int round = 0; round < kRounds; ++round) {
    std::shared_ptr<DatagramSocket> socket = newSocket();
    ASSERT_TRUE(socket->bind().has_value());
    ASSERT_TRUE(socket->connect(_server->address()).has_value());
    auto source = socket->newReadSource(
        _queue, [socket] { EXPECT_TRUE(receive(*socket).has_error()); }, [socket, &ended] { ++ended; });
    ASSERT_NE(source, nullptr);
    EXPECT_TRUE(send(*socket, "x").has_value());
  }
  ASSERT_TRUE(eventually([&ended] { return ended == kRounds; }));
  EXPECT_TRUE(drain(_dispatch, *_queue));
  EXPECT_LE(descriptorCount(), before + 2) << "the loop's own two";
}

TEST_F(SystemDatagramSocketTest, makesNoSocketWithoutDescriptors) {
#ifdef __SANITIZE_ADDRESS__
  GTEST_SKIP() << "the sanitizers need descriptors of their own when they meet a type for the first time";
#endif
  rlimit limit{};
  ASSERT_EQ(getrlimit(RLIMIT_NOFILE, &limit), 0);
  rlimit none = limit;
  none.rlim_cur = 0;
  ASSERT_EQ(setrlimit(RLIMIT_NOFILE, &none), 0);
  const auto socket = _sockets.newSocket();
  const auto source = _socket->newReadSource(_queue, [] {}, {});
  ASSERT_EQ(setrlimit(RLIMIT_NOFILE, &limit), 0);
  EXPECT_EQ(source, nullptr);
  ASSERT_TRUE(socket.has_error());
  EXPECT_EQ(socket.error().code(), EMFILE);
  EXPECT_NE(_socket->newReadSource(_queue, [] {}, {}), nullptr) << "later again";
  EXPECT_TRUE(drain(_dispatch, *_queue));
}

}  // namespace
}  // namespace telvane::testing
