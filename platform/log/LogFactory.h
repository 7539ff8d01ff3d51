#pragma once

#include <memory>
#include <optional>
#include <string>
#include <string_view>

#include "platform/Log.h"

// How programs and the client library come by their log.
namespace telvane {

enum class LogTarget {
  StandardError,
  // Standard error, after a line that says so, on a system without a journal.
  Journal,
  // Nothing on a system without a journal: for a library, which never prints.
  JournalOrNothing,
};

// Makes the log of this process. program: the name shown with each line. Whoever owns it lets go of it last, which
// writes what is left.
std::unique_ptr<Log> newLog(LogTarget target, LogLevel leastImportant, std::string program);

// Return what "error", "default", "info", and what "stderr", "journal" name; nothing for another text.
std::optional<LogLevel> logLevelFromName(std::string_view name) noexcept;
std::optional<LogTarget> logTargetFromName(std::string_view name) noexcept;

}  // namespace telvane
