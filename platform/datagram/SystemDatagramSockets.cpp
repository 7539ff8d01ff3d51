#include "platform/datagram/SystemDatagramSockets.h"

#include <sys/socket.h>

#include <cerrno>

#include "platform/datagram/SystemDatagramSocket.h"
#include "platform/system/PlatformError.h"

namespace telvane {

Result<std::unique_ptr<DatagramSocket>> SystemDatagramSockets::newSocket() {
  FileDescriptor descriptor(::socket(AF_INET, SOCK_DGRAM | SOCK_CLOEXEC | SOCK_NONBLOCK, 0));
  if (!descriptor.isOpen()) return errnoError(errno, "socket");
  std::unique_ptr<DatagramSocket> made = std::make_unique<SystemDatagramSocket>(std::move(descriptor), _loop);
  return made;
}

}  // namespace telvane
