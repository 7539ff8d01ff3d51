#pragma once

#include <fmt/format.h>

#include <string>
#include <string_view>

#include "foundation/Format.h"

namespace telvane {

enum class LogLevel : uint8_t { Error = 0, Default = 1, Info = 2 };

// The unified log. One call is one message and one line, whatever it holds. Safe from any thread; writing never waits
// for the line to reach its target. Nothing is formatted when the level is off, so arguments are given as they are
// (a Value, an Error), not as ready texts.
//
//   _log.message("storebagForSession: Cached storebag found for client type {}", clientType);
class Log {
 public:
  virtual ~Log() = default;

  // Waits until what was written has reached its target, for a second at most. For a process that is about to end.
  virtual void flush() {}
  bool isEnabled(LogLevel level) const noexcept { return level <= _leastImportant; }

  template <class... Args>
  void message(fmt::format_string<Args...> format, Args&&... args) {
    if (isEnabled(LogLevel::Default)) formatAndWrite(LogLevel::Default, format, fmt::make_format_args(args...));
  }
  template <class... Args>
  void info(fmt::format_string<Args...> format, Args&&... args) {
    if (isEnabled(LogLevel::Info)) formatAndWrite(LogLevel::Info, format, fmt::make_format_args(args...));
  }
  template <class... Args>
  void error(fmt::format_string<Args...> format, Args&&... args) {
    if (isEnabled(LogLevel::Error)) formatAndWrite(LogLevel::Error, format, fmt::make_format_args(args...));
  }

 protected:
  explicit Log(LogLevel leastImportant) noexcept : _leastImportant(leastImportant) {}
  // Takes one message; line feeds inside it become "\n" where the target is made of lines.
  virtual void write(LogLevel level, std::string_view message) = 0;

 private:
  void formatAndWrite(LogLevel level, fmt::string_view format, fmt::format_args args);
  const LogLevel _leastImportant;
};

}  // namespace telvane
