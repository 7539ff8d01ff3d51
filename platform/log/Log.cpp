#include "platform/Log.h"

#include <exception>
#include <iterator>

namespace telvane {

void Log::formatAndWrite(LogLevel level, fmt::string_view format, fmt::format_args args) {
  fmt::memory_buffer text;
  try {
    fmt::vformat_to(std::back_inserter(text), format, args);
  } catch (const std::exception&) {
    // A value that cannot be told (a width that makes no sense, no memory) costs its line, not the process.
    return write(level, std::string_view(format.data(), format.size()));
  }
  write(level, std::string_view(text.data(), text.size()));
}

}  // namespace telvane
