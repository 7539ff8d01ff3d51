#include "platform/log/JournalLog.h"

#include <fcntl.h>
#include <syslog.h>
#include <systemd/sd-journal.h>
#include <unistd.h>

#include <utility>

namespace telvane {

namespace {

// The journal reads the priority from the beginning of each line.
std::string_view prefixOf(LogLevel level) {
  static_assert(LOG_ERR == 3 && LOG_NOTICE == 5 && LOG_INFO == 6);
  switch (level) {
    case LogLevel::Error:
      return "<3>";
    case LogLevel::Default:
      return "<5>";
    case LogLevel::Info:
      break;
  }
  return "<6>";
}

}  // namespace

JournalLog::JournalLog(LogLevel leastImportant, const std::string& program)
    : JournalLog(leastImportant, [program] { return sd_journal_stream_fd(program.c_str(), LOG_NOTICE, 1); }) {}

JournalLog::JournalLog(LogLevel leastImportant, OpenStream openStream, const LineWriter::Options& options)
    : Log(leastImportant), _openStream(std::move(openStream)), _writer(*this, options) {}

JournalLog::~JournalLog() = default;

void JournalLog::write(LogLevel level, std::string_view message) { _writer.append(prefixOf(level), message); }

int JournalLog::descriptor() {
  if (_stream.descriptor >= 0) return _stream.descriptor;
  _stream.descriptor = _openStream();
  if (_stream.descriptor >= 0) fcntl(_stream.descriptor, F_SETFL, fcntl(_stream.descriptor, F_GETFL) | O_NONBLOCK);
  return _stream.descriptor;
}

std::string JournalLog::lineForDropped(uint64_t count) {
  return fmt::format("{}{} log lines were dropped here: the journal takes them too slowly\n", prefixOf(LogLevel::Error),
                     count);
}

void JournalLog::Stream::close() {
  if (descriptor >= 0) ::close(std::exchange(descriptor, -1));
}

}  // namespace telvane
