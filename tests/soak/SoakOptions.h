#pragma once

#include <chrono>
#include <cstdint>
#include <string>

namespace telvane::testing {

struct SoakOptions {
  std::chrono::seconds duration{60};
  uint64_t seed = 1;
  int clients = 8;  // processes at once
  // The file that gets the daemon's whole log; without one it logs errors only.
  std::string logFile;
};

}  // namespace telvane::testing
