#pragma once

#include <chrono>
#include <compare>
#include <cstdint>
#include <string>

#include "foundation/Export.h"

namespace telvane {

// A point in calendar time with microsecond resolution. A value. It is not a monotonic clock: use Clock::monotonicNow
// of the platform for durations.
class TELVANE_EXPORT Date {
 public:
  using TimePoint = std::chrono::sys_time<std::chrono::microseconds>;

  constexpr Date() noexcept = default;
  constexpr explicit Date(TimePoint time) noexcept : _time(time) {}
  // Non-finite and out-of-range values become the epoch.
  static Date fromSecondsSince1970(double seconds) noexcept;

  constexpr TimePoint time() const noexcept { return _time; }
  // Seconds since 1970 with the microseconds in the fraction.
  double secondsSince1970() const noexcept;
  // Whole seconds since 1970, rounded towards the past, and the microseconds (0 to 999999) beside them.
  int64_t wholeSeconds() const noexcept;
  int32_t microseconds() const noexcept;
  // UTC, "2024-05-01 13:45:10 +0000".
  std::string description() const;

  friend constexpr auto operator<=>(const Date&, const Date&) = default;  // NOLINT(modernize-use-nullptr)

 private:
  TimePoint _time{};
};

}  // namespace telvane
