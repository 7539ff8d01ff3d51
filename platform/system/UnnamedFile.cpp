#include "platform/system/UnnamedFile.h"

#include <fcntl.h>
#include <stdlib.h>
#include <unistd.h>

#include <algorithm>
#include <cerrno>

#include "platform/system/FileAccess.h"
#include "platform/system/PlatformError.h"

namespace telvane {
namespace {

// Returns a closed descriptor with errno on failure.
FileDescriptor openNamedAndUnlink(const std::string& folder) {
  std::string path = folder + "/.telvane-XXXXXX";
  FileDescriptor file(::mkostemp(path.data(), O_CLOEXEC));  // mode 0600
  if (file.isOpen()) ::unlink(path.c_str());
  return file;
}

}  // namespace

Result<std::unique_ptr<UnnamedFile>> UnnamedFile::open(const std::string& folder) {
  Result<FileDescriptor> file = fileaccess::openWithoutName(folder);
  if (file) return std::unique_ptr<UnnamedFile>(new UnnamedFile(std::move(*file)));
  if (file.error().code() != EOPNOTSUPP) return file.error();
  FileDescriptor unlinked = openNamedAndUnlink(folder);
  if (!unlinked.isOpen()) return errnoError(errno, "Cannot make a temporary file in " + folder);
  return std::unique_ptr<UnnamedFile>(new UnnamedFile(std::move(unlinked)));
}

int64_t UnnamedFile::read(uint64_t offset, std::span<char> buffer) const {
  const uint64_t size = std::min<uint64_t>(buffer.size(), _size - std::min(offset, _size));
  if (size == 0) return 0;
  ssize_t count = -1;
  do {
    count = ::pread(_file.get(), buffer.data(), size, static_cast<off_t>(offset));
  } while (count < 0 && errno == EINTR);
  return count > 0 ? count : -1;
}

Result<void> UnnamedFile::append(std::string_view bytes) {
  while (!bytes.empty()) {
    const ssize_t written = ::pwrite(_file.get(), bytes.data(), bytes.size(), static_cast<off_t>(_size));
    if (written < 0 && errno == EINTR) continue;
    if (written < 0) return errnoError(errno, "Cannot write a temporary file");
    bytes.remove_prefix(static_cast<size_t>(written));
    _size += static_cast<uint64_t>(written);
  }
  return {};
}

}  // namespace telvane
