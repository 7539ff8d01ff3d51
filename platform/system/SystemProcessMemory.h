#pragma once

#include "platform/ProcessMemory.h"

namespace telvane {

// The memory of this process as the kernel counts it.
class SystemProcessMemory final : public ProcessMemory {
 public:
  uint64_t taskMemory() const override;
};

}  // namespace telvane
