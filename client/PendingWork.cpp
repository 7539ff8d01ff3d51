#include "client/PendingWork.h"

namespace telvane {

void PendingWork::begin() {
  MutexLock lock(_mutex);
  ++_count;
}

void PendingWork::end() {
  std::vector<std::shared_ptr<Semaphore>> waiters;
  {
    MutexLock lock(_mutex);
    if (--_count > 0) return;
    waiters.swap(_waiters);
  }
  for (const std::shared_ptr<Semaphore>& waiter : waiters) waiter->signal();
}

bool PendingWork::waitUntilNone(Dispatch& dispatch, std::chrono::nanoseconds timeout) {
  const std::shared_ptr<Semaphore> waiter = dispatch.newSemaphore(0);
  {
    MutexLock lock(_mutex);
    if (_count == 0) return true;
    _waiters.push_back(waiter);
  }
  return waiter->waitFor(timeout);
}

}  // namespace telvane
