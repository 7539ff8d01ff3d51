#include "platform/dispatch/SystemClock.h"

namespace telvane {

Date SystemClock::now() const {
  return Date(std::chrono::floor<std::chrono::microseconds>(std::chrono::system_clock::now()));
}

Clock::MonotonicTime SystemClock::monotonicNow() const { return std::chrono::steady_clock::now(); }

}  // namespace telvane
