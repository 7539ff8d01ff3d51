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
  struct Times {
    std::chrono::nanoseconds delay{0};     // to the first firing
    std::chrono::nanoseconds interval{0};  // from one to the next; less than a millisecond counts as one
    std::chrono::nanoseconds leeway{0};    // how much later each may come
  };
  // What is called, all of it on the queue. All but onFire may be empty.
  struct Handlers {
    // At each firing, never twice at once.
    UniqueFunction<void()> onFire{};
    // Once when the timer has been cancelled; onFire is not called any more behind it, nor after a cancel on the queue.
    Job onCancel{};
    // Once, behind onFire, when the dispatch has no timer for the next firing: there is none any more then. The timer
    // is cancelled as always.
    Job onLost{};
  };

  // Starts a timer. Returns null when the dispatch has none to give; nothing is called then.
  // REQUIRES: dispatch and clock outlive the timer and the queue's jobs.
  static std::unique_ptr<RepeatingTimer> start(Dispatch& dispatch, const Clock& clock,
                                               std::shared_ptr<SerialQueue> queue, const Times& times,
                                               Handlers handlers);
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
