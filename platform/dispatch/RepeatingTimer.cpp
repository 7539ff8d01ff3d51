#include "platform/dispatch/RepeatingTimer.h"

#include <algorithm>
#include <utility>

#include "platform/Mutex.h"

namespace telvane {
namespace {

constexpr std::chrono::nanoseconds kShortestInterval = std::chrono::milliseconds(1);

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

  // Sets the single timer of the next firing.
  void schedule(std::chrono::nanoseconds delay) EXCLUDES(mutex) {
    auto next = dispatch.newTimer(queue, delay, leeway, [state = shared_from_this()] { state->fire(); }, {});
    MutexLock lock(mutex);
    if (isCancelled) return;  // and the timer with it
    timer.swap(next);
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
    due += interval;
    if (due < now) due += (now - due) / interval * interval;
    if (due < now) due += interval;
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
  std::unique_ptr<Timer> timer GUARDED_BY(mutex);
};

std::unique_ptr<RepeatingTimer> RepeatingTimer::start(Dispatch& dispatch, const Clock& clock,
                                                      std::shared_ptr<SerialQueue> queue,
                                                      std::chrono::nanoseconds delay, std::chrono::nanoseconds interval,
                                                      std::chrono::nanoseconds leeway, Handler onFire, Job onCancel) {
  auto state = std::make_shared<State>(dispatch, clock, std::move(queue), interval, leeway, std::move(onFire),
                                       std::move(onCancel));
  state->due = clock.monotonicNow() + delay;
  state->schedule(delay);
  return std::unique_ptr<RepeatingTimer>(new RepeatingTimer(std::move(state)));
}

RepeatingTimer::~RepeatingTimer() { cancel(); }

void RepeatingTimer::cancel() { _state->cancel(); }

}  // namespace telvane
