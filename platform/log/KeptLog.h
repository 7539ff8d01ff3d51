#pragma once

#include <string>
#include <string_view>
#include <utility>
#include <vector>

#include "platform/Log.h"
#include "platform/Mutex.h"

namespace telvane {

// Keeps what is written until somebody takes it: for a program that shows what another would have logged. Safe from any
// thread.
class KeptLog final : public Log {
 public:
  struct Line {
    LogLevel level;
    std::string message;
  };

  explicit KeptLog(LogLevel leastImportant = LogLevel::Default) noexcept : Log(leastImportant) {}

  // Returns the lines since the last time, in the order in which they were written.
  std::vector<Line> take() {
    MutexLock lock(_mutex);
    return std::exchange(_lines, {});
  }

 private:
  void write(LogLevel level, std::string_view message) override {
    MutexLock lock(_mutex);
    _lines.push_back({level, std::string(message)});
  }

  Mutex _mutex;
  std::vector<Line> _lines GUARDED_BY(_mutex);
};

}  // namespace telvane
