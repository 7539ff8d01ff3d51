#include "client/ReportingQueue.h"

namespace telvane {
namespace {

// So many that a hop between them costs nothing by comparison.
constexpr int kRoundsOfARun = 64;

}  // namespace

void ReportingQueue::async(Job step) {
  bool mustSchedule = false;
  {
    MutexLock lock(_mutex);
    _waiting.push_back(std::move(step));
    mustSchedule = claimRun();
  }
  if (mustSchedule) scheduleRun();
}

void ReportingQueue::asyncBounded(Job step, uint64_t bytes, uint64_t Dropped::*kind) {
  bool mustSchedule = false;
  {
    MutexLock lock(_mutex);
    if (_bytes + bytes > kMaximumWaitingBytes) {
      ++(_dropped.*kind);
      return;
    }
    _bytes += bytes;
    _waiting.push_back(std::move(step));
    mustSchedule = claimRun();
  }
  if (mustSchedule) scheduleRun();
}

bool ReportingQueue::claimRun() {
  if (_isBusy) return false;
  _isBusy = true;
  return true;
}

bool ReportingQueue::begin() {
  MutexLock lock(_mutex);
  return claimRun();
}

void ReportingQueue::end() {
  {
    MutexLock lock(_mutex);
    if (_waiting.empty()) {
      _isBusy = false;
      return;
    }
  }
  scheduleRun();
}

void ReportingQueue::scheduleRun() {
  _queue->async([self = shared_from_this()] { self->run(); });
}

void ReportingQueue::run() {
  for (int round = 0; round < kRoundsOfARun; ++round) {
    std::vector<Job> steps = takeWaiting();
    if (steps.empty()) return;
    for (Job& step : steps) {
      // Taken out, so that what it holds goes when it is done and not with the whole list.
      Job current = std::move(step);
      current();
    }
  }
  // Under a load that never ends, other jobs of the serial queue must have their turn.
  scheduleRun();
}

std::vector<Job> ReportingQueue::takeWaiting() {
  std::vector<Job> steps;
  Dropped dropped;
  {
    MutexLock lock(_mutex);
    steps.swap(_waiting);
    _bytes -= _runningBytes;
    _runningBytes = _bytes;
    dropped = std::exchange(_dropped, {});
    if (steps.empty()) _isBusy = false;
  }
  logDropped(dropped);
  return steps;
}

void ReportingQueue::logDropped(const Dropped& dropped) {
  if (dropped.messages > 0) {
    _log.error("Dropped {} events: more than {} bytes were waiting to be handed to the daemon", dropped.messages,
               kMaximumWaitingBytes);
  }
  if (dropped.notices > 0) {
    _log.error("Dropped {} notices of filtered events: more than {} bytes were waiting to be handed to the delegate",
               dropped.notices, kMaximumWaitingBytes);
  }
  if (dropped.calls > 0) {
    _log.error("Dropped {} calls: more than {} bytes were waiting to be handed to the daemon", dropped.calls,
               kMaximumWaitingBytes);
  }
}

}  // namespace telvane
