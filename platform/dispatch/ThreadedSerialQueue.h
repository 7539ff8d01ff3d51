#pragma once

#include <atomic>
#include <deque>
#include <memory>
#include <string>

#include "platform/Dispatch.h"
#include "platform/Mutex.h"
#include "platform/dispatch/Condition.h"

namespace telvane {

class TimerService;
class WorkerPool;

// A serial queue on the threads of a pool. Made by ThreadedDispatch, which outlives it.
//
// The queue is held by one thread at a time: a worker that runs what waits, or a caller of sync. A free queue is taken
// and given back with one atomic step each, which is all that sync on an idle queue costs. Whoever gives a held queue
// back passes it on in order: to a caller of sync that waits (it goes on in its own thread), or to a worker.
// The caller of sync holds a reference to the queue for the time of the call. Jobs must not throw: that ends the
// process.
class ThreadedSerialQueue final : public SerialQueue, public std::enable_shared_from_this<ThreadedSerialQueue> {
 public:
  ThreadedSerialQueue(std::string label, WorkerPool& pool, TimerService& timers);

  void async(Job job) override;
  void sync(UniqueFunction<void()> job) override;
  void asyncAfter(std::chrono::nanoseconds delay, Job job) override;
  bool isCurrent() const noexcept override;
  const std::string& label() const noexcept override { return _label; }

 private:
  // A busy queue lets other queues have its worker after this many jobs, when they need one.
  static constexpr int kJobsPerTurn = 256;

  enum State : int { Free, Held, HeldAndWantedByOthers };
  // A caller of sync that waits for its turn. Lives on that caller's stack.
  struct SyncCaller {
    Condition turn;
    bool isTurn = false;
  };
  // One thing that waits: a job or a caller of sync.
  struct Waiting {
    Job job;
    SyncCaller* caller = nullptr;
  };

  void runHolding(UniqueFunction<void()>& job) noexcept;
  void waitForTurn();
  void giveBack();
  void passOn();
  bool passToSyncCallerOrFree() REQUIRES(_mutex);
  void runOnWorker();
  void runWaitingJobs() noexcept;

  // Constant after construction.
  const std::string _label;
  WorkerPool& _pool;
  TimerService& _timers;

  // Free means that nothing waits, so that the fast way cannot overtake. Leaves Free without the mutex, enters Free
  // from HeldAndWantedByOthers, and enters that, with it.
  std::atomic<State> _state{Free};

  Mutex _mutex;
  std::deque<Waiting> _waiting GUARDED_BY(_mutex);
};

}  // namespace telvane
