#pragma once

#include <string>
#include <string_view>

namespace telvane::utf8 {

// Whether every byte belongs to a well-formed sequence (no overlong forms, no surrogates, nothing above U+10FFFF).
bool isValid(std::string_view text) noexcept;
// Returns the text with U+FFFD for each longest piece that can be no part of a well-formed sequence.
std::string repaired(std::string_view text);

}  // namespace telvane::utf8
