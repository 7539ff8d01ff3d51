#include "platform/Random.h"

#include <cstring>

namespace telvane {

uint32_t Random::uniform(uint32_t upperBound) {
  if (upperBound < 2) return 0;
  // The lowest values are drawn again, so that what remains is a whole multiple of the bound.
  const uint32_t threshold = (0u - upperBound) % upperBound;
  for (;;) {
    uint8_t bytes[sizeof(uint32_t)];
    fill(bytes);
    uint32_t value;
    std::memcpy(&value, bytes, sizeof value);
    if (value >= threshold) return value % upperBound;
  }
}

UUID Random::newUUID() {
  UUID::Bytes bytes;
  fill(bytes);
  return UUID::fromRandomBytes(bytes);
}

}  // namespace telvane
