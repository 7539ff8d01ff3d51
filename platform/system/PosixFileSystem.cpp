#include "platform/system/PosixFileSystem.h"

#include <fcntl.h>
#include <sys/stat.h>

#include <algorithm>
#include <cerrno>
#include <cstdio>
#include <filesystem>

#include "platform/system/AppendFile.h"
#include "platform/system/FileAccess.h"
#include "platform/system/FileTimes.h"
#include "platform/system/PlatformError.h"
#include "platform/system/UnnamedFile.h"

namespace telvane {
namespace {

namespace fs = std::filesystem;

constexpr mode_t kFileMode = 0666;  // before the process's mask

}  // namespace

std::string PosixFileSystem::resolve(const std::string& path) const { return _paths.resolve(path); }

Result<Data> PosixFileSystem::read(const std::string& path, uint64_t maximumSize) const {
  Result<fileaccess::Content> content = fileaccess::read(resolve(path), maximumSize);
  if (!content) return content.error();
  return std::move(content->data);
}

Result<void> PosixFileSystem::writeAtomically(const std::string& path, const Data& data) {
  return fileaccess::replace(resolve(path), data, kFileMode);
}

Result<void> PosixFileSystem::write(const std::string& path, const Data& data) {
  return fileaccess::overwrite(resolve(path), data, kFileMode);
}

Result<std::unique_ptr<AppendableFile>> PosixFileSystem::openForAppending(const std::string& path) {
  Result<std::unique_ptr<AppendFile>> file = AppendFile::openExisting(resolve(path));
  if (!file) return file.error();
  return std::unique_ptr<AppendableFile>(std::move(*file));
}

Result<std::unique_ptr<TemporaryFile>> PosixFileSystem::newTemporaryFile(const std::string& folder) {
  const Result<void> made = createDirectory(folder);
  if (!made) return made.error();
  Result<std::unique_ptr<UnnamedFile>> file = UnnamedFile::open(resolve(folder));
  if (!file) return file.error();
  return std::unique_ptr<TemporaryFile>(std::move(*file));
}

Result<void> PosixFileSystem::createDirectory(const std::string& path) {
  return fileaccess::createDirectory(resolve(path));
}

Result<void> PosixFileSystem::remove(const std::string& path) {
  const std::string resolved = resolve(path);
  if (std::remove(resolved.c_str()) != 0) return errnoError(errno, "Cannot remove " + resolved);
  return {};
}

std::optional<Date> PosixFileSystem::modificationDate(const std::string& path) const {
  struct stat status {};
  if (::stat(resolve(path).c_str(), &status) != 0) return std::nullopt;
  const auto sinceEpoch =
      std::chrono::seconds(status.st_mtim.tv_sec) + std::chrono::nanoseconds(status.st_mtim.tv_nsec);
  return Date(Date::TimePoint(std::chrono::floor<std::chrono::microseconds>(sinceEpoch)));
}

std::optional<Date> PosixFileSystem::creationDate(const std::string& path) const {
  struct statx status {};
  constexpr unsigned kTimes = STATX_BTIME | STATX_ATIME | STATX_MTIME;
  if (::statx(AT_FDCWD, resolve(path).c_str(), AT_SYMLINK_NOFOLLOW, kTimes, &status) != 0) return std::nullopt;
  return creationDateOf(status);
}

Result<std::vector<std::string>> PosixFileSystem::filesIn(const std::string& path) const {
  const std::string folder = resolve(path);
  std::error_code failure;
  std::vector<std::string> names;
  fs::directory_iterator entry(folder, failure);
  while (!failure && entry != fs::directory_iterator()) {
    std::error_code gone;  // an entry may vanish while we look
    if (entry->symlink_status(gone).type() == fs::file_type::regular)
      names.push_back(entry->path().filename().string());
    entry.increment(failure);
  }
  if (failure) return errnoError(failure.value(), "Cannot list " + folder);
  std::sort(names.begin(), names.end());
  return names;
}

Result<std::vector<std::string>> PosixFileSystem::filesBelow(const std::string& path) const {
  const std::string folder = resolve(path);
  std::error_code failure;
  std::vector<std::string> files;
  // Passing over what may not be read holds for subfolders; the folder that was asked for must be readable.
  fs::directory_iterator top(folder, failure);
  fs::recursive_directory_iterator entry;
  if (!failure) {
    entry = fs::recursive_directory_iterator(folder, fs::directory_options::skip_permission_denied, failure);
  }
  while (!failure && entry != fs::recursive_directory_iterator()) {
    std::error_code gone;  // an entry may vanish while we look
    if (entry->symlink_status(gone).type() == fs::file_type::regular) {
      files.push_back(entry->path().lexically_relative(folder).string());
    }
    entry.increment(failure);
  }
  if (failure) return errnoError(failure.value(), "Cannot list " + folder);
  std::sort(files.begin(), files.end());
  return files;
}

Result<void> PosixFileSystem::setProtectionNone(const std::string&) { return {}; }

}  // namespace telvane
