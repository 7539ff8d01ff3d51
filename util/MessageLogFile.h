#pragma once

#include <fmt/format.h>

#include <string_view>

namespace telvane {

// The daemon's message log: what backends returned for messages, for the diagnostics submission service to pick up.
// Safe from any thread. Nothing is kept yet: lines are taken and dropped, unformatted.
class MessageLogFile {
 public:
  template <class... Args>
  void writeToLogFile(fmt::format_string<Args...>, Args&&...) {}
};

}  // namespace telvane
