#include "platform/log/StandardErrorLog.h"

#include <fmt/compile.h>
#include <unistd.h>

#include <iterator>
#include <utility>

namespace telvane {

namespace {

std::string_view markOf(LogLevel level) {
  switch (level) {
    case LogLevel::Error:
      return "<error> ";
    case LogLevel::Default:
      return "<default> ";
    case LogLevel::Info:
      break;
  }
  return "<info> ";
}

// All of a line that stands before the message.
class Prefix {
 public:
  Prefix(Date now, std::string_view nameAndProcess, LogLevel level) {
    const auto day = std::chrono::floor<std::chrono::days>(now.time());
    const std::chrono::year_month_day date(day);
    const std::chrono::hh_mm_ss time(now.time() - day);
    fmt::format_to(std::back_inserter(_text), FMT_COMPILE("{:04}-{:02}-{:02}T{:02}:{:02}:{:02}.{:06}Z{}{}"),
                   static_cast<int>(date.year()), static_cast<unsigned>(date.month()),
                   static_cast<unsigned>(date.day()), time.hours().count(), time.minutes().count(),
                   time.seconds().count(), time.subseconds().count(), nameAndProcess, markOf(level));
  }
  std::string_view text() const { return {_text.data(), _text.size()}; }

 private:
  fmt::basic_memory_buffer<char, 128> _text;
};

}  // namespace

StandardErrorLog::StandardErrorLog(LogLevel leastImportant, std::string program, std::shared_ptr<const Clock> clock,
                                   int descriptor, const LineWriter::Options& options)
    : Log(leastImportant),
      _clock(std::move(clock)),
      _descriptor(descriptor),
      _nameAndProcess(fmt::format(" {}[{}] ", program, getpid())),
      _writer(*this, options) {}

void StandardErrorLog::write(LogLevel level, std::string_view message) {
  _writer.append(Prefix(_clock->now(), _nameAndProcess, level).text(), message);
}

std::string StandardErrorLog::lineForDropped(uint64_t count) {
  const Prefix prefix(_clock->now(), _nameAndProcess, LogLevel::Error);
  return fmt::format("{}{} log lines were dropped here: standard error takes them too slowly\n", prefix.text(), count);
}

}  // namespace telvane
