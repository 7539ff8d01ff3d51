#pragma once

#include <gtest/gtest.h>

#include <cstdint>
#include <cstdlib>
#include <functional>

namespace telvane::testing {

// Runs the body with the seeds 1 to count and names the seed in every failure. TELVANE_SEED=N in the environment runs
// that one alone, which is how a failed run is replayed.
inline void forEachSeed(uint64_t count, const std::function<void(uint64_t seed)>& body) {
  const char* only = std::getenv("TELVANE_SEED");
  const uint64_t first = only != nullptr ? std::strtoull(only, nullptr, 10) : 1;
  const uint64_t last = only != nullptr ? first : count;
  for (uint64_t seed = first; seed <= last; ++seed) {
    SCOPED_TRACE(::testing::Message() << "replay with TELVANE_SEED=" << seed);
    body(seed);
    if (::testing::Test::HasFatalFailure()) return;
  }
}

}  // namespace telvane::testing
