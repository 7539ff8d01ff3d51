#include "tools/VisibleText.h"

#include <fmt/format.h>

#include <algorithm>
#include <cstdint>
#include <optional>

namespace telvane {
namespace {

struct Character {
  uint32_t number = 0;
  size_t size = 0;
};

struct Span {
  uint32_t first;
  uint32_t last;
};

constexpr Span kActedOn[] = {
    {0x00, 0x1F},      {0x7F, 0x9F},      // controls
    {0x061C, 0x061C},  {0x200E, 0x200F},  // marks of writing direction
    {0x202A, 0x202E},  {0x2066, 0x2069},  // embeddings, overrides and isolates of writing direction
    {0x2028, 0x2029},                     // line and paragraph separators
    {0x200B, 0x200D},  {0x2060, 0x2064},  // without width
    {0xFEFF, 0xFEFF},                     // byte-order mark
    {0xE0000, 0xE007F}                    // tags
};

bool isActedOn(uint32_t number) noexcept {
  return std::any_of(std::begin(kActedOn), std::end(kActedOn),
                     [number](const Span& span) { return number >= span.first && number <= span.last; });
}

// Returns the character that the text begins with, or nothing when these bytes are no UTF-8.
std::optional<Character> firstCharacter(std::string_view text) noexcept {
  const auto byteAt = [text](size_t index) { return static_cast<unsigned char>(text[index]); };
  const unsigned char lead = byteAt(0);
  if (lead < 0x80) return Character{lead, 1};
  const size_t size = lead >= 0xF0 ? 4 : lead >= 0xE0 ? 3 : 2;
  if (lead < 0xC2 || lead > 0xF4 || text.size() < size) return std::nullopt;
  uint32_t number = lead & (0xFFu >> (size + 1));
  for (size_t i = 1; i < size; ++i) {
    if ((byteAt(i) & 0xC0) != 0x80) return std::nullopt;
    number = number << 6 | (byteAt(i) & 0x3Fu);
  }
  constexpr uint32_t kLeast[] = {0, 0, 0x80, 0x800, 0x10000};  // less is written in fewer bytes
  return number >= kLeast[size] ? std::optional(Character{number, size}) : std::nullopt;
}

std::string escaped(uint32_t number) {
  if (number == '\n') return "\\n";
  if (number == '\t') return "\\t";
  if (number == '\r') return "\\r";
  return fmt::format("\\u{:04x}", number);
}

}  // namespace

std::string visibleText(std::string_view text) {
  std::string result;
  result.reserve(text.size());
  while (!text.empty()) {
    const std::optional<Character> character = firstCharacter(text);
    const size_t size = character.has_value() ? character->size : 1;
    if (!character.has_value()) {
      result += fmt::format("\\x{:02x}", static_cast<unsigned char>(text.front()));
    } else if (isActedOn(character->number)) {
      result += escaped(character->number);
    } else {
      result += text.substr(0, size);
    }
    text.remove_prefix(size);
  }
  return result;
}

}  // namespace telvane
