#pragma once

#include <string>
#include <string_view>
#include <utility>
#include <vector>

#include "platform/Log.h"
#include "platform/Mutex.h"

namespace telvane {

// Keeps what is written until somebody takes it: for a program that shows what another would have logged. Safe from any
// thread. Keeps 4 MiB of text at most; how many lines found no room, an error line says in their place.
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
    if (_dropped > 0) _lines.push_back({LogLevel::Error, std::to_string(_dropped) + " more lines found no room"});
    _bytes = 0;
    _dropped = 0;
    return std::exchange(_lines, {});
  }

 private:
  static constexpr size_t kMaximumBytes = 4u << 20;

  void write(LogLevel level, std::string_view message) override {
    MutexLock lock(_mutex);
    if (message.size() > kMaximumBytes - _bytes) {
      ++_dropped;
      return;
    }
    _bytes += message.size();
    _lines.push_back({level, std::string(message)});
  }

  Mutex _mutex;
  std::vector<Line> _lines GUARDED_BY(_mutex);
  size_t _bytes GUARDED_BY(_mutex) = 0;
  size_t _dropped GUARDED_BY(_mutex) = 0;
};

}  // namespace telvane
