#include "platform/datagram/DatagramServer.h"

#include <gtest/gtest.h>

#include <cerrno>
#include <future>
#include <string>

#include "platform/datagram/SystemDatagramSockets.h"
#include "tests/platform/dispatch/Waiting.h"

namespace telvane::testing {
namespace {

std::span<const uint8_t> bytesOf(const std::string& text) {
  return {reinterpret_cast<const uint8_t*>(text.data()), text.size()};
}

// A server that sends back what it gets.
std::unique_ptr<DatagramServer> echo(const IPv4SocketAddress& address = {{127, 0, 0, 1}, 0}) {
  auto server = DatagramServer::start(address, [](const DatagramServer& self, std::span<const uint8_t> datagram,
                                                  const IPv4SocketAddress& peer) { self.send(peer, datagram); });
  return server.has_value() ? std::move(*server) : nullptr;
}

class Client {
 public:
  explicit Client(const IPv4SocketAddress& server) : _socket(*_sockets.newSocket()) {
    EXPECT_TRUE(_socket->connect(server).has_value());
  }
  bool send(const std::string& text) {
    const auto sent = _socket->send(bytesOf(text).data(), text.size());
    return sent.has_value() && *sent == text.size();
  }
  // The next datagram; waits for it.
  std::string receive() {
    std::string text(DatagramServer::kLongestDatagram, '\0');
    size_t length = 0;
    const bool hasCome = eventually([this, &text, &length] {
      const auto received = _socket->receive(reinterpret_cast<uint8_t*>(text.data()), text.size());
      if (received.has_value()) length = *received;
      return received.has_value();
    });
    text.resize(length);
    return hasCome ? text : "<nothing>";
  }

 private:
  SystemDatagramSockets _sockets;
  std::unique_ptr<DatagramSocket> _socket;
};

TEST(DatagramServerTest, takesDatagramsAndAnswers) {
  const auto server = echo();
  ASSERT_NE(server, nullptr);
  EXPECT_NE(server->address().port, 0) << "one was picked";
  Client first(server->address());
  Client second(server->address());
  EXPECT_TRUE(first.send("one"));
  EXPECT_EQ(first.receive(), "one");
  EXPECT_TRUE(second.send("two"));
  EXPECT_EQ(second.receive(), "two");
}

TEST(DatagramServerTest, takesEmptyAndLongOnes) {
  const auto server = echo();
  Client client(server->address());
  EXPECT_TRUE(client.send(""));
  EXPECT_EQ(client.receive(), "");
  const std::string longest(60'000, 'x');
  EXPECT_TRUE(client.send(longest));
  EXPECT_EQ(client.receive(), longest);
}

TEST(DatagramServerTest, saysWhenTheAddressIsTaken) {
  const auto server = echo();
  const auto second = DatagramServer::start(
      server->address(), [](const DatagramServer&, std::span<const uint8_t>, const IPv4SocketAddress&) {});
  ASSERT_TRUE(second.has_error());
  EXPECT_EQ(second.error().code(), EADDRINUSE);
  EXPECT_NE(second.error().description().find(description(server->address())), std::string::npos);
}

TEST(DatagramServerTest, endsWhileDatagramsCome) {
  for (int run = 0; run < 20; ++run) {
    auto server = echo();
    Client client(server->address());
    for (int n = 0; n < 50; ++n) client.send("datagram");
    server.reset();
  }
}

TEST(DatagramServerTest, sendsToWhoeverItIsToldTo) {
  std::promise<IPv4SocketAddress> heard;
  auto server =
      DatagramServer::start({{127, 0, 0, 1}, 0}, [&heard](const DatagramServer&, std::span<const uint8_t>,
                                                          const IPv4SocketAddress& peer) { heard.set_value(peer); });
  ASSERT_TRUE(server.has_value());
  Client client((*server)->address());
  client.send("who am I");
  const IPv4SocketAddress peer = heard.get_future().get();
  EXPECT_TRUE((*server)->send(peer, bytesOf("later")));
  EXPECT_EQ(client.receive(), "later");
  EXPECT_FALSE((*server)->send({{255, 255, 255, 255}, 9}, bytesOf("to all"))) << "no broadcasts";
}

}  // namespace
}  // namespace telvane::testing
