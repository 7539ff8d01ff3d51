#include "platform/system/Allocator.h"

#include <malloc.h>

namespace telvane {

void keepFreedMemoryForReuse() {
  constexpr int kKeptBytes = 4 << 20;
  constexpr int kGrowthBytes = 1 << 20;
  // Setting either switches off glibc's own adaptation of the other; a refusal leaves the defaults, which work too.
  mallopt(M_TRIM_THRESHOLD, kKeptBytes);
  mallopt(M_TOP_PAD, kGrowthBytes);
}

}  // namespace telvane
