#pragma once

#include <optional>
#include <string>

namespace telvane {

// The variables that the process was started with. The only place that asks for them.
struct Environment {
  std::optional<std::string> root;           // TELVANE_ROOT
  std::optional<std::string> bundle;         // TELVANE_BUNDLE
  std::optional<std::string> certificates;   // TELVANE_CA_FILE
  std::optional<std::string> home;           // HOME
  std::optional<std::string> localeAll;      // LC_ALL
  std::optional<std::string> localeDefault;  // LANG

  // Reads the variables; empty ones count as absent. In a process that runs with more rights than its starter none is
  // read, because the starter chose them.
  static Environment read();
};

}  // namespace telvane
