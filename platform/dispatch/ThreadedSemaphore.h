#pragma once

#include <memory>

#include "platform/Dispatch.h"
#include "platform/Mutex.h"
#include "platform/dispatch/Condition.h"

namespace telvane {

// A semaphore on which workers wait with the pool's knowledge. Safe from any thread.
class ThreadedSemaphore final : public Semaphore, public std::enable_shared_from_this<ThreadedSemaphore> {
 public:
  explicit ThreadedSemaphore(unsigned count) : _count(count) {}

  void signal() override;
  void wait() override;
  bool waitFor(std::chrono::nanoseconds timeout) override;

 private:
  bool tryToTake();
  bool takeUntil(std::chrono::steady_clock::time_point deadline);

  Mutex _mutex;
  unsigned _count GUARDED_BY(_mutex);
  unsigned _waiters GUARDED_BY(_mutex) = 0;
  Condition _signalled;
};

}  // namespace telvane
