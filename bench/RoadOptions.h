#pragma once

#include <cstdint>
#include <string>
#include <variant>
#include <vector>

namespace telvane::bench {

// How much telvane-bench-road measures. The defaults give figures that hold on an idle machine.
struct RoadOptions {
  uint64_t events = 200000;         // of each batched run
  uint64_t rounds = 7;              // of all batched runs in turn
  uint64_t posts = 2000;            // real-time events, each beside a bare post
  uint64_t sessionEvents = 2000;    // of each of the sessions at once
  uint64_t memoryEvents = 2000000;  // of the run whose memory is watched
  uint64_t idleSeconds = 5;         // for which wake-ups are counted
  std::vector<std::string> parts;   // which parts to measure; empty: all

  bool includes(const std::string& part) const;
};

// Reads the command line. Returns the options, or the exit status when there is nothing more to do: 0 after --help and
// --version, 2 on wrong usage (one line on standard error).
std::variant<RoadOptions, int> parseRoadOptions(int argc, const char* const* argv);

}  // namespace telvane::bench
