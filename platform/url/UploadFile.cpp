#include "platform/url/UploadFile.h"

#include <fcntl.h>
#include <fmt/format.h>
#include <sys/stat.h>
#include <unistd.h>

#include <algorithm>
#include <cerrno>
#include <system_error>

namespace telvane {

namespace {

Error fileError(const std::string& path, int code) {
  const std::string reason = std::generic_category().message(code);
  return Error::withDescription(kPlatformErrorDomain, code, fmt::format("{} cannot be uploaded: {}", path, reason));
}

}  // namespace

Result<std::unique_ptr<UploadFile>> UploadFile::open(const std::string& path) {
  // Not blocking, so that a pipe in the file's place does not hold the caller.
  const int descriptor = ::open(path.c_str(), O_RDONLY | O_CLOEXEC | O_NONBLOCK);
  if (descriptor < 0) return fileError(path, errno);
  struct stat status {};
  const int failure = fstat(descriptor, &status) != 0 ? errno : S_ISREG(status.st_mode) ? 0 : EINVAL;
  if (failure != 0) {
    close(descriptor);
    return fileError(path, failure);
  }
  return std::unique_ptr<UploadFile>(new UploadFile(descriptor, static_cast<uint64_t>(status.st_size)));
}

UploadFile::~UploadFile() { close(_descriptor); }

int64_t UploadFile::read(uint64_t offset, std::span<char> buffer) const {
  const uint64_t size = std::min<uint64_t>(buffer.size(), _size - std::min(offset, _size));
  if (size == 0) return 0;
  const ssize_t count = pread(_descriptor, buffer.data(), size, static_cast<off_t>(offset));
  return count > 0 ? count : -1;
}

}  // namespace telvane
