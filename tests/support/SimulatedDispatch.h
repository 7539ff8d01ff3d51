#pragma once

#include <memory>
#include <string>
#include <vector>

#include "platform/Dispatch.h"
#include "tests/support/SimulatedScheduler.h"
#include "tests/support/SimulatedSerialQueue.h"

namespace telvane::testing {

// The queues, timers and waits of one simulated process. Names in reports are the process's name and the queue's label.
// Once the process has ended, what is given to its queues is dropped, and sync runs at once on the caller.
class SimulatedDispatch final : public Dispatch {
 public:
  // Dispatch of a process of its own.
  SimulatedDispatch(SimulatedScheduler& scheduler, std::string processName);

  std::shared_ptr<SerialQueue> newSerialQueue(std::string label,
                                              QualityOfService qos = QualityOfService::Default) override;
  std::shared_ptr<ConcurrentQueue> newConcurrentQueue(std::string label,
                                                      QualityOfService qos = QualityOfService::Default) override;
  // REQUIRES: the queue is one of a SimulatedDispatch.
  std::unique_ptr<Timer> newTimer(std::shared_ptr<SerialQueue> queue, std::chrono::nanoseconds delay,
                                  std::chrono::nanoseconds leeway, Job onFire, Job onCancel) override;
  std::shared_ptr<Semaphore> newSemaphore(unsigned count) override;
  std::unique_ptr<Monitor> newMonitor() override;

  // The same queue as newSerialQueue makes, for the simulated parts.
  std::shared_ptr<SimulatedSerialQueue> newSimulatedQueue(std::string label);
  // Runs the job as a thread of this process that belongs to no queue.
  void spawn(std::string label, Job job);
  // Ends the process: everything that runs, waits or is set in it is gone.
  void end();
  SimulatedScheduler::ProcessID process() const noexcept { return _process; }
  SimulatedScheduler& scheduler() const noexcept { return _scheduler; }

 private:
  std::string nameInReports(const std::string& label) const { return _processName + "/" + label; }

  SimulatedScheduler& _scheduler;
  const std::string _processName;
  const SimulatedScheduler::ProcessID _process;
  std::vector<std::weak_ptr<SimulatedSerialQueue>> _queues;
  unsigned _semaphores = 0;
  unsigned _monitors = 0;
};

}  // namespace telvane::testing
