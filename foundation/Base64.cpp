#include "foundation/Base64.h"

#include <array>
#include <utility>
#include <vector>

namespace telvane {
namespace {

constexpr std::string_view kAlphabet = "ABCDEFGHIJKLMNOPQRSTUVWXYZabcdefghijklmnopqrstuvwxyz0123456789+/";
constexpr uint8_t kUnknown = 0xff;

constexpr std::array<uint8_t, 256> makeSextets() {
  std::array<uint8_t, 256> sextets{};
  sextets.fill(kUnknown);
  for (size_t i = 0; i < kAlphabet.size(); ++i) sextets[static_cast<uint8_t>(kAlphabet[i])] = static_cast<uint8_t>(i);
  return sextets;
}

constexpr std::array<uint8_t, 256> kSextets = makeSextets();

char digit(uint32_t group, unsigned shift) { return kAlphabet[(group >> shift) & 63]; }

}  // namespace

std::string base64Encode(std::span<const uint8_t> bytes) {
  std::string text;
  text.reserve((bytes.size() + 2) / 3 * 4);
  size_t i = 0;
  for (; i + 3 <= bytes.size(); i += 3) {
    const uint32_t group = uint32_t{bytes[i]} << 16 | uint32_t{bytes[i + 1]} << 8 | bytes[i + 2];
    for (const unsigned shift : {18u, 12u, 6u, 0u}) text += digit(group, shift);
  }
  const size_t rest = bytes.size() - i;
  if (rest == 0) return text;
  const uint32_t group = uint32_t{bytes[i]} << 16 | (rest == 2 ? uint32_t{bytes[i + 1]} << 8 : 0);
  text += digit(group, 18);
  text += digit(group, 12);
  text += rest == 2 ? digit(group, 6) : '=';
  text += '=';
  return text;
}

std::optional<Data> base64DecodeIgnoringUnknownCharacters(std::string_view text) {
  std::vector<uint8_t> bytes;
  bytes.reserve(text.size() / 4 * 3 + 2);
  uint32_t group = 0;
  size_t count = 0;
  bool padded = false;
  for (const char c : text) {
    if (c == '=') padded = true;
    const uint8_t sextet = kSextets[static_cast<uint8_t>(c)];
    if (sextet == kUnknown) continue;
    if (padded) return std::nullopt;
    group = group << 6 | sextet;
    if (++count % 4 != 0) continue;
    for (const unsigned shift : {16u, 8u, 0u}) bytes.push_back(static_cast<uint8_t>(group >> shift));
  }
  const size_t rest = count % 4;
  if (rest == 1) return std::nullopt;
  if (rest >= 2) bytes.push_back(static_cast<uint8_t>(group >> (rest * 6 - 8)));
  if (rest == 3) bytes.push_back(static_cast<uint8_t>(group >> 2));
  return Data(std::move(bytes));
}

}  // namespace telvane
