#pragma once

#include <deque>
#include <string>

#include "platform/Dispatch.h"
#include "tests/support/SimulatedScheduler.h"

namespace telvane::testing {

// A semaphore whose wait lets other strands run. Who of several that wait goes on is the seed's choice. Made by
// SimulatedDispatch. Once its process has ended, nobody waits any more.
class SimulatedSemaphore final : public Semaphore {
 public:
  SimulatedSemaphore(SimulatedScheduler& scheduler, SimulatedScheduler::ProcessID process, unsigned count,
                     std::string nameInReports);

  void signal() override;
  void wait() override;
  bool waitFor(std::chrono::nanoseconds timeout) override;

 private:
  bool waitUntil(std::optional<SimulatedScheduler::Time> deadline);

  SimulatedScheduler& _scheduler;
  const SimulatedScheduler::ProcessID _process;
  const std::string _nameInReports;
  unsigned _count;
  std::deque<SimulatedWait*> _waiting;
};

}  // namespace telvane::testing
