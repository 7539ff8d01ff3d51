#include "platform/dispatch/RepeatingTimer.h"

#include <algorithm>
#include <cstdint>
#include <exception>
#include <utility>

#include "platform/Mutex.h"

namespace telvane {
namespace {

constexpr std::chrono::nanoseconds kShortestInterval = std::chrono::milliseconds(1);

// The time that much later; the last one there is, when that cannot be told.
Clock::MonotonicTime later(Clock::MonotonicTime time, std::chrono::nanoseconds by) {
  return by >= Clock::MonotonicTime::max() - time ? Clock::MonotonicTime::max() : time + by;
}

}  // namespace

// Shared with the firing that is on its way, so that it outlives the timer.
struct RepeatingTimer::State : std::enable_shared_from_this<RepeatingTimer::State> {
  State(Dispatch& dispatch_, const Clock& clock_, std::shared_ptr<SerialQueue> queue_, const Times& times,
        Handlers handlers_)
      : dispatch(dispatch_),
        clock(clock_),
        queue(std::move(queue_)),
        interval(std::max(times.interval, kShortestInterval)),
        leeway(times.leeway),
        due(later(clock_.monotonicNow(), times.delay)),
        handlers(std::move(handlers_)) {}

  // Sets the single timer of the next firing. Returns false when there is none to be had.
  bool schedule(std::chrono::nanoseconds delay) EXCLUDES(mutex) {
    uint64_t number = 0;
    {
      MutexLock lock(mutex);
      number = ++scheduleCount;
    }
    auto next = newTimer(delay);
    if (next == nullptr) return false;
    MutexLock lock(mutex);
    // The first one may have fired already, and the next be set: that one must stay. What is not kept goes here.
    if (!isCancelled && number == scheduleCount) timer.swap(next);
    return true;
  }
  std::unique_ptr<Timer> newTimer(std::chrono::nanoseconds delay) {
    try {
      return dispatch.newTimer(queue, delay, leeway, [state = shared_from_this()] { state->fire(); }, {});
    } catch (const std::exception&) {
      return nullptr;  // no thread or memory left for it
    }
  }
  // On the queue.
  void fire() EXCLUDES(mutex) {
    {
      MutexLock lock(mutex);
      if (isCancelled) return;
    }
    // Taken out while it runs, so that a handler that cancels does not destroy itself.
    UniqueFunction<void()> handler = std::move(handlers.onFire);
    handler();
    {
      MutexLock lock(mutex);
      if (isCancelled) return;
    }
    handlers.onFire = std::move(handler);
    if (schedule(timeToNext())) return;
    if (handlers.onLost) std::exchange(handlers.onLost, nullptr)();
  }
  std::chrono::nanoseconds timeToNext() {
    const Clock::MonotonicTime now = clock.monotonicNow();
    due = later(due, interval);
    if (due < now) due += (now - due) / interval * interval;
    if (due < now) due = later(due, interval);
    return due - now;
  }
  void cancel() EXCLUDES(mutex) {
    std::unique_ptr<Timer> stopped;
    {
      MutexLock lock(mutex);
      if (std::exchange(isCancelled, true)) return;
      stopped = std::move(timer);
    }
    stopped.reset();
    queue->async([state = shared_from_this()] {
      state->handlers.onFire = nullptr;
      state->handlers.onLost = nullptr;
      if (state->handlers.onCancel) std::exchange(state->handlers.onCancel, nullptr)();
    });
  }

  Dispatch& dispatch;
  const Clock& clock;
  const std::shared_ptr<SerialQueue> queue;
  const std::chrono::nanoseconds interval;
  const std::chrono::nanoseconds leeway;
  // Confined to the queue.
  Clock::MonotonicTime due;
  Handlers handlers;

  Mutex mutex;
  bool isCancelled GUARDED_BY(mutex) = false;
  uint64_t scheduleCount GUARDED_BY(mutex) = 0;
  std::unique_ptr<Timer> timer GUARDED_BY(mutex);
};

std::unique_ptr<RepeatingTimer> RepeatingTimer::start(Dispatch& dispatch, const Clock& clock,
                                                      std::shared_ptr<SerialQueue> queue, const Times& times,
                                                      Handlers handlers) {
  auto state = std::make_shared<State>(dispatch, clock, std::move(queue), times, std::move(handlers));
  if (!state->schedule(times.delay)) return nullptr;
  return std::unique_ptr<RepeatingTimer>(new RepeatingTimer(std::move(state)));
}

RepeatingTimer::~RepeatingTimer() { cancel(); }

void RepeatingTimer::cancel() { _state->cancel(); }

}  // namespace telvane
