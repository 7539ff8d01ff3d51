#pragma once

#include "platform/Random.h"

namespace telvane {

// The kernel's cryptographic source. A kernel without one ends the process: identifiers and samples that can be guessed
// would be worse.
class SystemRandom final : public Random {
 public:
  void fill(std::span<uint8_t> bytes) override;
};

}  // namespace telvane
