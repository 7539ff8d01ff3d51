#pragma once

#include <chrono>
#include <memory>
#include <string>

#include "foundation/ThreadAnnotations.h"
#include "foundation/UniqueFunction.h"

namespace telvane {

enum class QualityOfService { Utility, Default, UserInitiated };

// Runs jobs one at a time in the order in which they were given. Shared by whoever gives it work; jobs that wait keep
// it alive. Safe from any thread. A job may block (the pool behind it grows).
class CAPABILITY("queue") SerialQueue {
 public:
  virtual ~SerialQueue() = default;
  // Runs the job later, behind everything given before.
  virtual void async(Job job) = 0;
  // Runs the job on the caller's thread before it returns: at once when the queue is idle (nanoseconds, no hop) or when
  // the caller is already on this queue, in order behind what waits otherwise.
  virtual void sync(UniqueFunction<void()> job) = 0;
  // Gives the job to the queue once the delay has passed (monotonic time).
  virtual void asyncAfter(std::chrono::nanoseconds delay, Job job) = 0;
  // Whether the caller runs as a job of this queue.
  virtual bool isCurrent() const noexcept = 0;
  // Ends the process with a message when the caller does not run as a job of this queue.
  void assertOnQueue() const ASSERT_CAPABILITY(this);
  virtual const std::string& label() const noexcept = 0;
};

// Runs jobs side by side.
class ConcurrentQueue {
 public:
  virtual ~ConcurrentQueue() = default;
  virtual void async(Job job) = 0;
};

// A timer that fires once. Its owner cancels it or lets it go, which cancels too; handlers run on the timer's queue.
class Timer {
 public:
  virtual ~Timer() = default;
  // Stops the timer. The cancel handler runs once on the queue, also after a cancel that came when the timer had
  // already fired; a second cancel does nothing.
  virtual void cancel() = 0;
};

// A counting semaphore: the one way to wait for an answer.
class Semaphore {
 public:
  virtual ~Semaphore() = default;
  virtual void signal() = 0;
  virtual void wait() = 0;
  // Returns false when the time has passed without a signal.
  virtual bool waitFor(std::chrono::nanoseconds timeout) = 0;
};

// A re-entrant lock that may be held while its holder waits for something (a download). For everything short, use
// Mutex.
class CAPABILITY("monitor") Monitor {
 public:
  virtual ~Monitor() = default;
  virtual void lock() ACQUIRE() = 0;
  virtual void unlock() RELEASE() = 0;
};

class SCOPED_CAPABILITY MonitorLock {
 public:
  explicit MonitorLock(Monitor& monitor) ACQUIRE(monitor) : _monitor(monitor) { _monitor.lock(); }
  ~MonitorLock() RELEASE() { _monitor.unlock(); }
  MonitorLock(const MonitorLock&) = delete;
  MonitorLock& operator=(const MonitorLock&) = delete;

 private:
  Monitor& _monitor;
};

// Makes queues, timers, semaphores and monitors: threads in a real process, one seeded scheduler under a virtual clock
// in the simulation. Outlives everything that it made.
class Dispatch {
 public:
  virtual ~Dispatch() = default;
  virtual std::shared_ptr<SerialQueue> newSerialQueue(std::string label,
                                                      QualityOfService qos = QualityOfService::Default) = 0;
  virtual std::shared_ptr<ConcurrentQueue> newConcurrentQueue(std::string label,
                                                              QualityOfService qos = QualityOfService::Default) = 0;
  // Makes and starts a timer that fires once after the delay, up to leeway later, as a job of the queue.
  // onCancel may be empty.
  virtual std::unique_ptr<Timer> newTimer(std::shared_ptr<SerialQueue> queue, std::chrono::nanoseconds delay,
                                          std::chrono::nanoseconds leeway, Job onFire, Job onCancel) = 0;
  virtual std::shared_ptr<Semaphore> newSemaphore(unsigned count) = 0;
  virtual std::unique_ptr<Monitor> newMonitor() = 0;
};

}  // namespace telvane
