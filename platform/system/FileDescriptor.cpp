#include "platform/system/FileDescriptor.h"

#include <unistd.h>

namespace telvane {

FileDescriptor& FileDescriptor::operator=(FileDescriptor&& other) noexcept {
  FileDescriptor taken(std::move(other));
  std::swap(_fd, taken._fd);
  return *this;
}

FileDescriptor::~FileDescriptor() {
  if (_fd >= 0) ::close(_fd);
}

}  // namespace telvane
