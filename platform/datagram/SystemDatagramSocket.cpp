#include "platform/datagram/SystemDatagramSocket.h"

#include <sys/socket.h>

#include <cerrno>

#include "platform/datagram/SystemAddress.h"
#include "platform/system/PlatformError.h"

namespace telvane {
namespace {

template <class Call>
ssize_t unlessInterrupted(Call call) {
  ssize_t result = 0;
  do {
    result = call();
  } while (result < 0 && errno == EINTR);
  return result;
}

}  // namespace

Result<void> SystemDatagramSocket::bind() {
  const sockaddr_in any = systemAddress({});
  if (::bind(_descriptor.get(), reinterpret_cast<const sockaddr*>(&any), sizeof any) != 0) {
    return errnoError(errno, "bind");
  }
  return {};
}

Result<void> SystemDatagramSocket::connect(const IPv4SocketAddress& address) {
  const sockaddr_in peer = systemAddress(address);
  if (::connect(_descriptor.get(), reinterpret_cast<const sockaddr*>(&peer), sizeof peer) != 0) {
    return errnoError(errno, "connect to " + description(address));
  }
  return {};
}

Result<size_t> SystemDatagramSocket::send(const uint8_t* bytes, size_t length) {
  const ssize_t sent =
      unlessInterrupted([&] { return ::send(_descriptor.get(), bytes, length, MSG_NOSIGNAL | MSG_DONTWAIT); });
  if (sent < 0) return errnoError(errno, "send");
  return static_cast<size_t>(sent);
}

Result<size_t> SystemDatagramSocket::receive(uint8_t* buffer, size_t capacity) {
  const ssize_t received = unlessInterrupted([&] { return ::recv(_descriptor.get(), buffer, capacity, MSG_DONTWAIT); });
  if (received < 0) return errnoError(errno, "receive");
  return static_cast<size_t>(received);
}

std::unique_ptr<ReadSource> SystemDatagramSocket::newReadSource(std::shared_ptr<SerialQueue> queue,
                                                                UniqueFunction<void()> onReadable, Job onCancel) {
  return _loop->newSource(_descriptor.get(), std::move(queue), std::move(onReadable), std::move(onCancel));
}

}  // namespace telvane
