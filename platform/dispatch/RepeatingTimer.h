#pragma once

#include <chrono>
#include <memory>

#include "foundation/UniqueFunction.h"
#include "platform/Clock.h"
#include "platform/Dispatch.h"

namespace telvane {

// A timer that fires again and again as a job of its queue, without drifting: each firing is due a whole number of
// intervals after the first. Firings that come too late for the next one are left out, so they never pile up. Owned by
// who started it, who cancels it or lets it go, which cancels too. Safe from any thread.
class RepeatingTimer {
 public:
  using Handler = UniqueFunction<void()>;

  // Starts a timer that fires first after the delay and then every interval, each time up to leeway later.
  // onFire is called on the queue, never twice at once. onCancel, which may be empty, runs once on the queue when the
  // timer has been cancelled; onFire is not called any more behind it, nor after a cancel on the queue. An interval of
  // less than a millisecond counts as one. Returns null when the dispatch has no timer to give.
  // REQUIRES: dispatch and clock outlive the timer and the queue's jobs.
  static std::unique_ptr<RepeatingTimer> start(Dispatch& dispatch, const Clock& clock,
                                               std::shared_ptr<SerialQueue> queue, std::chrono::nanoseconds delay,
                                               std::chrono::nanoseconds interval, std::chrono::nanoseconds leeway,
                                               Handler onFire, Job onCancel);
  ~RepeatingTimer();
  RepeatingTimer(const RepeatingTimer&) = delete;
  RepeatingTimer& operator=(const RepeatingTimer&) = delete;

  // Stops the timer. A second cancel does nothing.
  void cancel();

 private:
  struct State;
  explicit RepeatingTimer(std::shared_ptr<State> state) : _state(std::move(state)) {}

  const std::shared_ptr<State> _state;
};

}  // namespace telvane
