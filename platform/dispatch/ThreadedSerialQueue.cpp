#include "platform/dispatch/ThreadedSerialQueue.h"

#include "platform/dispatch/CurrentQueues.h"
#include "platform/dispatch/TimerService.h"
#include "platform/dispatch/WorkerPool.h"

namespace telvane {

ThreadedSerialQueue::ThreadedSerialQueue(std::string label, WorkerPool& pool, TimerService& timers)
    : _label(std::move(label)), _pool(pool), _timers(timers) {}

void ThreadedSerialQueue::async(Job job) {
  State before;
  {
    MutexLock lock(_mutex);
    _waiting.push_back({std::move(job)});
    before = _state.exchange(HeldAndWantedByOthers, std::memory_order_acq_rel);
  }
  if (before == Free) runOnWorker();
}

void ThreadedSerialQueue::sync(UniqueFunction<void()> job) {
  State expected = Free;
  if (!_state.compare_exchange_strong(expected, Held, std::memory_order_acquire, std::memory_order_relaxed)) {
    if (isCurrent()) return runHolding(job);
    waitForTurn();
  }
  runHolding(job);
  giveBack();
}

void ThreadedSerialQueue::asyncAfter(std::chrono::nanoseconds delay, Job job) {
  if (delay <= std::chrono::nanoseconds::zero()) return async(std::move(job));
  _timers.schedule(delay, std::chrono::nanoseconds::zero(),
                   [self = shared_from_this(), job = std::move(job)]() mutable { self->async(std::move(job)); });
}

bool ThreadedSerialQueue::isCurrent() const noexcept { return CurrentQueues::contains(this); }

void ThreadedSerialQueue::runHolding(UniqueFunction<void()>& job) noexcept {
  const CurrentQueues::Scope scope(this);
  job();
}

void ThreadedSerialQueue::waitForTurn() {
  SyncCaller caller;
  {
    MutexLock lock(_mutex);
    const State before = _state.exchange(HeldAndWantedByOthers, std::memory_order_acq_rel);
    if (before == Free) return;
    _waiting.push_back({nullptr, &caller});
  }
  const WorkerPool::Blocking blocking;
  MutexLock lock(_mutex);
  while (!caller.isTurn) caller.turn.wait(_mutex);
}

void ThreadedSerialQueue::giveBack() {
  State expected = Held;
  if (_state.compare_exchange_strong(expected, Free, std::memory_order_release, std::memory_order_relaxed)) return;
  passOn();
}

void ThreadedSerialQueue::passOn() {
  {
    MutexLock lock(_mutex);
    if (passToSyncCallerOrFree()) return;
  }
  runOnWorker();
}

// Returns false when a job is next, for which the queue stays held.
bool ThreadedSerialQueue::passToSyncCallerOrFree() {
  if (_waiting.empty()) {
    _state.store(Free, std::memory_order_release);
    return true;
  }
  SyncCaller* caller = _waiting.front().caller;
  if (caller == nullptr) return false;
  _waiting.pop_front();
  caller->isTurn = true;
  caller->turn.notifyOne();  // with the mutex held: the caller's stack goes away once it has seen its turn
  return true;
}

void ThreadedSerialQueue::runOnWorker() {
  _pool.submit([self = shared_from_this()] { self->runWaitingJobs(); });
}

void ThreadedSerialQueue::runWaitingJobs() noexcept {
  const CurrentQueues::Scope scope(this);
  for (int count = 0; count < kJobsPerTurn || !_pool.hasWaitingJobs(); ++count) {
    Job job;
    {
      MutexLock lock(_mutex);
      if (passToSyncCallerOrFree()) return;
      job = std::move(_waiting.front().job);
      _waiting.pop_front();
    }
    job();
  }
  runOnWorker();
}

}  // namespace telvane
