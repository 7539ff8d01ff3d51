#pragma once

#include <deque>
#include <memory>
#include <string>

#include "platform/Dispatch.h"
#include "tests/support/SimulatedScheduler.h"

namespace telvane::testing {

// A serial queue of a simulated process. Each job is a strand of its own, so that between two jobs of one queue the
// seed may let jobs of others run. Made by SimulatedDispatch.
class SimulatedSerialQueue final : public SerialQueue, public std::enable_shared_from_this<SimulatedSerialQueue> {
 public:
  SimulatedSerialQueue(SimulatedScheduler& scheduler, SimulatedScheduler::ProcessID process, std::string label,
                       std::string nameInReports);

  void async(Job job) override;
  void sync(UniqueFunction<void()> job) override;
  void asyncAfter(std::chrono::nanoseconds delay, Job job) override;
  bool isCurrent() const noexcept override;
  const std::string& label() const noexcept override { return _label; }

  // Like async, but never a point where the caller is overtaken; for the simulated parts.
  void post(Job job);
  // Drops what waits: the process has ended.
  void clear();

 private:
  // A job, or a strand that waits for its turn in sync.
  struct Entry {
    Job job;
    SimulatedWait* turn = nullptr;
    const SimulatedStrand* strand = nullptr;
  };
  // The queue is taken by the current strand as long as this lives.
  class Hold;

  void waitForTurn();
  void release();
  void startNext();
  void runNext();

  SimulatedScheduler& _scheduler;
  const SimulatedScheduler::ProcessID _process;
  const std::string _label;
  const std::string _nameInReports;
  std::deque<Entry> _entries;
  const SimulatedStrand* _holder = nullptr;
  bool _isScheduled = false;
};

}  // namespace telvane::testing
