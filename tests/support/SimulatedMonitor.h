#pragma once

#include <deque>
#include <string>
#include <utility>

#include "platform/Dispatch.h"
#include "tests/support/SimulatedScheduler.h"

namespace telvane::testing {

// A re-entrant lock between strands. Who of several that wait gets it next is the seed's choice. Made by
// SimulatedDispatch.
class SimulatedMonitor final : public Monitor {
 public:
  SimulatedMonitor(SimulatedScheduler& scheduler, std::string nameInReports);

  void lock() ACQUIRE() override;
  // Throws SimulationFailure when another strand has it.
  void unlock() RELEASE() override;

 private:
  using Waiting = std::pair<SimulatedWait*, const SimulatedStrand*>;
  void waitForTurn();
  void handOver();

  SimulatedScheduler& _scheduler;
  const std::string _nameInReports;
  const SimulatedStrand* _holder = nullptr;
  unsigned _depth = 0;
  std::deque<Waiting> _waiting;
};

}  // namespace telvane::testing
