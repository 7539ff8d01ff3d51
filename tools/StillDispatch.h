#pragma once

#include <memory>
#include <string>

#include "platform/Dispatch.h"

namespace telvane {

// Queues without threads, under a clock that stands still: a job runs on the thread that gives it, before that goes on,
// unless the queue is busy, which then runs it next. What is to happen later never does: delayed jobs are dropped, and
// timers, which can be cancelled like others, do not fire. For deciding what would be, without beginning it.
//
// Used by one thread. Semaphores and monitors are those of the system, since nothing here has to wait for anything.
class StillDispatch final : public Dispatch {
 public:
  // system: outlives this.
  explicit StillDispatch(Dispatch& system) : _system(system) {}

  std::shared_ptr<SerialQueue> newSerialQueue(std::string label, QualityOfService qos) override;
  std::shared_ptr<ConcurrentQueue> newConcurrentQueue(std::string label, QualityOfService qos) override;
  std::unique_ptr<Timer> newTimer(std::shared_ptr<SerialQueue> queue, std::chrono::nanoseconds delay,
                                  std::chrono::nanoseconds leeway, Job onFire, Job onCancel) override;
  std::shared_ptr<Semaphore> newSemaphore(unsigned count) override { return _system.newSemaphore(count); }
  std::unique_ptr<Monitor> newMonitor() override { return _system.newMonitor(); }

 private:
  Dispatch& _system;
};

}  // namespace telvane
