#include "platform/system/SuiteLock.h"

#include <fcntl.h>
#include <sys/file.h>

#include <cerrno>

#include "platform/system/PlatformError.h"

namespace telvane {

Result<SuiteLock> SuiteLock::acquire(const std::string& path) {
  FileDescriptor file(::open(path.c_str(), O_RDWR | O_CREAT | O_CLOEXEC | O_NOFOLLOW | O_NONBLOCK, 0600));
  if (!file.isOpen()) return errnoError(errno, "Cannot open the lock " + path);
  while (::flock(file.get(), LOCK_EX) != 0) {
    if (errno != EINTR) return errnoError(errno, "Cannot lock " + path);
  }
  return SuiteLock(std::move(file));
}

SuiteLock::~SuiteLock() {
  if (_file.isOpen()) ::flock(_file.get(), LOCK_UN);
}

}  // namespace telvane
