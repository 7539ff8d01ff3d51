#include "platform/process/FileExtension.h"

#include <fcntl.h>

#include <cerrno>
#include <system_error>

namespace telvane {

Result<ipc::Descriptor> issueFileExtension(const std::string& path) {
  // O_NONBLOCK, because opening a named pipe waits for its writer otherwise.
  const int fd = ::open(path.c_str(), O_RDONLY | O_CLOEXEC | O_NONBLOCK | O_NOCTTY);
  if (fd >= 0) return ipc::Descriptor(fd);
  const int code = errno;
  return Error::withDescription(kPlatformErrorDomain.string(), code,
                                path + ": " + std::generic_category().message(code));
}

}  // namespace telvane
