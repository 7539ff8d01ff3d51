#pragma once

#include <chrono>
#include <cstdint>

namespace telvane::testing {

struct SoakOptions {
  std::chrono::seconds duration{60};
  uint64_t seed = 1;
  int clients = 8;  // processes at once
};

}  // namespace telvane::testing
