#include "platform/system/UTF8.h"

#include <cstdint>
#include <cstring>

namespace telvane::utf8 {
namespace {

constexpr std::string_view kReplacement = "\xEF\xBF\xBD";
constexpr uint64_t kHighBits = 0x8080808080808080u;

struct Sequence {
  size_t size;  // at least 1
  bool isValid;
};

// What a lead byte asks for: how many bytes follow, and the range of the first of them, which is where overlong forms,
// surrogates and numbers beyond the last character show.
struct Lead {
  size_t following;
  uint8_t lowest;
  uint8_t highest;
};

constexpr Lead leadOf(uint8_t byte) {
  if (byte >= 0xC2 && byte <= 0xDF) return {1, 0x80, 0xBF};
  if (byte == 0xE0) return {2, 0xA0, 0xBF};
  if (byte == 0xED) return {2, 0x80, 0x9F};
  if (byte >= 0xE1 && byte <= 0xEF) return {2, 0x80, 0xBF};
  if (byte == 0xF0) return {3, 0x90, 0xBF};
  if (byte >= 0xF1 && byte <= 0xF3) return {3, 0x80, 0xBF};
  if (byte == 0xF4) return {3, 0x80, 0x8F};
  return {0, 0, 0};
}

// REQUIRES: text is not empty.
Sequence firstSequence(std::string_view text) {
  const auto first = static_cast<uint8_t>(text[0]);
  if (first < 0x80) return {1, true};
  const Lead lead = leadOf(first);
  if (lead.following == 0) return {1, false};
  for (size_t i = 1; i <= lead.following; ++i) {
    if (i == text.size()) return {i, false};
    const auto byte = static_cast<uint8_t>(text[i]);
    const bool fits = i == 1 ? byte >= lead.lowest && byte <= lead.highest : byte >= 0x80 && byte <= 0xBF;
    if (!fits) return {i, false};
  }
  return {lead.following + 1, true};
}

// Skips whole words of ASCII, which most text is made of.
size_t asciiPrefix(std::string_view text) {
  size_t position = 0;
  for (uint64_t word = 0; position + sizeof word <= text.size(); position += sizeof word) {
    std::memcpy(&word, text.data() + position, sizeof word);
    if ((word & kHighBits) != 0) break;
  }
  return position;
}

// The number of leading bytes that are well-formed.
size_t validPrefix(std::string_view text) {
  size_t position = asciiPrefix(text);
  while (position < text.size()) {
    const Sequence sequence = firstSequence(text.substr(position));
    if (!sequence.isValid) break;
    position += sequence.size;
  }
  return position;
}

}  // namespace

bool isValid(std::string_view text) noexcept { return validPrefix(text) == text.size(); }

std::string repaired(std::string_view text) {
  std::string result;
  result.reserve(text.size() + kReplacement.size());
  while (!text.empty()) {
    const size_t valid = validPrefix(text);
    result += text.substr(0, valid);
    text.remove_prefix(valid);
    if (text.empty()) break;
    result += kReplacement;
    text.remove_prefix(firstSequence(text).size);
  }
  return result;
}

}  // namespace telvane::utf8
