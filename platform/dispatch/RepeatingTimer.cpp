#include "platform/dispatch/RepeatingTimer.h"

#include <algorithm>
#include <cstdint>
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
  State(Dispatch& dispatch_, const Clock& clock_, std::shared_ptr<SerialQueue> queue_,
        std::chrono::nanoseconds interval_, std::chrono::nanoseconds leeway_, Handler fire, Job cancelled)
      : dispatch(dispatch_),
        clock(clock_),
        queue(std::move(queue_)),
        interval(std::max(interval_, kShortestInterval)),
        leeway(leeway_),
        onFire(std::move(fire)),
        onCancel(std::move(cancelled)) {}

  // Sets the single timer of the next firing. Returns false when there is none to be had.
  bool schedule(std::chrono::nanoseconds delay) EXCLUDES(mutex) {
    uint64_t number = 0;
    {
      MutexLock lock(mutex);
      number = ++scheduleCount;
    }
    auto next = dispatch.newTimer(queue, delay, leeway, [state = shared_from_this()] { state->fire(); }, {});
    if (next == nullptr) return false;
    MutexLock lock(mutex);
    // The first one may have fired already, and the next be set: that one must stay. What is not kept goes here.
    if (!isCancelled && number == scheduleCount) timer.swap(next);
    return true;
  }
  // On the queue.
  void fire() EXCLUDES(mutex) {
    {
      MutexLock lock(mutex);
      if (isCancelled) return;
    }
    // Taken out while it runs, so that a handler that cancels does not destroy itself.
    Handler handler = std::move(onFire);
    handler();
    {
      MutexLock lock(mutex);
      if (isCancelled) return;
    }
    onFire = std::move(handler);
    schedule(timeToNext());
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
      state->onFire = nullptr;
      if (state->onCancel) std::exchange(state->onCancel, nullptr)();
    });
  }

  Dispatch& dispatch;
  const Clock& clock;
  const std::shared_ptr<SerialQueue> queue;
  const std::chrono::nanoseconds interval;
  const std::chrono::nanoseconds leeway;
  // Confined to the queue.
  Clock::MonotonicTime due;
  Handler onFire;
  Job onCancel;

  Mutex mutex;
  bool isCancelled GUARDED_BY(mutex) = false;
  uint64_t scheduleCount GUARDED_BY(mutex) = 0;
  std::unique_ptr<Timer> timer GUARDED_BY(mutex);
};

std::unique_ptr<RepeatingTimer> RepeatingTimer::start(Dispatch& dispatch, const Clock& clock,
                                                      std::shared_ptr<SerialQueue> queue,
                                                      std::chrono::nanoseconds delay, std::chrono::nanoseconds interval,
                                                      std::chrono::nanoseconds leeway, Handler onFire, Job onCancel) {
  auto state = std::make_shared<State>(dispatch, clock, std::move(queue), interval, leeway, std::move(onFire),
                                       std::move(onCancel));
  state->due = later(clock.monotonicNow(), delay);
  if (!state->schedule(delay)) return nullptr;
  return std::unique_ptr<RepeatingTimer>(new RepeatingTimer(std::move(state)));
}

RepeatingTimer::~RepeatingTimer() { cancel(); }

void RepeatingTimer::cancel() { _state->cancel(); }

}  // namespace telvane
