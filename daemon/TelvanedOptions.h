#pragma once

#include <chrono>
#include <variant>

#include "platform/log/LogFactory.h"

namespace telvane {

// What telvaned was asked for on its command line.
struct TelvanedOptions {
  LogLevel logLevel = LogLevel::Default;
  LogTarget logTarget = LogTarget::StandardError;
  // How long without a transaction a daemon that its socket activated stays; 0 is for ever.
  std::chrono::seconds idleExit{15};
};

// Reads the command line. Returns the options, or the exit status when there is nothing more to do: 0 after --help and
// --version (printed to standard output), 2 on wrong usage (one line on standard error).
std::variant<TelvanedOptions, int> parseTelvanedOptions(int argc, const char* const* argv);

}  // namespace telvane
