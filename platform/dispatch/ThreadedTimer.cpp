#include "platform/dispatch/ThreadedTimer.h"

#include <atomic>

namespace telvane {

// Shared with the jobs that are on their way, so that they outlive the timer.
struct ThreadedTimer::State {
  State(std::shared_ptr<SerialQueue> target, Job fire, Job cancel)
      : queue(std::move(target)), hasCancelHandler(cancel), onFire(std::move(fire)), onCancel(std::move(cancel)) {}

  void fire() {
    Job job = std::move(onFire);
    if (!isCancelled.load(std::memory_order_acquire)) job();
  }
  void tellCancelled() {
    onFire = nullptr;
    Job job = std::move(onCancel);
    job();
  }

  const std::shared_ptr<SerialQueue> queue;
  const bool hasCancelHandler;
  // Synchronised by itself.
  std::atomic<bool> isCancelled{false};
  // Confined to the queue; the caller's, once the service has given the firing back.
  Job onFire;
  Job onCancel;
};

ThreadedTimer::ThreadedTimer(TimerService& timers, std::shared_ptr<SerialQueue> queue, std::chrono::nanoseconds delay,
                             std::chrono::nanoseconds leeway, Job onFire, Job onCancel)
    : _timers(timers),
      _state(std::make_shared<State>(std::move(queue), std::move(onFire), std::move(onCancel))),
      _ticket(_timers.schedule(delay, leeway, [state = _state] {
        SerialQueue& target = *state->queue;
        target.async([state] { state->fire(); });
      })) {}

ThreadedTimer::~ThreadedTimer() { cancel(); }

void ThreadedTimer::cancel() {
  if (_state->isCancelled.exchange(true, std::memory_order_acq_rel)) return;
  const bool willNotFire = _timers.cancel(_ticket);
  if (_state->hasCancelHandler) {
    _state->queue->async([state = _state] { state->tellCancelled(); });
  } else if (willNotFire) {
    _state->onFire = nullptr;
  }
}

}  // namespace telvane
