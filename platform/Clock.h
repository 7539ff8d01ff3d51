#pragma once

#include <chrono>

#include "foundation/Date.h"

namespace telvane {

// Tells the time. Calendar time may jump; monotonic time never does and is what durations and timers go by.
// Safe from any thread.
class Clock {
 public:
  using MonotonicTime = std::chrono::time_point<std::chrono::steady_clock, std::chrono::nanoseconds>;
  virtual ~Clock() = default;
  virtual Date now() const = 0;
  virtual MonotonicTime monotonicNow() const = 0;
};

}  // namespace telvane
