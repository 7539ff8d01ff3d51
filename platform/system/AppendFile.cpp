#include "platform/system/AppendFile.h"

#include <fcntl.h>
#include <unistd.h>

#include <cerrno>

#include "platform/system/PlatformError.h"

namespace telvane {

Result<std::unique_ptr<AppendFile>> AppendFile::open(const std::string& path) {
  constexpr mode_t kOwnerOnly = 0600;
  FileDescriptor file(::open(path.c_str(), O_WRONLY | O_CREAT | O_APPEND | O_CLOEXEC | O_NOCTTY, kOwnerOnly));
  if (!file.isOpen()) return errnoError(errno, "cannot open " + path);
  return std::unique_ptr<AppendFile>(new AppendFile(std::move(file)));
}

Result<void> AppendFile::append(std::string_view text) {
  MutexLock lock(_mutex);
  while (!text.empty()) {
    const ssize_t written = ::write(_file.get(), text.data(), text.size());
    if (written < 0 && errno == EINTR) continue;
    if (written < 0) return errnoError(errno, "cannot append");
    text.remove_prefix(static_cast<size_t>(written));
  }
  return {};
}

}  // namespace telvane
