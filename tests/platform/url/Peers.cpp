#include "tests/platform/url/Peers.h"

#include <arpa/inet.h>
#include <gtest/gtest.h>
#include <sys/socket.h>
#include <unistd.h>

#include <array>
#include <cerrno>
#include <utility>

namespace telvane::testing {

namespace {

sockaddr_in loopback(uint16_t port) {
  sockaddr_in address{};
  address.sin_family = AF_INET;
  address.sin_port = htons(port);
  address.sin_addr.s_addr = htonl(INADDR_LOOPBACK);
  return address;
}

std::pair<int, uint16_t> boundSocket() {
  const int bound = socket(AF_INET, SOCK_STREAM | SOCK_CLOEXEC, 0);
  sockaddr_in address = loopback(0);
  socklen_t size = sizeof address;
  EXPECT_EQ(bind(bound, reinterpret_cast<sockaddr*>(&address), size), 0);
  EXPECT_EQ(getsockname(bound, reinterpret_cast<sockaddr*>(&address), &size), 0);
  return {bound, ntohs(address.sin_port)};
}

}  // namespace

RawPeer::RawPeer(int socket) : _socket(socket) {
  const timeval longest{.tv_sec = 20, .tv_usec = 0};
  setsockopt(_socket, SOL_SOCKET, SO_RCVTIMEO, &longest, sizeof longest);
}

RawPeer RawPeer::to(uint16_t port) {
  const int connected = socket(AF_INET, SOCK_STREAM | SOCK_CLOEXEC, 0);
  const sockaddr_in address = loopback(port);
  EXPECT_EQ(connect(connected, reinterpret_cast<const sockaddr*>(&address), sizeof address), 0);
  return RawPeer(connected);
}

RawPeer::RawPeer(RawPeer&& other) noexcept : _socket(std::exchange(other._socket, -1)) {}

RawPeer::~RawPeer() {
  if (_socket >= 0) close(_socket);
}

void RawPeer::say(std::string_view bytes) const {
  while (!bytes.empty()) {
    const ssize_t count = send(_socket, bytes.data(), bytes.size(), MSG_NOSIGNAL);
    if (count <= 0) return;
    bytes.remove_prefix(static_cast<size_t>(count));
  }
}

std::string RawPeer::hearUntil(std::string_view end) const {
  std::string heard;
  char next = 0;
  while (!heard.ends_with(end) && recv(_socket, &next, 1, 0) == 1) heard += next;
  return heard;
}

std::string RawPeer::hear(size_t count) const {
  std::string heard;
  char next = 0;
  while (heard.size() < count && recv(_socket, &next, 1, 0) == 1) heard += next;
  return heard;
}

std::string RawPeer::hearAll() const {
  std::string heard;
  std::array<char, 4096> buffer;
  for (ssize_t count = 0; (count = recv(_socket, buffer.data(), buffer.size(), 0)) > 0;) {
    heard.append(buffer.data(), static_cast<size_t>(count));
  }
  return heard;
}

bool RawPeer::hearsEnd() const {
  std::array<char, 4096> buffer;
  for (;;) {
    const ssize_t count = recv(_socket, buffer.data(), buffer.size(), 0);
    if (count <= 0) return count == 0 || errno == ECONNRESET;
  }
}

RawServer::RawServer(Talk talk) {
  std::tie(_socket, _port) = boundSocket();
  EXPECT_EQ(listen(_socket, 16), 0);
  _thread = std::thread([this, talk = std::move(talk)] {
    for (int connection = 1;; ++connection) {
      const int accepted = accept(_socket, nullptr, nullptr);
      if (accepted < 0) return;
      talk(RawPeer(accepted), connection);
    }
  });
}

RawServer::~RawServer() {
  shutdown(_socket, SHUT_RDWR);
  _thread.join();
  close(_socket);
}

uint16_t unusedPort() {
  const auto [bound, port] = boundSocket();
  close(bound);
  return port;
}

}  // namespace telvane::testing
