#include "platform/dispatch/ThreadedSemaphore.h"

#include "platform/dispatch/Deadline.h"
#include "platform/dispatch/WorkerPool.h"

namespace telvane {

void ThreadedSemaphore::signal() {
  // Whoever waits may let go of the semaphore as soon as the mutex is free.
  const std::shared_ptr<ThreadedSemaphore> self = shared_from_this();
  {
    MutexLock lock(_mutex);
    ++_count;
    if (_waiters == 0) return;
  }
  _signalled.notifyOne();
}

void ThreadedSemaphore::wait() {
  if (!tryToTake()) takeUntil(std::chrono::steady_clock::time_point::max());
}

bool ThreadedSemaphore::waitFor(std::chrono::nanoseconds timeout) {
  if (tryToTake()) return true;
  return timeout > std::chrono::nanoseconds::zero() && takeUntil(deadlineAfter(timeout));
}

bool ThreadedSemaphore::takeUntil(std::chrono::steady_clock::time_point deadline) {
  const WorkerPool::Blocking blocking;
  MutexLock lock(_mutex);
  ++_waiters;
  bool isInTime = true;
  while (_count == 0 && isInTime) isInTime = _signalled.waitUntil(_mutex, deadline);
  --_waiters;
  if (_count == 0) return false;
  --_count;
  return true;
}

bool ThreadedSemaphore::tryToTake() {
  MutexLock lock(_mutex);
  if (_count == 0) return false;
  --_count;
  return true;
}

}  // namespace telvane
