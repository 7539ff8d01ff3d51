#include "platform/dispatch/ThreadedConcurrentQueue.h"

#include "platform/dispatch/WorkerPool.h"

namespace telvane {

void ThreadedConcurrentQueue::async(Job job) { _pool.submit(std::move(job)); }

}  // namespace telvane
