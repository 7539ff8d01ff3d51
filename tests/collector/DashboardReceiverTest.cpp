#include "collector/DashboardReceiver.h"

#include <gmock/gmock.h>

#include <set>

#include "backends/DashboardDatagram.h"
#include "platform/JSON.h"
#include "platform/Mutex.h"
#include "platform/datagram/SystemDatagramSockets.h"
#include "tests/platform/dispatch/Waiting.h"
#include "tests/support/Matchers.h"
#include "tests/support/ScratchFolder.h"

namespace telvane::testing {
namespace {

using ::testing::HasSubstr;

using Bytes = std::vector<uint8_t>;

// A real receiver, and a device of the test that sends to it.
class DashboardReceiverTest : public ::testing::Test {
 protected:
  DashboardReceiverTest() : _store(AppendFile::open(_scratch.at("events")).value()) {}

  void start(unsigned lossPercent = 0, uint64_t seed = 0) {
    auto receiver = DashboardReceiver::start({.address = {{127, 0, 0, 1}, 0},
                                              .lossPercent = lossPercent,
                                              .lossSeed = seed,
                                              .show =
                                                  [this](const std::string& line) {
                                                    MutexLock lock(_mutex);
                                                    _shown.push_back(line);
                                                  }},
                                             _store);
    ASSERT_TRUE(receiver.has_value());
    _receiver = std::move(*receiver);
    _socket = *_sockets.newSocket();
    ASSERT_TRUE(_socket->connect(_receiver->address()).has_value());
  }
  static Bytes datagram(uint16_t eventID, bool isReliable = true, const std::string& text = " k=v") {
    Bytes bytes(dashboard::kHeaderLength);
    dashboard::writeHeader({.sessionID = 4711, .method = 7, .eventID = eventID, .isReliable = isReliable}, text.size(),
                           bytes);
    bytes.insert(bytes.end(), text.begin(), text.end());
    return bytes;
  }
  void send(const Bytes& bytes) { ASSERT_TRUE(_socket->send(bytes.data(), bytes.size()).has_value()); }
  // The next datagram that has come; waits for it.
  Bytes answer() {
    Bytes bytes(2000);
    size_t length = 0;
    eventually([this, &bytes, &length] {
      const auto received = _socket->receive(bytes.data(), bytes.size());
      if (received.has_value()) length = *received;
      return received.has_value();
    });
    bytes.resize(length);
    return bytes;
  }
  bool counts(const char* name, int64_t count) {
    return eventually([this, name, count] { return count == _receiver->statistics()[name].integerValue(); });
  }
  std::vector<Dictionary> lines() const {
    std::vector<Dictionary> lines;
    const std::string text = _scratch.read("events");
    for (size_t start = 0, end; (end = text.find('\n', start)) != std::string::npos; start = end + 1) {
      lines.push_back(*json::parse(std::string_view(text).substr(start, end - start)).value().dictionary());
    }
    return lines;
  }

