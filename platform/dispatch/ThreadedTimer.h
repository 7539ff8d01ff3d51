#pragma once

#include <memory>

#include "platform/Dispatch.h"
#include "platform/dispatch/TimerService.h"

namespace telvane {

// A one-shot timer of the timer service. Owned by who asked for it; keeps its queue until it is let go of. Once cancel
// has been called on the queue, or has returned before the firing began, the timer does not fire.
class ThreadedTimer final : public Timer {
 public:
  ThreadedTimer(TimerService& timers, std::shared_ptr<SerialQueue> queue, std::chrono::nanoseconds delay,
                std::chrono::nanoseconds leeway, Job onFire, Job onCancel);
  ~ThreadedTimer() override;
  void cancel() override;

 private:
  struct State;

  TimerService& _timers;
  const std::shared_ptr<State> _state;
  const TimerService::Ticket _ticket;
};

}  // namespace telvane
