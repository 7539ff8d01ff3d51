#include "backends/LoggableAnswer.h"

#include <fmt/format.h>

#include <algorithm>

namespace telvane {
namespace {

bool isContinuation(char c) noexcept { return (static_cast<uint8_t>(c) & 0xC0u) == 0x80u; }

// Of the single bytes; line feeds excepted.
bool isControl(char c) noexcept { return (static_cast<uint8_t>(c) < ' ' && c != '\n') || c == '\x7f'; }

// U+0080 to U+009F: controls as well, to terminals that know them.
bool isLongControl(char lead, char next) noexcept { return lead == '\xC2' && static_cast<uint8_t>(next) < 0xA0; }

}  // namespace

std::string loggableAnswer(std::string_view text) {
  size_t size = std::min(text.size(), kMostLoggedAnswer);
  while (size < text.size() && size > 0 && isContinuation(text[size])) --size;
  std::string line(text.substr(0, size));
  for (size_t at = 0; at < line.size(); ++at) {
    if (isControl(line[at])) line[at] = ' ';
    if (at + 1 < line.size() && isLongControl(line[at], line[at + 1])) line.replace(at, 2, "  ");
  }
  if (size < text.size()) line += fmt::format("... ({} bytes)", text.size());
  return line;
}

}  // namespace telvane
