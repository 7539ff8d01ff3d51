#include "platform/dispatch/ThreadedDispatch.h"

#include "platform/dispatch/ThreadedConcurrentQueue.h"
#include "platform/dispatch/ThreadedMonitor.h"
#include "platform/dispatch/ThreadedSemaphore.h"
#include "platform/dispatch/ThreadedSerialQueue.h"
#include "platform/dispatch/ThreadedTimer.h"

namespace telvane {

ThreadedDispatch::ThreadedDispatch(const WorkerPool::Options& options) : _pool(options) {}

ThreadedDispatch::~ThreadedDispatch() { _timers.stop(); }

std::shared_ptr<SerialQueue> ThreadedDispatch::newSerialQueue(std::string label, QualityOfService /*qos*/) {
  return std::make_shared<ThreadedSerialQueue>(std::move(label), _pool, _timers);
}

std::shared_ptr<ConcurrentQueue> ThreadedDispatch::newConcurrentQueue(std::string /*label*/, QualityOfService /*qos*/) {
  return std::make_shared<ThreadedConcurrentQueue>(_pool);
}

std::unique_ptr<Timer> ThreadedDispatch::newTimer(std::shared_ptr<SerialQueue> queue, std::chrono::nanoseconds delay,
                                                  std::chrono::nanoseconds leeway, Job onFire, Job onCancel) {
  return std::make_unique<ThreadedTimer>(_timers, std::move(queue), delay, leeway, std::move(onFire),
                                         std::move(onCancel));
}

std::shared_ptr<Semaphore> ThreadedDispatch::newSemaphore(unsigned count) {
  return std::make_shared<ThreadedSemaphore>(count);
}

std::unique_ptr<Monitor> ThreadedDispatch::newMonitor() { return std::make_unique<ThreadedMonitor>(); }

}  // namespace telvane
