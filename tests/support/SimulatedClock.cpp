#include "tests/support/SimulatedClock.h"

namespace telvane::testing {

void SimulatedClock::jumpCalendar(std::chrono::microseconds by) {
  if (_stoppedAt) {
    _stoppedAt = Date(_stoppedAt->time() + by);
  } else {
    _offset += by;
  }
}

void SimulatedClock::startCalendar() {
  if (!_stoppedAt) return;
  _offset += _stoppedAt->time() - runningNow().time();
  _stoppedAt.reset();
}

Date SimulatedClock::runningNow() const {
  const auto elapsed =
      std::chrono::duration_cast<std::chrono::microseconds>(_scheduler.now() - SimulatedScheduler::kStart);
  return Date(kCalendarStart.time() + elapsed + _offset);
}

}  // namespace telvane::testing
