#pragma once

#include <memory>

#include "platform/Dispatch.h"
#include "tests/support/SimulatedScheduler.h"
#include "tests/support/SimulatedSerialQueue.h"

namespace telvane::testing {

// A timer under virtual time. Made by SimulatedDispatch.
class SimulatedTimer final : public Timer {
 public:
  SimulatedTimer(SimulatedScheduler& scheduler, SimulatedScheduler::ProcessID process,
                 std::shared_ptr<SimulatedSerialQueue> queue, std::chrono::nanoseconds delay, Job onFire, Job onCancel);
  ~SimulatedTimer() override;

  void cancel() override;

 private:
  struct State {
    Job onFire;
    Job onCancel;
    bool isCancelled = false;
  };

  SimulatedScheduler& _scheduler;
  const std::shared_ptr<SimulatedSerialQueue> _queue;
  const std::shared_ptr<State> _state;
  const SimulatedScheduler::TimerID _timer;
};

}  // namespace telvane::testing
