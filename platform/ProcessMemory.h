#pragma once

#include <cstdint>

namespace telvane {

// Tells how much memory this process takes. Safe from any thread.
class ProcessMemory {
 public:
  virtual ~ProcessMemory() = default;
  // The memory that only this process uses, in bytes; 0 when the system does not tell.
  virtual uint64_t taskMemory() const = 0;
};

}  // namespace telvane
