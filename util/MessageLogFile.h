#pragma once

#include <fmt/format.h>

#include <memory>
#include <optional>
#include <string>

#include "foundation/Format.h"
#include "platform/Dispatch.h"
#include "util/MessageLogFolder.h"

namespace telvane {

// The daemon's message log: what backends returned for messages, in a text file that the diagnostics submission service
// picks up. One file at a time, a new one each day; the old ones go to the service.
//
// Made by the entry point for the whole process; outlives its sessions. Safe from any thread: a call that writes does
// so alone, from the choice of the file to its closing, so lines of several sessions stand whole and in the order of
// their dates. It blocks for as long as the disk takes, so it is called only when there is a text.
//
// A line is "(2024-05-01 13:45:10 +0000) MESSAGE" with the time in UTC. A message that has line feeds keeps them: it is
// mostly JSON for a person to read. A line that begins a message is told by its date, since JSON begins no line with
// a parenthesis.
//
// What cannot be written is lost, with a line in the log; the next call tries anew.
class MessageLogFile {
 public:
  // platform: must outlive this object.
  explicit MessageLogFile(Platform& platform);

  // Adds one line. Looks for the file to use, or makes one, when there is none yet or when it is older than a day.
  template <class... Args>
  void writeToLogFile(fmt::format_string<Args...> format, Args&&... args) {
    appendMessage(fmt::vformat(format, fmt::make_format_args(args...)));
  }

 private:
  void appendMessage(const std::string& message);
  bool isScanDue(Date now) const REQUIRES(*_lock);
  // Chooses the newest file that is not expired, and retires the others; makes one when there is none.
  void scan(Date now) REQUIRES(*_lock);
  void considerFile(const std::string& path, Date now) REQUIRES(*_lock);
  void adopt(const std::string& path, std::optional<Date> creationDate) REQUIRES(*_lock);
  void retire(const std::string& path, const std::optional<Date>& creationDate) REQUIRES(*_lock);
  void appendLine(const std::string& message, Date now) REQUIRES(*_lock);

  // Constant after construction.
  Platform& _platform;
  // Held while files are looked for, moved and written, which may take as long as a disk does.
  const std::unique_ptr<Monitor> _lock;

  MessageLogFolder _folder GUARDED_BY(*_lock);
  // The file in use. Without a known creation date it is used for as long as the process lives.
  std::optional<std::string> _currentPath GUARDED_BY(*_lock);
  std::optional<Date> _currentCreationDate GUARDED_BY(*_lock);
};

}  // namespace telvane
