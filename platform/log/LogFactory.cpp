#include "platform/log/LogFactory.h"

#include <unistd.h>

#include <utility>

#include "platform/dispatch/SystemClock.h"
#include "platform/log/JournalLog.h"
#include "platform/log/NullLog.h"
#include "platform/log/StandardErrorLog.h"

namespace telvane {

namespace {

bool hasJournal() { return access("/run/systemd/journal/stdout", W_OK) == 0; }

std::unique_ptr<Log> newStandardErrorLog(LogLevel leastImportant, std::string program) {
  return std::make_unique<StandardErrorLog>(leastImportant, std::move(program), std::make_shared<SystemClock>(),
                                            STDERR_FILENO);
}

}  // namespace

std::unique_ptr<Log> newLog(LogTarget target, LogLevel leastImportant, std::string program) {
  if (target == LogTarget::StandardError) return newStandardErrorLog(leastImportant, std::move(program));
  if (hasJournal()) return std::make_unique<JournalLog>(leastImportant, program);
  if (target == LogTarget::JournalOrNothing) return std::make_unique<NullLog>();
  auto log = newStandardErrorLog(leastImportant, std::move(program));
  log->error("This system has no journal: logging to standard error");
  return log;
}

std::optional<LogLevel> logLevelFromName(std::string_view name) noexcept {
  if (name == "error") return LogLevel::Error;
  if (name == "default") return LogLevel::Default;
  if (name == "info") return LogLevel::Info;
  return std::nullopt;
}

std::optional<LogTarget> logTargetFromName(std::string_view name) noexcept {
  if (name == "stderr") return LogTarget::StandardError;
  if (name == "journal") return LogTarget::Journal;
  return std::nullopt;
}

}  // namespace telvane
