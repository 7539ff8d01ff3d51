#pragma once

#include <atomic>

#include "platform/ProcessMemory.h"

namespace telvane::testing {

// A process that takes as much memory as the test says. Safe from any thread.
class FixedProcessMemory final : public ProcessMemory {
 public:
  static constexpr uint64_t kUsual = 12'582'912;  // bytes

  void set(uint64_t bytes) { _bytes = bytes; }
  uint64_t taskMemory() const override { return _bytes; }

 private:
  std::atomic<uint64_t> _bytes{kUsual};
};

}  // namespace telvane::testing
