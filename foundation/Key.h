#pragma once

#include <cstdint>
#include <string_view>

#include "foundation/String.h"

namespace telvane {

// 32-bit FNV-1a; dictionaries compare it before they compare bytes.
constexpr uint32_t keyHash(std::string_view text) noexcept {
  uint32_t hash = 2166136261u;
  for (char c : text) hash = (hash ^ static_cast<uint8_t>(c)) * 16777619u;
  return hash;
}

// A dictionary key that is known at compile time: its hash is computed by the compiler and its text is never copied.
// `inline constexpr Key kTelvaneUserInfoClientName{"_clientName"};`
class TELVANE_EXPORT Key {
 public:
  template <size_t N>
  consteval Key(const char (&text)[N]) : _text(text, N - 1), _hash(keyHash(_text)) {}
  constexpr std::string_view view() const noexcept { return _text; }
  constexpr operator std::string_view() const noexcept { return _text; }
  constexpr uint32_t hash() const noexcept { return _hash; }
  String string() const noexcept { return String::fromStatic(_text); }

  friend constexpr bool operator==(const Key& a, const Key& b) noexcept { return a._text == b._text; }
  friend constexpr bool operator==(const Key& a, std::string_view b) noexcept { return a._text == b; }
  friend bool operator==(const Key& a, const String& b) noexcept { return a._text == b.view(); }

 private:
  std::string_view _text;
  uint32_t _hash;
};

constexpr String::String(const Key& key) noexcept
    : String(key.view().data(), static_cast<uint32_t>(key.view().size())) {}

}  // namespace telvane
