#include "tests/support/SimulatedTimer.h"

#include <utility>

namespace telvane::testing {

SimulatedTimer::SimulatedTimer(SimulatedScheduler& scheduler, SimulatedScheduler::ProcessID process,
                               std::shared_ptr<SimulatedSerialQueue> queue, std::chrono::nanoseconds delay, Job onFire,
                               Job onCancel)
    : _scheduler(scheduler),
      _queue(std::move(queue)),
      _state(std::make_shared<State>(State{std::move(onFire), std::move(onCancel)})),
      _timer(scheduler.startTimer(process, delay, [firingQueue = _queue, state = _state] {
        firingQueue->post([state] {
          // The cancel may have come while this waited on the queue.
          Job fire = std::exchange(state->onFire, nullptr);
          if (!state->isCancelled && fire) fire();
        });
      })) {}

SimulatedTimer::~SimulatedTimer() { cancel(); }

void SimulatedTimer::cancel() {
  if (std::exchange(_state->isCancelled, true)) return;
  _scheduler.cancelTimer(_timer);
  _queue->post([state = _state] {
    state->onFire = nullptr;
    if (Job handler = std::exchange(state->onCancel, nullptr)) handler();
  });
}

}  // namespace telvane::testing
