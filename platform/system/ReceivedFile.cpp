#include "platform/system/ReceivedFile.h"

#include <fcntl.h>
#include <fmt/format.h>
#include <stdlib.h>
#include <unistd.h>

#include <cerrno>

#include "platform/system/FileAccess.h"
#include "platform/system/PlatformError.h"

namespace telvane {

Result<std::unique_ptr<ReceivedFile>> ReceivedFile::begin(const std::string& folder) {
  const Result<void> made = fileaccess::createDirectory(folder);
  if (!made) return made.error();
  std::string path = folder + "/.receiving-XXXXXX";
  FileDescriptor file(::mkostemp(path.data(), O_CLOEXEC));  // mode 0600
  if (!file.isOpen()) return errnoError(errno, "Cannot make a file in " + folder);
  return std::unique_ptr<ReceivedFile>(new ReceivedFile(folder, std::move(path), std::move(file)));
}

ReceivedFile::~ReceivedFile() { ::unlink(_hiddenPath.c_str()); }

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

Result<std::string> ReceivedFile::keepAs(const std::string& name) {
  constexpr int kMostOfAName = 100'000;
  // Who sent it may delete its own copy as soon as it hears that this one is kept.
  if (::fsync(_file.get()) != 0) return errnoError(errno, "Cannot write into " + _folder);
  std::string kept = name;
  for (int number = 2; number <= kMostOfAName; ++number) {
    // A link, because a rename would replace what has the name.
    if (::link(_hiddenPath.c_str(), (_folder + "/" + kept).c_str()) == 0) return settled(kept);
    if (errno != EEXIST) break;
    kept = fmt::format("{}-{}", number, name);
  }
  return errnoError(errno, fmt::format("Cannot keep {} in {}", name, _folder));
}

}  // namespace telvane
