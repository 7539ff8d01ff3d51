#pragma once

#include <cstdint>
#include <optional>
#include <span>
#include <string>
#include <string_view>

#include "foundation/Data.h"
#include "foundation/Export.h"

namespace telvane {

// Encodes in the standard alphabet with padding and without line breaks (RFC 4648, section 4).
TELVANE_EXPORT std::string base64Encode(std::span<const uint8_t> bytes);

// Decodes, passing over every character outside the alphabet (line breaks in hand-wrapped text). Returns nothing when
// what is left is no whole number of bytes (a single left-over character, or data after padding).
TELVANE_EXPORT std::optional<Data> base64DecodeIgnoringUnknownCharacters(std::string_view text);

}  // namespace telvane
