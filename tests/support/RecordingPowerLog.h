#pragma once

#include <mutex>
#include <string>
#include <utility>
#include <vector>

#include "platform/PowerLog.h"

namespace telvane::testing {

// Keeps what is noted. Safe from any thread.
class RecordingPowerLog final : public PowerLog {
 public:
  struct Entry {
    uint32_t eventClass = 0;
    std::string eventName;
    Dictionary payload;
  };

  void logRegisteredEvent(uint32_t eventClass, std::string_view eventName, const Dictionary& payload) override {
    const std::lock_guard lock(_mutex);
    _entries.push_back({eventClass, std::string(eventName), payload});
  }
  std::vector<Entry> entries() const {
    const std::lock_guard lock(_mutex);
    return _entries;
  }

 private:
  mutable std::mutex _mutex;
  std::vector<Entry> _entries;
};

}  // namespace telvane::testing
