#include "platform/system/Allocator.h"

#include <malloc.h>
#ifdef __SANITIZE_ADDRESS__
#include <sanitizer/lsan_interface.h>
#endif

namespace telvane {

void keepFreedMemoryForReuse() {
  constexpr int kKeptBytes = 4 << 20;
  constexpr int kGrowthBytes = 1 << 20;
  // Setting either switches off glibc's own adaptation of the other; a refusal leaves the defaults, which work too.
  mallopt(M_TRIM_THRESHOLD, kKeptBytes);
  mallopt(M_TOP_PAD, kGrowthBytes);
}

bool hasLeakedMemory() {
#ifdef __SANITIZE_ADDRESS__
  return __lsan_do_recoverable_leak_check() != 0;
#else
  return false;
#endif
}

}  // namespace telvane
