#include "daemon/TelvanedOptions.h"

#include <CLI/CLI.hpp>
#include <iostream>

namespace telvane {
namespace {

constexpr int kWrongUsage = 2;
constexpr int64_t kLongestIdleExit = 365 * 24 * 3600;

}  // namespace

std::variant<TelvanedOptions, int> parseTelvanedOptions(int argc, const char* const* argv) {
  CLI::App app("Takes events from the processes of this device and reports what its storebags allow.", "telvaned");
  app.set_version_flag("--version", "telvaned " TELVANE_VERSION);
  std::string level = "default";
  std::string target = "stderr";
  int64_t idleExit = 15;
  app.add_option("--log-level", level, "the least important level shown")
      ->check(CLI::IsMember({"error", "default", "info"}));
  app.add_option("--log-target", target, "where log lines go")->check(CLI::IsMember({"stderr", "journal"}));
  app.add_option("--idle-exit", idleExit,
                 "seconds without work after which a socket-activated daemon exits; 0 is never")
      ->check(CLI::Range(int64_t{0}, kLongestIdleExit));
  try {
    app.parse(argc, argv);
  } catch (const CLI::ParseError& error) {
    if (error.get_exit_code() == 0) return app.exit(error);
    std::cerr << "telvaned: " << error.what() << "; see telvaned --help\n";
    return kWrongUsage;
  }
  TelvanedOptions options;
  options.logLevel = logLevelFromName(level).value_or(options.logLevel);
  options.logTarget = logTargetFromName(target).value_or(options.logTarget);
  options.idleExit = std::chrono::seconds(idleExit);
  return options;
}

}  // namespace telvane