  ScratchFolder _scratch;
  EventStore _store;
  SystemDatagramSockets _sockets;
  Mutex _mutex;
  std::vector<std::string> _shown GUARDED_BY(_mutex);
  std::unique_ptr<DashboardReceiver> _receiver;
  std::unique_ptr<DatagramSocket> _socket;
};

TEST_F(DashboardReceiverTest, storesShowsAndAcknowledges) {
  start();
  send(datagram(258));
  const Bytes acknowledgement = answer();
  ASSERT_EQ(acknowledgement.size(), 62u);
  EXPECT_EQ(acknowledgement[60] << 8 | acknowledgement[61], 258);
  ASSERT_EQ(lines().size(), 1u);
  const Dictionary line = lines().front();
  EXPECT_EQ(line["dashboard"], Value(true));
  EXPECT_EQ(line["reliable"], Value(true));
  EXPECT_EQ(line["addressedByBag"], Value(true));
  EXPECT_THAT(line["peer"].text(), ::testing::StartsWith("127.0.0.1:"));
  EXPECT_EQ((*line["event"].dictionary())["_eventNumber"], Value(258));
  EXPECT_EQ((*line["event"].dictionary())["fields"], Value(Dictionary{{Key("k"), "v"}}));
  MutexLock lock(_mutex);
  EXPECT_THAT(_shown, ::testing::ElementsAre(HasSubstr("session 4711 event 258 method 7 status 0 k=v")));
}

TEST_F(DashboardReceiverTest, doesNotAnswerWhoDoesNotListen) {
  start();
  send(datagram(1, false));
  send(datagram(2, true));
  EXPECT_EQ(answer()[61], 2) << "the first answer";
  EXPECT_EQ(lines().size(), 2u);
}

TEST_F(DashboardReceiverTest, storesAnEventThatComesAgainOnceAndAcknowledgesItAgain) {
  start();
  for (int time = 0; time < 3; ++time) send(datagram(1));
  for (int time = 0; time < 3; ++time) EXPECT_EQ(answer().size(), 62u);
  EXPECT_TRUE(counts("repeated", 2));
  EXPECT_TRUE(counts("events", 1));
  EXPECT_EQ(lines().size(), 1u);
}

TEST_F(DashboardReceiverTest, countsWhatIsNoEventAndGoesOn) {
  start();
  Bytes cut = datagram(1);
  cut.pop_back();
  for (const Bytes& bytes : {Bytes(), Bytes(63, 0), Bytes(2000, 0xFF), cut}) send(bytes);
  send(datagram(2));
  EXPECT_EQ(answer()[61], 2);
  EXPECT_TRUE(counts("refused", 4));
  EXPECT_EQ(lines().size(), 1u);
}

TEST_F(DashboardReceiverTest, losesAsManyAsItIsToldAndTheSameOnesFromTheSameSeed) {
  // The numbers of the events that are kept, sent in that order.
  const auto kept = [this](uint64_t seed, bool isBackwards) {
    start(30, seed);
    for (uint16_t n = 1; n <= 100; ++n) {
      send(datagram(isBackwards ? 101 - n : n, false));
      EXPECT_TRUE(eventually([this, n] {
        const Dictionary counts = _receiver->statistics();
        return counts["events"].integerValue() + counts["lost"].integerValue() == n;
      }));
    }
    std::set<int64_t> numbers;
    const std::vector<Dictionary> all = lines();
    for (auto line = all.end() - _receiver->statistics()["events"].integerValue(); line != all.end(); ++line) {
      numbers.insert((*(*line)["event"].dictionary())["_eventNumber"].integerValue());
    }
    return numbers;
  };
  const auto first = kept(5, false);
  EXPECT_GT(first.size(), 50u);
  EXPECT_LT(first.size(), 90u);
  EXPECT_EQ(kept(5, false), first);
  EXPECT_EQ(kept(5, true), first) << "in whatever order they come";
  EXPECT_NE(kept(6, false), first);
}

TEST_F(DashboardReceiverTest, losesEverythingIfAsked) {
  start(100, 1);
  for (uint16_t eventID = 1; eventID <= 20; ++eventID) send(datagram(eventID));
  EXPECT_TRUE(counts("lost", 20));
  EXPECT_TRUE(lines().empty());
}

TEST_F(DashboardReceiverTest, losesAcknowledgementsTooSoThatEventsComeAgain) {
  start(50, 3);
  // As a device that sends until it is acknowledged.
  std::set<int> acknowledged;
  for (int round = 0; round < 200 && acknowledged.size() < 20; ++round) {
    for (uint16_t eventID = 1; eventID <= 20; ++eventID) {
      if (acknowledged.count(eventID) == 0) send(datagram(eventID));
    }
    Bytes bytes(100);
    for (int turn = 0; turn < 1000; ++turn) {
      if (_socket->receive(bytes.data(), bytes.size()).has_value()) acknowledged.insert(bytes[61]);
    }
  }
  EXPECT_EQ(acknowledged.size(), 20u);
  EXPECT_EQ(lines().size(), 20u) << "each once";
  EXPECT_GT(_receiver->statistics()["repeated"].integerValue(), 0);
}

TEST_F(DashboardReceiverTest, saysWhenItsAddressIsTaken) {
  start();
  const auto second = DashboardReceiver::start({.address = _receiver->address()}, _store);
  ASSERT_TRUE(second.has_error());
  EXPECT_THAT(second.error().description(), HasSubstr("cannot take datagrams on 127.0.0.1:"));
}

}  // namespace
}  // namespace telvane::testing
