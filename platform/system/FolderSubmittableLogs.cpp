#include "platform/system/FolderSubmittableLogs.h"

#include <fcntl.h>
#include <sys/stat.h>
#include <unistd.h>

#include <cerrno>

#include "platform/system/FileAccess.h"
#include "platform/system/FileDescriptor.h"
#include "platform/system/PlatformError.h"

namespace telvane {
namespace {

constexpr mode_t kOwnerOnly = 0600;

struct PathParts {
  std::string folder;
  std::string name;
};

PathParts partsOf(const std::string& absolutePath) {
  const size_t slash = absolutePath.rfind('/');
  if (slash == std::string::npos) return {".", absolutePath};
  return {absolutePath.substr(0, slash + 1), absolutePath.substr(slash + 1)};
}

}  // namespace

Result<void> FolderSubmittableLogs::createTemporaryLog(std::string_view, const std::string& path) {
  const std::string resolved = _paths.resolve(path);
  if (Result<void> made = fileaccess::createDirectory(partsOf(resolved).folder); !made) return made;
  const FileDescriptor file(::open(resolved.c_str(), O_WRONLY | O_CREAT | O_EXCL | O_CLOEXEC, kOwnerOnly));
  if (!file.isOpen()) return errnoError(errno, "Cannot make " + resolved);
  return {};
}

Result<void> FolderSubmittableLogs::moveToSubmissionArea(std::string_view, const std::string& path) {
  const std::string source = _paths.resolve(path);
  struct stat status {};
  if (::lstat(source.c_str(), &status) != 0) return errnoError(errno, "Cannot submit " + source);
  if (!S_ISREG(status.st_mode)) return platformError(EINVAL, "Cannot submit " + source + ": no regular file");

  const std::string area = _paths.resolve(kSubmissionArea);
  if (Result<void> made = fileaccess::createDirectory(area); !made) return made;
  const FileDescriptor folder(::open(area.c_str(), O_PATH | O_DIRECTORY | O_NOFOLLOW | O_CLOEXEC));
  if (!folder.isOpen()) return errnoError(errno, "Cannot open " + area);
  // A second name and then the first one gone: unlike a rename, this never replaces, on any file system.
  const std::string name = partsOf(source).name;
  if (::linkat(AT_FDCWD, source.c_str(), folder.get(), name.c_str(), 0) != 0) {
    return errnoError(errno, "Cannot submit " + source);
  }
  if (::unlink(source.c_str()) != 0) return errnoError(errno, "Cannot remove " + source);
  return {};
}

}  // namespace telvane
