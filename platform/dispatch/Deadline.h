#pragma once

#include <chrono>

namespace telvane {

// The point in monotonic time that is so far away; the last one there is, when that cannot be told.
inline std::chrono::steady_clock::time_point deadlineAfter(std::chrono::nanoseconds delay) {
  using TimePoint = std::chrono::steady_clock::time_point;
  const TimePoint now = std::chrono::steady_clock::now();
  return delay >= TimePoint::max() - now ? TimePoint::max() : now + delay;
}

}  // namespace telvane
