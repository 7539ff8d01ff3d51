#pragma once

#include <chrono>
#include <cstdint>
#include <map>

#include "foundation/UniqueFunction.h"
#include "platform/Mutex.h"
#include "platform/dispatch/Condition.h"
#include "platform/dispatch/Thread.h"

namespace telvane {

// Runs short jobs at a later time, on one thread of its own that starts with the first of them. The thread sleeps until
// the next job is due and not at all otherwise; it needs no descriptor, so timers work when none is left. Owned by
// ThreadedDispatch. Safe from any thread.
class TimerService {
 public:
  using TimePoint = std::chrono::steady_clock::time_point;
  // Names a scheduled job.
  struct Ticket {
    TimePoint due;
    uint64_t number = 0;
    auto operator<=>(const Ticket&) const = default;
  };

  TimerService() = default;
  ~TimerService();
  TimerService(const TimerService&) = delete;
  TimerService& operator=(const TimerService&) = delete;

  // Runs the job on the service's thread once the delay has passed, up to leeway later: jobs with a leeway gather at
  // common points in time. The job must be short, it hands work to a queue. Does nothing after stop.
  Ticket schedule(std::chrono::nanoseconds delay, std::chrono::nanoseconds leeway, Job job);
  // Drops the job. Returns false when it has been taken to be run, or has run. Never wakes the thread.
  bool cancel(const Ticket& ticket);
  // Ends the thread and drops what has not run. REQUIRES: not called in a job of the service.
  void stop();

 private:
  void startThread() REQUIRES(_mutex);
  void run();
  void runDueJobs() REQUIRES(_mutex);

  Mutex _mutex;
  std::map<Ticket, Job> _jobs GUARDED_BY(_mutex);
  uint64_t _lastNumber GUARDED_BY(_mutex) = 0;
  TimePoint _wakeUp GUARDED_BY(_mutex) = TimePoint::max();  // when the thread looks again by itself
  bool _isStopped GUARDED_BY(_mutex) = false;
  Condition _changed;
  Thread _thread GUARDED_BY(_mutex);
};

}  // namespace telvane
