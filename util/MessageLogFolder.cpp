#include "util/MessageLogFolder.h"

#include <algorithm>
#include <cerrno>

namespace telvane {
namespace {

constexpr std::string_view kFirstPart = "telvaned";
constexpr std::string_view kLastPart = "messageLog.ips";
constexpr char kSeparator = '_';

// "2024-05-01-13-45-10" in local time.
std::string timeForName(const Platform& platform) {
  constexpr size_t kLengthWithoutOffset = 19;
  const Date now = platform.clock.now();
  const Date local(now.time() + platform.locale.secondsFromGMT(now));
  std::string text = local.description().substr(0, kLengthWithoutOffset);
  std::replace(text.begin(), text.end(), ' ', '-');
  std::replace(text.begin(), text.end(), ':', '-');
  return text;
}

Value dateOrNull(const std::optional<Date>& date) { return date.has_value() ? Value(*date) : Value(); }

}  // namespace

MessageLogFolder::MessageLogFolder(Platform& platform) : _platform(platform), _path(platform.files.resolve(kPath)) {}

bool MessageLogFolder::isMessageLog(std::string_view name) {
  const size_t first = name.find(kSeparator);
  const size_t last = name.rfind(kSeparator);
  if (first == std::string_view::npos || first == last) return false;
  const bool hasThreeParts = name.find(kSeparator, first + 1) == last;
  return hasThreeParts && name.substr(0, first) == kFirstPart && name.substr(last + 1) == kLastPart;
}

std::vector<std::string> MessageLogFolder::messageLogs() {
  std::vector<std::string> paths;
  const Result<std::vector<std::string>> names = _platform.files.filesIn(_path);
  if (names.has_value()) {
    for (const std::string& name : *names) {
      if (isMessageLog(name)) paths.push_back(_path + "/" + name);
    }
    return paths;
  }
  if (names.error().code() != ENOENT) {
    _platform.log.error("writeToLogFile: Error reading from log directory: {}", names.error());
    return paths;
  }
  _platform.log.message("writeToLogFile: Creating telvaned log directory at {}", _path);
  if (const Result<void> made = _platform.files.createDirectory(_path); !made) {
    _platform.log.error("writeToLogFile: {}", made.error());
  }
  return paths;
}

bool MessageLogFolder::hasFile(const std::string& name) const {
  const Result<std::vector<std::string>> names = _platform.files.filesIn(_path);
  return names.has_value() && std::binary_search(names->begin(), names->end(), name);
}

void MessageLogFolder::createNewLogFile(std::optional<std::string>* logFilePath,
                                        std::optional<Date>* logFileCreationDate) {
  if (logFilePath == nullptr || logFileCreationDate == nullptr) {
    _platform.log.error("createNewLogFile: both logFilePath and logFileCreationDate must not be nil");
    return;
  }
  logFilePath->reset();
  logFileCreationDate->reset();
  const std::string name = fmt::format("{}_{}_{}", kFirstPart, timeForName(_platform), kLastPart);
  std::string path = _path + "/" + name;
  const Result<void> made = _platform.submittableLogs.createTemporaryLog(kLogType, path);
  // What counts is that there is a file, also one that was there before.
  const bool isThere = made.has_value() ? _platform.files.modificationDate(path).has_value() : hasFile(name);
  if (!isThere) {
    if (!made) _platform.log.error("createNewLogFile: {}", made.error());
    _platform.log.error("writeToLogFile: Failed to create new telvaned log file {}", path);
    return;
  }
  *logFileCreationDate = _platform.files.creationDate(path);
  _platform.log.message("writeToLogFile: Created new telvaned log file {} ({})", path,
                        dateOrNull(*logFileCreationDate));
  *logFilePath = std::move(path);
}

void MessageLogFolder::deleteExpiredLogFile(const std::string& path, const std::optional<Date>& creationDate) {
  const Result<void> submitted = _platform.submittableLogs.moveToSubmissionArea(kLogType, path);
  if (submitted.has_value()) {
    _platform.log.message("deleteExpiredLogFile: QueueLogForUpload succesfully submitted log file {} ({})", path,
                          dateOrNull(creationDate));
    return;
  }
  if (const Result<void> removed = _platform.files.remove(path); !removed) {
    _platform.log.error("deleteExpiredLogFile: neither submitted ({}) nor deleted ({})", submitted.error(),
                        removed.error());
    return;
  }
  _platform.log.message("deleteExpiredLogFile: Deleted expired telvaned log file {} ({})", path,
                        dateOrNull(creationDate));
}

}  // namespace telvane
