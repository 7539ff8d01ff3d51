#include "platform/system/ReceivedFile.h"

#include <fcntl.h>
#include <fmt/format.h>
#include <stdlib.h>
#include <unistd.h>

#include <cerrno>

#include "platform/system/FileAccess.h"
#include "platform/system/PlatformError.h"

namespace telvane {
namespace {

// Where a file without a name can be found, to give it one.
constexpr char kOpenFiles[] = "/proc/self/fd";

}  // namespace

Result<std::unique_ptr<ReceivedFile>> ReceivedFile::begin(const std::string& folder) {
  const Result<void> made = fileaccess::createDirectory(folder);
  if (!made) return made.error();
  Result<FileDescriptor> unnamed = fileaccess::openWithoutName(folder);
  if (unnamed && ::access(kOpenFiles, X_OK) == 0) {
    return std::unique_ptr<ReceivedFile>(new ReceivedFile(folder, std::string(), std::move(*unnamed)));
  }
  if (!unnamed && unnamed.error().code() != EOPNOTSUPP) return unnamed.error();
  return beginUnderHiddenName(folder);
}

Result<std::unique_ptr<ReceivedFile>> ReceivedFile::beginUnderHiddenName(const std::string& folder) {
  std::string path = folder + "/.receiving-XXXXXX";
  FileDescriptor file(::mkostemp(path.data(), O_CLOEXEC));  // mode 0600
  if (!file.isOpen()) return errnoError(errno, "Cannot make a file in " + folder);
  return std::unique_ptr<ReceivedFile>(new ReceivedFile(folder, std::move(path), std::move(file)));
}

ReceivedFile::~ReceivedFile() {
  if (!_hiddenPath.empty()) ::unlink(_hiddenPath.c_str());
}

Result<void> ReceivedFile::append(std::string_view bytes) {
  while (!bytes.empty()) {
    const ssize_t written = ::write(_file.get(), bytes.data(), bytes.size());
    if (written < 0 && errno == EINTR) continue;
    if (written < 0) return errnoError(errno, "Cannot write into " + _folder);
    bytes.remove_prefix(static_cast<size_t>(written));
    _size += static_cast<uint64_t>(written);
  }
  return {};
}

Result<std::string> ReceivedFile::settled(std::string name) const {
  const FileDescriptor folder(::open(_folder.c_str(), O_RDONLY | O_DIRECTORY | O_CLOEXEC));
  if (!folder.isOpen() || ::fsync(folder.get()) != 0) return errnoError(errno, "Cannot write into " + _folder);
  return name;
}

// A link, because a rename would replace what has the name.
int ReceivedFile::link(const std::string& path) const {
  if (!_hiddenPath.empty()) return ::link(_hiddenPath.c_str(), path.c_str());
  const std::string file = fmt::format("{}/{}", kOpenFiles, _file.get());
  return ::linkat(AT_FDCWD, file.c_str(), AT_FDCWD, path.c_str(), AT_SYMLINK_FOLLOW);
}

Result<std::string> ReceivedFile::keepAs(const std::string& name) {
  constexpr int kMostOfAName = 100'000;
  // Who sent it may delete its own copy as soon as it hears that this one is kept.
  if (::fsync(_file.get()) != 0) return errnoError(errno, "Cannot write into " + _folder);
  std::string kept = name;
  for (int number = 2; number <= kMostOfAName; ++number) {
    if (link(_folder + "/" + kept) == 0) return settled(kept);
    if (errno != EEXIST) break;
    kept = fmt::format("{}-{}", number, name);
  }
  return errnoError(errno, fmt::format("Cannot keep {} in {}", name, _folder));
}

}  // namespace telvane
