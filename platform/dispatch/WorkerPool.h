#pragma once

#include <atomic>
#include <chrono>
#include <cstdint>
#include <deque>
#include <memory>
#include <vector>

#include "foundation/UniqueFunction.h"
#include "platform/Mutex.h"
#include "platform/dispatch/Condition.h"
#include "platform/dispatch/Thread.h"

namespace telvane {

// The threads that run the jobs of all queues, in the order in which the jobs come. Owned by ThreadedDispatch.
//
// Jobs may block. Up to `concurrency` workers run side by side; a worker that waits on one of our primitives says so
// (Blocking) and is not counted, so that another takes its place at once. One that blocks in some other way is noticed:
// when jobs wait and none is taken for kStallTime, one worker more is let in. No job is refused; above
// `maximumWorkers` jobs wait, so at most that many may block at the same time for something that a later job brings.
//
// A single job that a running job submits is left for the same worker, which is about to be free and whose caches are
// warm: most jobs hand over to another queue as the last thing they do, and to wake a thread costs more than such a
// job. Should the running job announce a wait, another worker takes the job at once; should it just go on, then after
// about kHandOverTime.
//
// When the system refuses a thread, jobs wait for the workers there are, or for the next submit.
//
// Threads start with the first job, with signals blocked. A worker without work for `idleTime` ends, except for the
// `keptWorkers` that slept longest; those wait without a time-out, so an idle pool never wakes up.
//
// A job must not throw: an exception that leaves it ends the process. Letting go of the pool runs all jobs that it was
// given, and those that these give to it, and returns when the last worker has ended. It must not happen in a job.
// In the child of a fork there are no workers; the child must leave the pool alone and not destroy it.
class WorkerPool {
 public:
  static constexpr std::chrono::milliseconds kStallTime{1};
  static constexpr std::chrono::milliseconds kHandOverTime{4};

  struct Options {
    unsigned concurrency = defaultConcurrency();
    unsigned maximumWorkers = 512;
    unsigned keptWorkers = 2;
    std::chrono::nanoseconds idleTime = std::chrono::seconds(5);
  };

  WorkerPool() : WorkerPool(Options()) {}
  explicit WorkerPool(const Options& options);
  ~WorkerPool();
  WorkerPool(const WorkerPool&) = delete;
  WorkerPool& operator=(const WorkerPool&) = delete;

  // Runs the job later on a worker. Safe from any thread.
  void submit(Job job);
  // Whether jobs wait for a worker. A hint that costs one read: a long job may use it to let others go first.
  bool hasWaitingJobs() const noexcept { return _waitingCount.load(std::memory_order_relaxed) != 0; }
  // The number of threads there are now.
  size_t workerCount() const;

  // Marks the time in which the calling thread waits for another. Does nothing on a thread that is no worker.
  class Blocking {
   public:
    Blocking();
    ~Blocking();
    Blocking(const Blocking&) = delete;
    Blocking& operator=(const Blocking&) = delete;

   private:
    const bool _isWorker;
  };

 private:
  // A worker that is Blocked, by its own word or because it stalled the others, is not counted as a runner.
  enum class State { Unused, Idle, Watching, Running, Blocked };
  static constexpr uint64_t kNoJob = 0;
  struct Worker {
    State state = State::Unused;
    uint64_t jobNumber = kNoJob;  // of the job it runs: the lower, the longer it has been at it
    Condition wake;
    Thread thread;
  };

  static unsigned defaultConcurrency();

  // Brings in a worker, if there may be one more, when jobs wait: a runner, or one that watches for a stall. Returns
  // the sleeper, if it takes one, that the caller wakes once it has let go of the mutex, which the sleeper needs first.
  // isTaken: a running worker means to take the jobs, so that a watcher is enough.
  [[nodiscard]] Worker* engage(bool isTaken = false) REQUIRES(_mutex);
  // Whether the caller is a running worker that will come to the only job waiting.
  bool callerTakesJob() const REQUIRES(_mutex);
  Worker* takeIdle() REQUIRES(_mutex);
  Worker* startWorker() REQUIRES(_mutex);
  static void wake(Worker* worker) noexcept;

  // The life of one worker.
  void work(Worker& worker);
  void runJobs(Worker& worker) REQUIRES(_mutex);
  void runJob(Worker& worker) REQUIRES(_mutex);
  void watch(Worker& worker) REQUIRES(_mutex);
  bool waitForWork(Worker& worker) REQUIRES(_mutex);
  Thread retire(Worker& worker) REQUIRES(_mutex);

  void setAsideLongestRunning() REQUIRES(_mutex);
  void willBlock(Worker& worker);
  void didBlock(Worker& worker);

  // The pool and the worker that the calling thread is, if it is one.
  struct Current {
    WorkerPool* pool = nullptr;
    Worker* worker = nullptr;
  };
  static Current& current() noexcept;

  // Constant after construction.
  const Options _options;

  mutable Mutex _mutex;
  std::deque<Job> _jobs GUARDED_BY(_mutex);
  // Records are used again and never freed before the end, so that a wake-up needs no lock.
  std::vector<std::unique_ptr<Worker>> _workers GUARDED_BY(_mutex);
  std::vector<Worker*> _unused GUARDED_BY(_mutex);  // records without a thread
  std::vector<Worker*> _idle GUARDED_BY(_mutex);    // the last to fall asleep is woken first: its caches are warm
  Thread _retired GUARDED_BY(_mutex);               // joined by the next to retire, or at the end
  size_t _workerCount GUARDED_BY(_mutex) = 0;
  unsigned _runners GUARDED_BY(_mutex) = 0;
  uint64_t _jobsTaken GUARDED_BY(_mutex) = 0;
  uint64_t _jobsLeftToCaller GUARDED_BY(_mutex) = 0;
  bool _isWatched GUARDED_BY(_mutex) = false;
  bool _isStopping GUARDED_BY(_mutex) = false;
  Condition _lastWorkerRetired;

  // Synchronised by itself; follows the size of _jobs.
  std::atomic<size_t> _waitingCount{0};
};

}  // namespace telvane
