#include "platform/dispatch/WorkerPool.h"

#include <algorithm>
#include <system_error>
#include <thread>

#include "platform/dispatch/Deadline.h"

namespace telvane {

namespace {

// An exception ends the process here, with the job's stack still to be seen.
void runToTheEnd(Job& job) noexcept {
  job();
  job = nullptr;
}

}  // namespace

WorkerPool::WorkerPool(const Options& options) : _options(options) {}

WorkerPool::~WorkerPool() {
  Thread lastRetired;
  MutexLock lock(_mutex);
  _isStopping = true;
  wake(engage());
  for (Worker* sleeper : _idle) wake(sleeper);
  while (_workerCount != 0) _lastWorkerRetired.wait(_mutex);
  lastRetired = std::move(_retired);
}

unsigned WorkerPool::defaultConcurrency() {
  // Fewer than four would let two short waits that nobody announces hold up everything.
  return std::max(4u, std::thread::hardware_concurrency());
}

void WorkerPool::submit(Job job) {
  Worker* sleeper;
  {
    MutexLock lock(_mutex);
    _jobs.push_back(std::move(job));
    _waitingCount.store(_jobs.size(), std::memory_order_relaxed);
    const bool isTaken = callerTakesJob();
    if (isTaken) ++_jobsLeftToCaller;
    sleeper = engage(isTaken);
  }
  wake(sleeper);
}

bool WorkerPool::callerTakesJob() const {
  const Current& caller = current();
  return caller.pool == this && caller.worker->state == State::Running && _jobs.size() == 1;
}

size_t WorkerPool::workerCount() const {
  MutexLock lock(_mutex);
  return _workerCount;
}

WorkerPool::Worker* WorkerPool::engage(bool isTaken) {
  const bool mayRun = !isTaken && _runners < _options.concurrency;
  if (_jobs.empty() || (!mayRun && _isWatched)) return nullptr;
  const State state = mayRun ? State::Running : State::Watching;
  Worker* sleeper = takeIdle();
  Worker* worker = sleeper != nullptr ? sleeper : startWorker();
  if (worker == nullptr) return nullptr;
  worker->state = state;
  if (mayRun) {
    ++_runners;
  } else {
    _isWatched = true;
  }
  return sleeper;
}

WorkerPool::Worker* WorkerPool::takeIdle() {
  if (_idle.empty()) return nullptr;
  Worker* worker = _idle.back();
  _idle.pop_back();
  return worker;
}

WorkerPool::Worker* WorkerPool::startWorker() {
  if (_workerCount >= _options.maximumWorkers) return nullptr;
  if (_unused.empty()) {
    _workers.push_back(std::make_unique<Worker>());
    _unused.push_back(_workers.back().get());
  }
  Worker* worker = _unused.back();
  try {
    worker->thread = Thread("telvane-worker", [this, worker] { work(*worker); });
  } catch (const std::system_error&) {
    return nullptr;
  }
  _unused.pop_back();
  ++_workerCount;
  return worker;
}

void WorkerPool::wake(Worker* worker) noexcept {
  if (worker != nullptr) worker->wake.notifyOne();
}

void WorkerPool::work(Worker& worker) {
  current() = {this, &worker};
  Thread retiredEarlier;
  {
    MutexLock lock(_mutex);
    do {
      while (worker.state != State::Idle) {
        if (worker.state == State::Watching) watch(worker);
        if (worker.state == State::Running) runJobs(worker);
      }
    } while (waitForWork(worker));
    retiredEarlier = retire(worker);
  }
}

void WorkerPool::runJobs(Worker& worker) {
  while (!_jobs.empty() && _runners <= _options.concurrency) runJob(worker);
  --_runners;
  // One too many, since others came back from waiting: these take the jobs, unless they stall.
  const bool mustWatch = !_jobs.empty() && !_isWatched;
  if (mustWatch) _isWatched = true;
  worker.state = mustWatch ? State::Watching : State::Idle;
}

void WorkerPool::runJob(Worker& worker) {
  Job job = std::move(_jobs.front());
  _jobs.pop_front();
  _waitingCount.store(_jobs.size(), std::memory_order_relaxed);
  worker.jobNumber = ++_jobsTaken;
  Worker* sleeper = engage();
  _mutex.unlock();
  wake(sleeper);
  runToTheEnd(job);
  _mutex.lock();
  worker.jobNumber = kNoJob;
  if (worker.state == State::Blocked) {
    worker.state = State::Running;
    ++_runners;
  }
}

void WorkerPool::watch(Worker& worker) {
  uint64_t left = 0;
  // One watch serves all jobs that are left to their callers meanwhile: under load none of them wakes a thread.
  while (!_jobs.empty() || left != _jobsLeftToCaller) {
    const uint64_t taken = _jobsTaken;
    left = _jobsLeftToCaller;
    const auto deadline = deadlineAfter(_runners < _options.concurrency ? kHandOverTime : kStallTime);
    while (worker.wake.waitUntil(_mutex, deadline)) {
    }
    if (_jobs.empty()) continue;
    if (_jobsTaken == taken && _runners >= _options.concurrency) setAsideLongestRunning();
    if (_runners < _options.concurrency) {
      worker.state = State::Running;
      ++_runners;
      break;
    }
  }
  _isWatched = false;
  if (worker.state == State::Watching) worker.state = State::Idle;
}

void WorkerPool::setAsideLongestRunning() {
  Worker* longest = nullptr;
  for (const auto& worker : _workers) {
    if (worker->state != State::Running || worker->jobNumber == kNoJob) continue;
    if (longest == nullptr || worker->jobNumber < longest->jobNumber) longest = worker.get();
  }
  if (longest == nullptr) return;
  longest->state = State::Blocked;
  --_runners;
}

bool WorkerPool::waitForWork(Worker& worker) {
  if (_isStopping && _jobs.empty()) return false;
  const bool isKept = _idle.size() < _options.keptWorkers;
  const auto deadline = deadlineAfter(_options.idleTime);
  _idle.push_back(&worker);
  bool isInTime = true;
  while (worker.state == State::Idle && isInTime && !(_isStopping && _jobs.empty())) {
    if (isKept) {
      worker.wake.wait(_mutex);
    } else {
      isInTime = worker.wake.waitUntil(_mutex, deadline);
    }
  }
  if (worker.state != State::Idle) return true;
  std::erase(_idle, &worker);
  return false;
}

Thread WorkerPool::retire(Worker& worker) {
  Thread retiredEarlier = std::move(_retired);
  _retired = std::move(worker.thread);
  worker.state = State::Unused;
  _unused.push_back(&worker);
  --_workerCount;
  if (_workerCount == 0) _lastWorkerRetired.notifyAll();
  if (_isStopping) {
    for (Worker* sleeper : _idle) wake(sleeper);
  }
  return retiredEarlier;
}

WorkerPool::Current& WorkerPool::current() noexcept {
  thread_local Current current;
  return current;
}

void WorkerPool::willBlock(Worker& worker) {
  Worker* sleeper;
  {
    MutexLock lock(_mutex);
    if (worker.state != State::Running) return;
    worker.state = State::Blocked;
    --_runners;
    sleeper = engage();
  }
  wake(sleeper);
}

void WorkerPool::didBlock(Worker& worker) {
  MutexLock lock(_mutex);
  if (worker.state != State::Blocked) return;
  worker.state = State::Running;
  ++_runners;
}

WorkerPool::Blocking::Blocking() : _isWorker(current().pool != nullptr) {
  if (_isWorker) current().pool->willBlock(*current().worker);
}

WorkerPool::Blocking::~Blocking() {
  if (_isWorker) current().pool->didBlock(*current().worker);
}

}  // namespace telvane
