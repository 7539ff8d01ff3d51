#pragma once

#include <optional>

#include "platform/Clock.h"
#include "tests/support/SimulatedScheduler.h"

namespace telvane::testing {

// The scheduler's time as a clock. The calendar starts at 2026-01-01 00:00:00 UTC and may be set, made to jump, and
// stopped, all of which monotonic time does not feel.
class SimulatedClock final : public Clock {
 public:
  static constexpr Date kCalendarStart{Date::TimePoint(std::chrono::seconds(1'767'225'600))};

  explicit SimulatedClock(const SimulatedScheduler& scheduler) : _scheduler(scheduler) {}

  Date now() const override { return _stoppedAt ? *_stoppedAt : runningNow(); }
  MonotonicTime monotonicNow() const override { return _scheduler.now(); }

  // Moves the calendar, forwards or backwards.
  void jumpCalendar(std::chrono::microseconds by);
  void setCalendar(Date date) { jumpCalendar(date.time() - now().time()); }
  void stopCalendar() { _stoppedAt = now(); }
  // Goes on from where the calendar stands.
  void startCalendar();

 private:
  Date runningNow() const;

  const SimulatedScheduler& _scheduler;
  std::chrono::microseconds _offset{0};
  std::optional<Date> _stoppedAt;
};

}  // namespace telvane::testing
