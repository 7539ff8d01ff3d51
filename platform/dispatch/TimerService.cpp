#include "platform/dispatch/TimerService.h"

#include <bit>
#include <system_error>
#include <vector>

#include "platform/dispatch/Deadline.h"

namespace telvane {

namespace {

// Moves the time up to the next whole multiple of the largest power of two that the leeway allows.
TimerService::TimePoint gatheringPoint(TimerService::TimePoint due, std::chrono::nanoseconds leeway) {
  if (leeway.count() < 2 || due > TimerService::TimePoint::max() - leeway) return due;
  const auto step = static_cast<int64_t>(std::bit_floor(static_cast<uint64_t>(leeway.count())));
  const int64_t time = due.time_since_epoch().count();
  return TimerService::TimePoint(std::chrono::nanoseconds((time + step - 1) / step * step));
}

}  // namespace

TimerService::~TimerService() { stop(); }

TimerService::Ticket TimerService::schedule(std::chrono::nanoseconds delay, std::chrono::nanoseconds leeway, Job job) {
  const TimePoint due = gatheringPoint(deadlineAfter(delay), leeway);
  Ticket ticket{due};
  {
    MutexLock lock(_mutex);
    ticket.number = ++_lastNumber;
    if (_isStopped) return ticket;
    _jobs.emplace(ticket, std::move(job));
    startThread();
    if (due >= _wakeUp) return ticket;
    _wakeUp = due;
  }
  _changed.notifyOne();
  return ticket;
}

bool TimerService::cancel(const Ticket& ticket) {
  Job dropped;
  MutexLock lock(_mutex);
  const auto position = _jobs.find(ticket);
  if (position == _jobs.end()) return false;
  dropped = std::move(position->second);
  _jobs.erase(position);
  return true;
}

void TimerService::stop() {
  std::map<Ticket, Job> dropped;
  Thread thread;
  {
    MutexLock lock(_mutex);
    _isStopped = true;
    dropped.swap(_jobs);
    thread = std::move(_thread);
    _changed.notifyOne();
  }
  thread.join();
}

void TimerService::startThread() {
  if (_thread.isStarted()) return;
  try {
    _thread = Thread("telvane-timers", [this] { run(); });
  } catch (const std::system_error&) {
    // No thread left now; the next schedule tries again and finds this job waiting.
  }
}

void TimerService::run() {
  MutexLock lock(_mutex);
  while (!_isStopped) {
    runDueJobs();
    if (_isStopped) return;
    _wakeUp = _jobs.empty() ? TimePoint::max() : _jobs.begin()->first.due;
    if (_wakeUp == TimePoint::max()) {
      _changed.wait(_mutex);
    } else {
      _changed.waitUntil(_mutex, _wakeUp);
    }
  }
}

void TimerService::runDueJobs() {
  const TimePoint now = std::chrono::steady_clock::now();
  std::vector<Job> due;
  while (!_jobs.empty() && _jobs.begin()->first.due <= now) {
    due.push_back(std::move(_jobs.begin()->second));
    _jobs.erase(_jobs.begin());
  }
  if (due.empty()) return;
  _mutex.unlock();
  for (Job& job : due) job();
  due.clear();
  _mutex.lock();
}

}  // namespace telvane
