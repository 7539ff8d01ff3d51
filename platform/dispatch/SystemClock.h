#pragma once

#include "platform/Clock.h"

namespace telvane {

// The system's clocks.
class SystemClock final : public Clock {
 public:
  Date now() const override;
  MonotonicTime monotonicNow() const override;
};

}  // namespace telvane
