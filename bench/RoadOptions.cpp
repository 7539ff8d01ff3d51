#include "bench/RoadOptions.h"

#include <CLI/CLI.hpp>
#include <algorithm>
#include <iostream>

namespace telvane::bench {
namespace {

constexpr int kWrongUsage = 2;

// Enough to see that all works and roughly where it stands, in a quarter of a minute.
RoadOptions quickOptions() {
  return {.events = 20000,
          .rounds = 3,
          .posts = 300,
          .sessionEvents = 100,
          .memoryEvents = 300000,
          .idleSeconds = 1,
          .parts = {}};
}

}  // namespace

bool RoadOptions::includes(const std::string& part) const {
  return parts.empty() || std::find(parts.begin(), parts.end(), part) != parts.end();
}

std::variant<RoadOptions, int> parseRoadOptions(int argc, const char* const* argv) {
  CLI::App app("Measures the road of an event from a client's call to the collector, beside the least it can cost.",
               "telvane-bench-road");
  app.set_version_flag("--version", "telvane-bench-road " TELVANE_VERSION);
  // What else is said is laid over it, so it has to be known first.
  bool isQuick = std::any_of(argv + 1, argv + argc, [](std::string_view word) { return word == "--quick"; });
  RoadOptions options = isQuick ? quickOptions() : RoadOptions();
  app.add_flag("--quick", isQuick, "a short run: whether all works, and roughly where it stands");
  app.add_option("--events", options.events, "events of each batched run")->check(CLI::PositiveNumber);
  app.add_option("--rounds", options.rounds, "rounds of batched runs")->check(CLI::PositiveNumber);
  app.add_option("--posts", options.posts, "real-time events, each beside a bare post")->check(CLI::PositiveNumber);
  app.add_option("--session-events", options.sessionEvents, "events of each of 104 sessions")
      ->check(CLI::PositiveNumber);
  app.add_option("--memory-events", options.memoryEvents, "events of the run whose memory is watched")
      ->check(CLI::PositiveNumber);
  app.add_option("--idle-seconds", options.idleSeconds, "for how long an idle daemon's wake-ups are counted");
  app.add_option("--only", options.parts, "what to measure; may be said several times")
      ->check(CLI::IsMember({"batched", "realtime", "sessions", "memory"}));
  try {
    app.parse(argc, argv);
  } catch (const CLI::ParseError& error) {
    if (error.get_exit_code() == 0) return app.exit(error);
    std::cerr << "telvane-bench-road: " << error.what() << "; see telvane-bench-road --help\n";
    return kWrongUsage;
  }
  return options;
}

}  // namespace telvane::bench
