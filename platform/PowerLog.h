#pragma once

#include <cstdint>
#include <string_view>

#include "foundation/Value.h"

namespace telvane {

// The system's record of what costs energy. Safe from any thread.
class PowerLog {
 public:
  virtual ~PowerLog() = default;
  // Notes one event of a registered class; payload: what is kept with it.
  virtual void logRegisteredEvent(uint32_t eventClass, std::string_view eventName, const Dictionary& payload) = 0;
};

// For systems that keep no such record: what is noted is gone.
class NullPowerLog final : public PowerLog {
 public:
  void logRegisteredEvent(uint32_t, std::string_view, const Dictionary&) override {}
};

}  // namespace telvane
