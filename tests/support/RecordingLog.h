#pragma once

#include <functional>
#include <string>
#include <string_view>
#include <vector>

#include "platform/Clock.h"
#include "platform/Log.h"
#include "platform/Mutex.h"

namespace telvane::testing {

// One message as it was written.
struct LogLine {
  Clock::MonotonicTime time;
  std::string process;
  LogLevel level = LogLevel::Default;
  std::string message;

  // "1000.250000 daemon <error> text", a line feed inside the text as "\n".
  std::string text() const;
};

// A log that keeps its lines in memory. Safe from any thread.
//
// Error lines are declared: one that was not expected fails the test when the log goes, and so does an expected one
// that never came. Where that is not the matter, allowErrors() ends it.
class RecordingLog final : public Log {
 public:
  using Observer = std::function<void(const LogLine& line)>;

  // clock: times the lines; without one they carry the epoch. observer: sees each line, may be empty.
  explicit RecordingLog(const Clock* clock = nullptr, std::string process = "test",
                        LogLevel leastImportant = LogLevel::Info, Observer observer = {});
  ~RecordingLog() override;

  // Declares error lines that contain this text, at least one.
  void expectError(std::string part);
  void allowErrors();

  std::vector<LogLine> lines() const;
  // Lines of that level that contain the text.
  size_t count(LogLevel level, std::string_view part) const;
  // Lines of any level that contain the text.
  size_t count(std::string_view part) const;
  bool contains(std::string_view part) const { return count(part) != 0; }
  // The whole log, one line per message, for comparing two runs byte by byte.
  std::string text() const;
  // What would fail the test now, one line each; empty when all is as declared.
  std::string undeclared() const;
  // Forgets the lines, not what was declared; declared errors that have come need not come again.
  void clear();

 private:
  struct Expectation {
    std::string part;
    bool hasCome = false;
  };
  void write(LogLevel level, std::string_view message) override;
  void checkDeclared(const LogLine& line) REQUIRES(_mutex);

  const Clock* const _clock;
  const std::string _process;
  const Observer _observer;
  mutable Mutex _mutex;
  std::vector<LogLine> _lines GUARDED_BY(_mutex);
  std::vector<Expectation> _expectations GUARDED_BY(_mutex);
  std::vector<std::string> _undeclaredErrors GUARDED_BY(_mutex);
  bool _allowsErrors GUARDED_BY(_mutex) = false;
};

}  // namespace telvane::testing
