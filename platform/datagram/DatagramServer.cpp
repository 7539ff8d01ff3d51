#include "platform/datagram/DatagramServer.h"

#include <poll.h>
#include <sys/eventfd.h>
#include <sys/socket.h>
#include <unistd.h>

#include <array>
#include <cerrno>
#include <system_error>
#include <utility>

#include "platform/datagram/SystemAddress.h"
#include "platform/system/PlatformError.h"

namespace telvane {
namespace {

constexpr int kBufferBytes = 1 << 20;
constexpr int kDatagramsPerTurn = 256;

Result<IPv4SocketAddress> boundAddress(int socket, const IPv4SocketAddress& address) {
  sockaddr_in raw = systemAddress(address);
  auto* const any = reinterpret_cast<sockaddr*>(&raw);
  socklen_t size = sizeof raw;
  if (::bind(socket, any, size) != 0 || ::getsockname(socket, any, &size) != 0) {
    return errnoError(errno, "cannot take datagrams on " + description(address));
  }
  return fromSystemAddress(raw);
}

}  // namespace

Result<std::unique_ptr<DatagramServer>> DatagramServer::start(const IPv4SocketAddress& address, Handler handler) {
  FileDescriptor socket(::socket(AF_INET, SOCK_DGRAM | SOCK_CLOEXEC | SOCK_NONBLOCK, 0));
  FileDescriptor stopCall(eventfd(0, EFD_CLOEXEC | EFD_NONBLOCK));
  if (!socket.isOpen() || !stopCall.isOpen()) return errnoError(errno, "socket");
  // As much of it as the system admits.
  ::setsockopt(socket.get(), SOL_SOCKET, SO_RCVBUF, &kBufferBytes, sizeof kBufferBytes);
  const Result<IPv4SocketAddress> bound = boundAddress(socket.get(), address);
  if (bound.has_error()) return bound.error();
  std::unique_ptr<DatagramServer> server(
      new DatagramServer(std::move(socket), std::move(stopCall), *bound, std::move(handler)));
  try {
    server->_thread = Thread("telvane-udp-srv", [served = server.get()] { served->run(); });
  } catch (const std::system_error& error) {
    return errnoError(error.code().value(), "thread");
  }
  return server;
}

DatagramServer::DatagramServer(FileDescriptor socket, FileDescriptor stopCall, const IPv4SocketAddress& address,
                               Handler handler)
    : _socket(std::move(socket)),
      _stopCall(std::move(stopCall)),
      _address(address),
      _handler(std::move(handler)),
      _buffer(std::make_unique<uint8_t[]>(kLongestDatagram)) {}

DatagramServer::~DatagramServer() {
  const uint64_t one = 1;
  [[maybe_unused]] const auto written = write(_stopCall.get(), &one, sizeof one);
  _thread.join();
}

bool DatagramServer::send(const IPv4SocketAddress& peer, std::span<const uint8_t> datagram) const {
  const sockaddr_in raw = systemAddress(peer);
  const ssize_t sent = ::sendto(_socket.get(), datagram.data(), datagram.size(), MSG_NOSIGNAL | MSG_DONTWAIT,
                                reinterpret_cast<const sockaddr*>(&raw), sizeof raw);
  return sent == static_cast<ssize_t>(datagram.size());
}

void DatagramServer::run() {
  std::array<pollfd, 2> awaited{pollfd{_stopCall.get(), POLLIN, 0}, pollfd{_socket.get(), POLLIN, 0}};
  while (true) {
    if (::poll(awaited.data(), awaited.size(), -1) < 0 && errno != EINTR) return;
    if (awaited[0].revents != 0) return;
    takeDatagrams();
  }
}

void DatagramServer::takeDatagrams() {
  for (int count = 0; count < kDatagramsPerTurn; ++count) {
    sockaddr_in peer{};
    socklen_t size = sizeof peer;
    const ssize_t received = ::recvfrom(_socket.get(), _buffer.get(), kLongestDatagram, MSG_DONTWAIT,
                                        reinterpret_cast<sockaddr*>(&peer), &size);
    if (received < 0) return;  // nothing there, or a fault that was told and is gone with this call
    _handler(*this, {_buffer.get(), static_cast<size_t>(received)}, fromSystemAddress(peer));
  }
}

}  // namespace telvane
