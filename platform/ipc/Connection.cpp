#include "platform/ipc/Connection.h"

#include <unistd.h>

#include <utility>

namespace telvane::ipc {

Descriptor::Descriptor(Descriptor&& other) noexcept : _fd(std::exchange(other._fd, -1)) {}

Descriptor& Descriptor::operator=(Descriptor&& other) noexcept {
  if (this != &other) {
    if (_fd >= 0) ::close(_fd);
    _fd = std::exchange(other._fd, -1);
  }
  return *this;
}

Descriptor::~Descriptor() {
  if (_fd >= 0) ::close(_fd);
}

}  // namespace telvane::ipc
