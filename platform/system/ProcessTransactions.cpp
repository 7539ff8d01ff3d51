#include "platform/system/ProcessTransactions.h"

#include <utility>
#include <vector>

#include "platform/Mutex.h"

namespace telvane {

class ProcessTransactions::State : public std::enable_shared_from_this<State> {
 public:
  explicit State(const Clock& clock) : _clock(clock), _idleSince(clock.monotonicNow()) {}

  void begin() EXCLUDES(_mutex) {
    const MutexLock lock(_mutex);
    ++_count;
  }

  void end() EXCLUDES(_mutex) {
    std::vector<Waiting> waiting;
    {
      const MutexLock lock(_mutex);
      if (_count == 0 || --_count > 0) return;
      _idleSince = _clock.monotonicNow();
      waiting.swap(_waiting);
    }
    for (Waiting& one : waiting) one.queue->async(std::move(one.handler));
    scheduleCheck();
  }

  uint64_t count() const EXCLUDES(_mutex) {
    const MutexLock lock(_mutex);
    return _count;
  }

  void whenIdleFor(std::chrono::nanoseconds time, std::shared_ptr<SerialQueue> queue, Job handler) EXCLUDES(_mutex) {
    Waiting replaced;  // what its handler holds goes without the lock
    {
      const MutexLock lock(_mutex);
      _idleSince = _clock.monotonicNow();
      _idleTime = time;
      replaced = std::exchange(_idle, {std::move(queue), std::move(handler)});
      ++_generation;  // a check under way belongs to the handler before
      _isCheckScheduled = false;
    }
    scheduleCheck();
  }

  void whenNoneHeld(std::shared_ptr<SerialQueue> queue, Job handler) EXCLUDES(_mutex) {
    {
      const MutexLock lock(_mutex);
      if (_count > 0) {
        _waiting.push_back({std::move(queue), std::move(handler)});
        return;
      }
    }
    queue->async(std::move(handler));
  }

  // Lets go of everything that would keep what it captured alive after the owner's end.
  void stop() EXCLUDES(_mutex) {
    Waiting idle;
    std::vector<Waiting> waiting;
    const MutexLock lock(_mutex);
    idle = std::exchange(_idle, {});
    waiting.swap(_waiting);
  }

 private:
  struct Waiting {
    std::shared_ptr<SerialQueue> queue;
    Job handler;
  };

  // Has the idle time checked when it can be over at the earliest.
  void scheduleCheck() EXCLUDES(_mutex) {
    std::shared_ptr<SerialQueue> queue;
    std::chrono::nanoseconds delay{};
    uint64_t generation = 0;
    {
      const MutexLock lock(_mutex);
      if (_isCheckScheduled || _count > 0 || _idle.queue == nullptr) return;
      _isCheckScheduled = true;
      queue = _idle.queue;
      delay = _idleSince + _idleTime - _clock.monotonicNow();
      generation = _generation;
    }
    queue->asyncAfter(delay, [weak = weak_from_this(), generation] {
      if (const std::shared_ptr<State> state = weak.lock()) state->check(generation);
    });
  }

  // Runs on the idle handler's queue. A transaction that came and went has moved the time: then it is checked again.
  void check(uint64_t generation) EXCLUDES(_mutex) {
    Waiting due;
    {
      const MutexLock lock(_mutex);
      if (generation != _generation) return;
      _isCheckScheduled = false;
      const bool isIdle = _count == 0 && _clock.monotonicNow() - _idleSince >= _idleTime;
      if (isIdle) due = std::exchange(_idle, {});
    }
    if (due.handler) {
      due.handler();
    } else {
      scheduleCheck();
    }
  }

  const Clock& _clock;
  mutable Mutex _mutex;
  uint64_t _count GUARDED_BY(_mutex) = 0;
  Clock::MonotonicTime _idleSince GUARDED_BY(_mutex);  // when the count fell to 0, if it is
  std::chrono::nanoseconds _idleTime GUARDED_BY(_mutex){};
  Waiting _idle GUARDED_BY(_mutex);
  uint64_t _generation GUARDED_BY(_mutex) = 0;
  bool _isCheckScheduled GUARDED_BY(_mutex) = false;
  std::vector<Waiting> _waiting GUARDED_BY(_mutex);
};

ProcessTransactions::ProcessTransactions(const Clock& clock) : _state(std::make_shared<State>(clock)) {}

ProcessTransactions::~ProcessTransactions() { _state->stop(); }

void ProcessTransactions::begin() { _state->begin(); }

void ProcessTransactions::end() { _state->end(); }

uint64_t ProcessTransactions::count() const { return _state->count(); }

void ProcessTransactions::whenIdleFor(std::chrono::nanoseconds time, std::shared_ptr<SerialQueue> queue, Job handler) {
  _state->whenIdleFor(time, std::move(queue), std::move(handler));
}

void ProcessTransactions::whenNoneHeld(std::shared_ptr<SerialQueue> queue, Job handler) {
  _state->whenNoneHeld(std::move(queue), std::move(handler));
}

}  // namespace telvane
