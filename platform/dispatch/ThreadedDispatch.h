#pragma once

#include "platform/Dispatch.h"
#include "platform/dispatch/TimerService.h"
#include "platform/dispatch/WorkerPool.h"

namespace telvane {

// Queues, timers and waits of a real process, on threads. Made by the entry point (or by the client library on its
// first use), outlives all that it made. Makes no thread before there is a job or a timer; its threads block all
// signals.
//
// Letting go of it drops what has not fired yet (timers, delayed jobs), then runs all jobs that were given, and those
// which these give, and returns when they have ended. It must not happen in one of its jobs. In the child of a fork the
// threads are gone and locks may be held for ever: the child leaks the object and neither uses nor destroys it.
//
// Quality of service is taken as a hint and not acted upon: all jobs share one pool in the order in which they come,
// because a less urgent job that an urgent one waits for would otherwise hold up both.
class ThreadedDispatch final : public Dispatch {
 public:
  explicit ThreadedDispatch(const WorkerPool::Options& options = {});
  ~ThreadedDispatch() override;

  std::shared_ptr<SerialQueue> newSerialQueue(std::string label, QualityOfService qos) override;
  std::shared_ptr<ConcurrentQueue> newConcurrentQueue(std::string label, QualityOfService qos) override;
  std::unique_ptr<Timer> newTimer(std::shared_ptr<SerialQueue> queue, std::chrono::nanoseconds delay,
                                  std::chrono::nanoseconds leeway, Job onFire, Job onCancel) override;
  std::shared_ptr<Semaphore> newSemaphore(unsigned count) override;
  std::unique_ptr<Monitor> newMonitor() override;

 private:
  // In this order: jobs that run while the pool ends may still ask for timers, which then are dropped.
  TimerService _timers;
  WorkerPool _pool;
};

}  // namespace telvane
