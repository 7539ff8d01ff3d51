#include "platform/system/FileAccess.h"

#include <fcntl.h>
#include <fmt/format.h>
#include <sys/random.h>
#include <sys/stat.h>
#include <unistd.h>

#include <cerrno>
#include <filesystem>

#include "platform/system/FileDescriptor.h"
#include "platform/system/PlatformError.h"

namespace telvane::fileaccess {
namespace {

constexpr size_t kReadStep = 64u << 10;
constexpr int kAttemptsForAName = 8;

int64_t nanoseconds(const timespec& time) { return int64_t{time.tv_sec} * 1'000'000'000 + time.tv_nsec; }

Identity identityOf(const struct stat& status) {
  return {status.st_dev, status.st_ino, status.st_size, nanoseconds(status.st_mtim), nanoseconds(status.st_ctim)};
}

std::string folderOf(const std::string& path) {
  const size_t slash = path.rfind('/');
  if (slash == std::string::npos) return ".";
  return slash == 0 ? "/" : path.substr(0, slash);
}

std::string temporaryPathFor(const std::string& path) {
  uint64_t number = 0;
  if (::getrandom(&number, sizeof number, 0) != sizeof number) number = static_cast<uint64_t>(::getpid());
  const size_t slash = path.rfind('/');
  const size_t nameStart = slash == std::string::npos ? 0 : slash + 1;
  return fmt::format("{}.{}.{:016x}.new", path.substr(0, nameStart), path.substr(nameStart), number);
}

// Returns 0, or the errno value of the failure.
int writeAll(int fd, std::string_view bytes) {
  while (!bytes.empty()) {
    const ssize_t written = ::write(fd, bytes.data(), bytes.size());
    if (written < 0 && errno == EINTR) continue;
    if (written < 0) return errno;
    bytes.remove_prefix(static_cast<size_t>(written));
  }
  return 0;
}

// Returns 0, or the errno value of the failure. Until the folder is on the disk too, a crash could bring back the old
// file; not every file system can do that, and the new content is in place all the same.
int writeDurably(int fd, std::string_view bytes) {
  if (const int code = writeAll(fd, bytes); code != 0) return code;
  return ::fsync(fd) == 0 ? 0 : errno;
}

void makeFolderDurable(const std::string& folder) {
  const FileDescriptor opened(::open(folder.c_str(), O_RDONLY | O_DIRECTORY | O_CLOEXEC));
  if (opened.isOpen()) ::fsync(opened.get());
}

struct NewFile {
  std::string path;
  FileDescriptor descriptor;
};

Result<NewFile> makeNewFileBeside(const std::string& path, mode_t mode) {
  for (int attempt = 0; attempt < kAttemptsForAName; ++attempt) {
    NewFile made{temporaryPathFor(path), {}};
    made.descriptor = FileDescriptor(::open(made.path.c_str(), O_WRONLY | O_CREAT | O_EXCL | O_CLOEXEC, mode));
    if (made.descriptor.isOpen()) return made;
    if (errno != EEXIST) break;
  }
  return errnoError(errno, "Cannot make a file beside " + path);
}

Result<std::string> readAll(int fd, const std::string& path, uint64_t maximumSize, size_t expectedSize) {
  std::string bytes;
  size_t used = 0;
  for (;;) {
    if (used == bytes.size()) bytes.resize(used + (used == 0 ? expectedSize + 1 : kReadStep));
    const ssize_t count = ::read(fd, bytes.data() + used, bytes.size() - used);
    if (count < 0 && errno == EINTR) continue;
    if (count < 0) return errnoError(errno, "Cannot read " + path);
    if (count == 0) break;
    used += static_cast<size_t>(count);
    if (used > maximumSize) return errnoError(EFBIG, "Cannot read " + path);
  }
  bytes.resize(used);
  return bytes;
}

}  // namespace

Identity identityOf(const std::string& path) noexcept {
  struct stat status {};
  return ::stat(path.c_str(), &status) == 0 ? identityOf(status) : Identity{};
}

Result<Content> read(const std::string& path, uint64_t maximumSize) {
  const FileDescriptor file(::open(path.c_str(), O_RDONLY | O_CLOEXEC | O_NONBLOCK | O_NOCTTY));
  if (!file.isOpen()) return errnoError(errno, "Cannot open " + path);
  struct stat status {};
  if (::fstat(file.get(), &status) != 0) return errnoError(errno, "Cannot read " + path);
  if (S_ISDIR(status.st_mode)) return errnoError(EISDIR, "Cannot read " + path);
  if (!S_ISREG(status.st_mode)) return platformError(EINVAL, "Cannot read " + path + ": no regular file");
  if (static_cast<uint64_t>(status.st_size) > maximumSize) return errnoError(EFBIG, "Cannot read " + path);
  Result<std::string> bytes = readAll(file.get(), path, maximumSize, static_cast<size_t>(status.st_size));
  if (!bytes) return bytes.error();
  return Content{Data(std::move(*bytes)), identityOf(status)};
}

Result<void> replace(const std::string& path, const Data& data, mode_t mode) {
  Result<NewFile> made = makeNewFileBeside(path, mode);
  if (!made) return made.error();
  int code = writeDurably(made->descriptor.get(), data.view());
  if (code == 0 && ::rename(made->path.c_str(), path.c_str()) != 0) code = errno;
  if (code != 0) {
    ::unlink(made->path.c_str());
    return errnoError(code, "Cannot write " + path);
  }
  makeFolderDurable(folderOf(path));
  return {};
}

Result<void> overwrite(const std::string& path, const Data& data, mode_t mode) {
  const FileDescriptor file(::open(path.c_str(), O_WRONLY | O_CREAT | O_TRUNC | O_CLOEXEC | O_NONBLOCK, mode));
  if (!file.isOpen()) return errnoError(errno, "Cannot open " + path);
  if (const int code = writeAll(file.get(), data.view()); code != 0) return errnoError(code, "Cannot write " + path);
  return {};
}

Result<FileDescriptor> openWithoutName(const std::string& folder) {
  constexpr mode_t kOwnerOnly = 0600;
  FileDescriptor file(::open(folder.c_str(), O_TMPFILE | O_RDWR | O_CLOEXEC, kOwnerOnly));
  if (file.isOpen()) return file;
  // Kernels and file systems that do not know the flag take the folder itself for what is to be opened.
  const bool isUnknown = errno == EOPNOTSUPP || errno == EISDIR || errno == EINVAL;
  return errnoError(isUnknown ? EOPNOTSUPP : errno, "Cannot make a file in " + folder);
}

Result<void> createDirectory(const std::string& path) {
  std::error_code failure;
  std::filesystem::create_directories(path, failure);
  if (failure) return errnoError(failure.value(), "Cannot make the folder " + path);
  return {};
}

}  // namespace telvane::fileaccess
