#include "tests/support/SeededRandom.h"

namespace telvane::testing {

void SeededRandom::fill(std::span<uint8_t> bytes) {
  MutexLock lock(_mutex);
  for (uint8_t& byte : bytes) byte = static_cast<uint8_t>(_generator.next() >> 56);
}

}  // namespace telvane::testing
