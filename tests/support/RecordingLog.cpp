#include "tests/support/RecordingLog.h"

#include <gtest/gtest.h>

#include <utility>

namespace telvane::testing {

namespace {

const char* nameOf(LogLevel level) {
  switch (level) {
    case LogLevel::Error:
      return "error";
    case LogLevel::Default:
      return "default";
    case LogLevel::Info:
      return "info";
  }
  return "?";
}

}  // namespace

std::string LogLine::text() const {
  const std::chrono::duration<double> seconds = time.time_since_epoch();
  std::string line = fmt::format("{:.6f} {} <{}> ", seconds.count(), process, nameOf(level));
  for (char c : message) {
    if (c == '\n') {
      line += "\\n";
    } else {
      line += c;
    }
  }
  return line;
}

RecordingLog::RecordingLog(const Clock* clock, std::string process, LogLevel leastImportant, Observer observer)
    : Log(leastImportant), _clock(clock), _process(std::move(process)), _observer(std::move(observer)) {}

RecordingLog::~RecordingLog() {
  const std::string complaint = undeclared();
  if (!complaint.empty()) ADD_FAILURE() << "the log of " << _process << ":\n" << complaint;
}

void RecordingLog::expectError(std::string part) {
  MutexLock lock(_mutex);
  _expectations.push_back(Expectation{std::move(part)});
}

void RecordingLog::allowErrors() {
  MutexLock lock(_mutex);
  _allowsErrors = true;
}

std::vector<LogLine> RecordingLog::lines() const {
  MutexLock lock(_mutex);
  return _lines;
}

size_t RecordingLog::count(LogLevel level, std::string_view part) const {
  MutexLock lock(_mutex);
  size_t count = 0;
  for (const LogLine& line : _lines) {
    if (line.level == level && line.message.find(part) != std::string::npos) ++count;
  }
  return count;
}

size_t RecordingLog::count(std::string_view part) const {
  return count(LogLevel::Error, part) + count(LogLevel::Default, part) + count(LogLevel::Info, part);
}

std::string RecordingLog::text() const {
  std::string text;
  for (const LogLine& line : lines()) text += line.text() + "\n";
  return text;
}

std::string RecordingLog::undeclared() const {
  MutexLock lock(_mutex);
  std::string text;
  if (!_allowsErrors) {
    for (const std::string& line : _undeclaredErrors) text += "an error line that was not declared: " + line + "\n";
  }
  for (const Expectation& expected : _expectations) {
    if (!expected.hasCome) text += "a declared error line did not come: " + expected.part + "\n";
  }
  return text;
}

void RecordingLog::clear() {
  MutexLock lock(_mutex);
  _lines.clear();
}

void RecordingLog::write(LogLevel level, std::string_view message) {
  LogLine line{_clock != nullptr ? _clock->monotonicNow() : Clock::MonotonicTime(), _process, level,
               std::string(message)};
  {
    MutexLock lock(_mutex);
    _lines.push_back(line);
    if (level == LogLevel::Error) checkDeclared(line);
  }
  if (_observer) _observer(line);
}

void RecordingLog::checkDeclared(const LogLine& line) {
  bool isDeclared = false;
  for (Expectation& expected : _expectations) {
    if (line.message.find(expected.part) == std::string::npos) continue;
    expected.hasCome = true;
    isDeclared = true;
  }
  if (!isDeclared) _undeclaredErrors.push_back(line.text());
}

}  // namespace telvane::testing
