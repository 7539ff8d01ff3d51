#include "platform/system/DescriptorExtensions.h"

#include <fcntl.h>
#include <fmt/format.h>
#include <sys/stat.h>
#include <unistd.h>

#include <array>
#include <cerrno>
#include <climits>

#include "platform/system/FileRemoval.h"
#include "platform/system/PlatformError.h"

namespace telvane {
namespace {

class DescriptorExtension final : public SandboxExtension {
 public:
  DescriptorExtension(std::string path, const ExtensionToken& token)
      : _path(std::move(path)), _descriptor(token.descriptor), _holder(token.holder) {}

  bool isRegularFile() const override;
  Result<uint64_t> size() const override;
  Result<size_t> readAt(uint64_t offset, char* buffer, size_t length) const override;
  Result<void> removeFile() override;

 private:
  bool isKnownToTheKernelByItsPath() const;

  const std::string _path;
  const int _descriptor;
  const std::optional<PeerIdentity> _holder;
};

bool DescriptorExtension::isRegularFile() const {
  // A descriptor without the right to read grants nothing.
  const int flags = ::fcntl(_descriptor, F_GETFL);
  if (flags < 0 || (flags & O_PATH) != 0 || (flags & O_ACCMODE) == O_WRONLY) return false;
  struct stat ours {};
  struct stat named {};
  if (::fstat(_descriptor, &ours) != 0 || !S_ISREG(ours.st_mode) || ours.st_nlink == 0) return false;
  if (::lstat(_path.c_str(), &named) == 0) return isSameFile(ours, named);
  // EACCES: a folder of the client's own. ENOENT: a path of the client's view of the disks that is not in ours, as with
  // a private /tmp; in the same view the kernel's name would not be the path then.
  return (errno == EACCES || errno == ENOENT) && isKnownToTheKernelByItsPath();
}

bool DescriptorExtension::isKnownToTheKernelByItsPath() const {
  std::array<char, PATH_MAX> name{};
  const ssize_t size = ::readlink(fmt::format("/proc/self/fd/{}", _descriptor).c_str(), name.data(), name.size());
  return size > 0 && std::string_view(name.data(), static_cast<size_t>(size)) == _path;
}

Result<uint64_t> DescriptorExtension::size() const {
  struct stat status {};
  if (::fstat(_descriptor, &status) != 0) return errnoError(errno, "Cannot look at " + _path);
  return static_cast<uint64_t>(status.st_size);
}

Result<size_t> DescriptorExtension::readAt(uint64_t offset, char* buffer, size_t length) const {
  size_t total = 0;
  while (total < length) {
    const ssize_t count = ::pread(_descriptor, buffer + total, length - total, static_cast<off_t>(offset + total));
    if (count < 0 && errno == EINTR) continue;
    if (count < 0) return errnoError(errno, "Cannot read " + _path);
    if (count == 0) break;
    total += static_cast<size_t>(count);
  }
  return total;
}

Result<void> DescriptorExtension::removeFile() {
  if (!_holder.has_value()) return platformError(EPERM, "nobody knows who handed it over");
  return removeFileFor(*_holder, _path, _descriptor);
}

}  // namespace

std::unique_ptr<SandboxExtension> DescriptorExtensions::consume(const std::string& path, const ExtensionToken& token) {
  if (token.descriptor < 0) return nullptr;
  return std::make_unique<DescriptorExtension>(path, token);
}

}  // namespace telvane
