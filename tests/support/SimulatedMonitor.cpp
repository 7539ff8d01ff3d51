#include "tests/support/SimulatedMonitor.h"

#include <algorithm>

namespace telvane::testing {

SimulatedMonitor::SimulatedMonitor(SimulatedScheduler& scheduler, std::string nameInReports)
    : _scheduler(scheduler), _nameInReports(std::move(nameInReports)) {}

void SimulatedMonitor::lock() NO_THREAD_SAFETY_ANALYSIS {
  if (_holder == nullptr) _holder = _scheduler.current();
  if (_holder != _scheduler.current()) waitForTurn();
  ++_depth;
}

void SimulatedMonitor::unlock() NO_THREAD_SAFETY_ANALYSIS {
  if (_holder != _scheduler.current())
    throw SimulationFailure(_nameInReports + " is unlocked by who has not locked it");
  if (--_depth == 0) handOver();
}

void SimulatedMonitor::waitForTurn() {
  SimulatedWait turn(_nameInReports, &_holder);
  _waiting.emplace_back(&turn, _scheduler.current());
  try {
    _scheduler.wait(turn);
  } catch (...) {
    std::erase_if(_waiting, [&turn](const Waiting& waiting) { return waiting.first == &turn; });
    if (_holder == _scheduler.current()) handOver();
    throw;
  }
}

void SimulatedMonitor::handOver() {
  _holder = nullptr;
  if (_waiting.empty()) return;
  const auto chosen = _waiting.begin() + static_cast<std::ptrdiff_t>(_scheduler.choose(_waiting.size()));
  const Waiting next = *chosen;
  _waiting.erase(chosen);
  _holder = next.second;
  _scheduler.answer(*next.first);
}

}  // namespace telvane::testing
