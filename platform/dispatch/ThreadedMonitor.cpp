#include "platform/dispatch/ThreadedMonitor.h"

#include "platform/dispatch/WorkerPool.h"

namespace telvane {

void ThreadedMonitor::lock() NO_THREAD_SAFETY_ANALYSIS {
  if (_mutex.try_lock()) return;
  const WorkerPool::Blocking blocking;
  _mutex.lock();
}

void ThreadedMonitor::unlock() NO_THREAD_SAFETY_ANALYSIS { _mutex.unlock(); }

}  // namespace telvane
