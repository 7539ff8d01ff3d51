#pragma once

#include "tests/support/SimulatedScheduler.h"

namespace telvane::testing {

// The UDP network of a SimulatedWorld.
class SimulatedDatagramNetwork {
 public:
  // REQUIRES: the scheduler outlives this object.
  explicit SimulatedDatagramNetwork(SimulatedScheduler& scheduler) : _scheduler(scheduler) {}

 private:
  [[maybe_unused]] SimulatedScheduler& _scheduler;
};

}  // namespace telvane::testing
