// A real daemon under many clients and a bad server, for as long as one likes.
#include <CLI/CLI.hpp>

#include <algorithm>
#include <iostream>

#include "tests/soak/Soak.h"

int main(int argc, char** argv) {
  telvane::testing::SoakOptions options;
  int64_t seconds = options.duration.count();
  CLI::App app("Lets clients come and go at a real daemon and checks that nothing is left of them.", "telvane-soak");
  app.add_option("--seconds", seconds, "how long to go on; the round under way is finished")
      ->capture_default_str()
      ->check(CLI::PositiveNumber);
  app.add_option("--seed", options.seed, "decides every choice")->capture_default_str();
  app.add_option("--clients", options.clients, "client processes at once")
      ->capture_default_str()
      ->check(CLI::Range(1, 64));
  app.add_option("--log", options.logFile, "file that gets the daemon's whole log; errors only are logged without");
  CLI11_PARSE(app, argc, argv);
  options.duration = std::chrono::seconds(seconds);
  std::cout << "replay with --seed " << options.seed << std::endl;
  try {
    const std::vector<std::string> faults = telvane::testing::Soak(options).run();
    constexpr size_t kMostShown = 20;
    for (size_t i = 0; i < std::min(faults.size(), kMostShown); ++i) std::cerr << "telvane-soak: " << faults[i] << '\n';
    if (!faults.empty()) std::cerr << faults.size() << " faults with --seed " << options.seed << std::endl;
    return faults.empty() ? 0 : 1;
  } catch (const std::exception& exception) {
    std::cerr << "telvane-soak: " << exception.what() << std::endl;
    return 1;
  }
}
