#include "tests/support/SimulatedSemaphore.h"

#include <utility>

namespace telvane::testing {

SimulatedSemaphore::SimulatedSemaphore(SimulatedScheduler& scheduler, SimulatedScheduler::ProcessID process,
                                       unsigned count, std::string nameInReports)
    : _scheduler(scheduler), _process(process), _nameInReports(std::move(nameInReports)), _count(count) {}

void SimulatedSemaphore::signal() {
  if (_waiting.empty()) {
    ++_count;
    return _scheduler.callPoint();
  }
  const auto chosen = _waiting.begin() + static_cast<std::ptrdiff_t>(_scheduler.choose(_waiting.size()));
  SimulatedWait& answered = **chosen;
  _waiting.erase(chosen);
  _scheduler.answer(answered);
  _scheduler.callPoint();
}

void SimulatedSemaphore::wait() { waitUntil(std::nullopt); }

bool SimulatedSemaphore::waitFor(std::chrono::nanoseconds timeout) { return waitUntil(_scheduler.timeAfter(timeout)); }

bool SimulatedSemaphore::waitUntil(std::optional<SimulatedScheduler::Time> deadline) {
  if (_count > 0) {
    --_count;
    return true;
  }
  if (_scheduler.hasEnded(_process) && _scheduler.isMain()) return false;
  SimulatedWait wait(_nameInReports);
  _waiting.push_back(&wait);
  struct Cleanup {
    std::deque<SimulatedWait*>& waiting;
    SimulatedWait* wait;
    ~Cleanup() { std::erase(waiting, wait); }
  } cleanup{_waiting, &wait};
  return _scheduler.wait(wait, deadline);
}

}  // namespace telvane::testing
