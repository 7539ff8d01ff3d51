#pragma once

#include "platform/Mutex.h"
#include "platform/Random.h"
#include "tests/support/SeededGenerator.h"

namespace telvane::testing {

// Chance that is the same in every run of the same seed. Safe from any thread.
class SeededRandom final : public Random {
 public:
  explicit SeededRandom(uint64_t seed) : _generator(seed) {}

  void fill(std::span<uint8_t> bytes) override;

 private:
  Mutex _mutex;
  SeededGenerator _generator GUARDED_BY(_mutex);
};

}  // namespace telvane::testing
