#pragma once

#include "platform/Dispatch.h"

namespace telvane {

class WorkerPool;

// A concurrent queue: a door to the pool, which ThreadedDispatch owns. Safe from any thread.
class ThreadedConcurrentQueue final : public ConcurrentQueue {
 public:
  explicit ThreadedConcurrentQueue(WorkerPool& pool) : _pool(pool) {}
  void async(Job job) override;

 private:
  WorkerPool& _pool;
};

}  // namespace telvane
