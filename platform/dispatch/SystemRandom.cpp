#include "platform/dispatch/SystemRandom.h"

#include <sys/random.h>

#include <cerrno>
#include <cstdlib>

namespace telvane {

void SystemRandom::fill(std::span<uint8_t> bytes) {
  while (!bytes.empty()) {
    const ssize_t count = getrandom(bytes.data(), bytes.size(), 0);
    if (count < 0 && errno == EINTR) continue;
    if (count <= 0) std::abort();
    bytes = bytes.subspan(static_cast<size_t>(count));
  }
}

}  // namespace telvane
