#include "util/MessageLogFile.h"

namespace telvane {

MessageLogFile::MessageLogFile(Platform& platform)
    : _platform(platform), _lock(platform.dispatch.newMonitor()), _folder(platform) {}

void MessageLogFile::appendMessage(const std::string& message) {
  MonitorLock lock(*_lock);
  const Date now = _platform.clock.now();
  if (isScanDue(now)) scan(now);
  if (_currentPath.has_value()) appendLine(message, now);
}

bool MessageLogFile::isScanDue(Date now) const {
  if (!_currentPath.has_value()) return true;
  return _currentCreationDate.has_value() && MessageLogFolder::isExpired(*_currentCreationDate, now);
}

void MessageLogFile::scan(Date now) {
  for (const std::string& path : _folder.messageLogs()) considerFile(path, now);
  if (!_currentPath.has_value()) _folder.createNewLogFile(&_currentPath, &_currentCreationDate);
}

void MessageLogFile::considerFile(const std::string& path, Date now) {
  const bool isGoneMeanwhile = !_platform.files.modificationDate(path).has_value();
  if (isGoneMeanwhile) return;
  const std::optional<Date> creationDate = _platform.files.creationDate(path);
  if (creationDate.has_value() && MessageLogFolder::isExpired(*creationDate, now)) {
    retire(path, creationDate);
    return;
  }
  const bool isCurrentKnown = _currentPath.has_value() && _currentCreationDate.has_value();
  if (!isCurrentKnown || path == *_currentPath) {
    adopt(path, creationDate);
    return;
  }
  const bool isNewer = creationDate.has_value() && *creationDate > *_currentCreationDate;
  if (!isNewer) {
    retire(path, creationDate);
    return;
  }
  retire(std::string(*_currentPath), std::optional<Date>(_currentCreationDate));
  adopt(path, creationDate);
}

void MessageLogFile::adopt(const std::string& path, std::optional<Date> creationDate) {
  _currentPath = path;
  _currentCreationDate = creationDate;
}

void MessageLogFile::retire(const std::string& path, const std::optional<Date>& creationDate) {
  _folder.deleteExpiredLogFile(path, creationDate);
  if (path != _currentPath) return;
  _currentPath.reset();
  _currentCreationDate.reset();
}

void MessageLogFile::appendLine(const std::string& message, Date now) {
  Result<std::unique_ptr<AppendableFile>> file = _platform.files.openForAppending(*_currentPath);
  if (!file) {
    _platform.log.error("writeToLogFile: Message lost: {}", file.error());
    _folder.createNewLogFile(&_currentPath, &_currentCreationDate);
    return;
  }
  if (const Result<void> added = (*file)->append(fmt::format("({}) {}\n", now, message)); !added) {
    _platform.log.error("writeToLogFile: Message lost: {}", added.error());
    return;
  }
  _platform.log.message("writeToLogFile: Saved log message to {}", *_currentPath);
}

}  // namespace telvane
