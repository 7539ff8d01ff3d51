#pragma once

#include <cstdint>
#include <span>

#include "foundation/UUID.h"

namespace telvane {

// Chance. The real one is the system's cryptographic source. Safe from any thread.
class Random {
 public:
  virtual ~Random() = default;
  virtual void fill(std::span<uint8_t> bytes) = 0;
  // A uniformly distributed whole number below the bound; 0 when the bound is 0 or 1. Free of modulo bias.
  uint32_t uniform(uint32_t upperBound);
  UUID newUUID();
};

}  // namespace telvane
