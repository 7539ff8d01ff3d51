#include "platform/process/FileExtension.h"

#include <fcntl.h>

#include <cerrno>
#include <cstdlib>
#include <memory>
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

std::string canonicalPathOfFile(const std::string& path) {
  const size_t slash = path.rfind('/');
  const std::string folder = slash == std::string::npos ? "." : path.substr(0, slash + 1);
  const std::unique_ptr<char, decltype(&std::free)> followed(::realpath(folder.c_str(), nullptr), &std::free);
  if (path.empty() || followed == nullptr) return path;
  const std::string name = slash == std::string::npos ? path : path.substr(slash + 1);
  const std::string parent = followed.get();
  return parent == "/" ? "/" + name : parent + "/" + name;
}

}  // namespace telvane
