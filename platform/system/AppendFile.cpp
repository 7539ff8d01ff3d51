#include "platform/system/AppendFile.h"

#include <fcntl.h>
#include <sys/stat.h>
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

Result<std::unique_ptr<AppendFile>> AppendFile::openExisting(const std::string& path) {
  // Without O_NONBLOCK a pipe would hold up whoever opens it.
  FileDescriptor file(::open(path.c_str(), O_WRONLY | O_APPEND | O_CLOEXEC | O_NOCTTY | O_NOFOLLOW | O_NONBLOCK));
  if (!file.isOpen()) return errnoError(errno, "cannot open " + path);
  struct stat status {};
  if (::fstat(file.get(), &status) != 0) return errnoError(errno, "cannot open " + path);
  if (!S_ISREG(status.st_mode)) return platformError(EINVAL, "cannot open " + path + ": no regular file");
  return std::unique_ptr<AppendFile>(new AppendFile(std::move(file)));
}

Result<void> AppendFile::append(std::string_view text) {
  MutexLock lock(_mutex);
  const size_t size = text.size();
  while (!text.empty()) {
    const ssize_t written = ::write(_file.get(), text.data(), text.size());
    if (written < 0 && errno == EINTR) continue;
    if (written < 0) {
      const int code = errno;
      takeBack(size - text.size());
      return errnoError(code, "cannot append");
    }
    text.remove_prefix(static_cast<size_t>(written));
  }
  return {};
}

void AppendFile::takeBack(size_t size) {
  if (size == 0) return;
  const off_t ours = ::lseek(_file.get(), 0, SEEK_CUR);  // behind what this file has written last
  struct stat status {};
  if (ours < 0 || ::fstat(_file.get(), &status) != 0 || status.st_size != ours) return;
  // The error to tell is that of the writing, whether this helps or not.
  if (::ftruncate(_file.get(), ours - static_cast<off_t>(size)) != 0) return;
}

}  // namespace telvane
