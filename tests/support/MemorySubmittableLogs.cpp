#include "tests/support/MemorySubmittableLogs.h"

#include <fmt/format.h>

#include <cerrno>
#include <cstring>

namespace telvane::testing {
namespace {

constexpr uint64_t kLargestLog = 1u << 30;

Error failure(int errorNumber, const std::string& path) {
  return Error::withDescription(kPlatformErrorDomain, errorNumber, path + ": " + std::strerror(errorNumber));
}

size_t nameStart(const std::string& path) { return path.rfind('/') + 1; }

}  // namespace

std::vector<std::string> MemorySubmittableLogs::calls() const {
  MutexLock lock(_mutex);
  return _calls;
}

Result<void> MemorySubmittableLogs::createTemporaryLog(std::string_view logType, const std::string& path) {
  note("create", logType, path);
  if (_files.modificationDate(path).has_value()) return failure(EEXIST, path);
  if (Result<void> made = _files.createDirectory(path.substr(0, nameStart(path))); !made) return made;
  return _files.write(path, Data());
}

Result<void> MemorySubmittableLogs::moveToSubmissionArea(std::string_view logType, const std::string& path) {
  note("submit", logType, path);
  if (_isRefusing) return failure(EPERM, path);
  const Result<Data> log = _files.read(path, kLargestLog);
  if (!log) return log.error();
  const std::string submitted = std::string(kSubmissionArea) + "/" + path.substr(nameStart(path));
  if (_files.modificationDate(submitted).has_value()) return failure(EEXIST, path);
  if (Result<void> made = _files.createDirectory(kSubmissionArea); !made) return made;
  if (Result<void> written = _files.write(submitted, *log); !written) return written;
  return _files.remove(path);
}

void MemorySubmittableLogs::note(std::string_view operation, std::string_view logType, const std::string& path) {
  MutexLock lock(_mutex);
  _calls.push_back(fmt::format("{} {} {}", operation, logType, path));
}

}  // namespace telvane::testing
