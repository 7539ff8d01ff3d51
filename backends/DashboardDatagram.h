#pragma once

#include <cstddef>
#include <cstdint>
#include <span>
#include <string_view>

#include "foundation/Date.h"
#include "foundation/Value.h"

// The datagram that a dashboard takes for each event: a header of 64 bytes and a text. docs/dashboard-protocol.md shows
// one byte by byte.
namespace telvane::dashboard {

inline constexpr size_t kHeaderLength = 64;
inline constexpr size_t kLongestText = 1023;
// With a byte for the null character that programs in C put behind the text; it is never sent.
inline constexpr size_t kBufferLength = kHeaderLength + kLongestText + 1;
inline constexpr size_t kIdentifierLength = 40;
// Where the event ID stands, in acknowledgements too.
inline constexpr size_t kEventIDOffset = 60;

struct Header {
  uint8_t majorVersion = 0;   // of the reporting component
  uint8_t componentType = 0;  // the client type's low byte
  Date timestamp;
  uint32_t sessionID = 0;
  uint16_t clientVersion = 0;
  uint16_t method = 0;
  uint16_t responseCode = 0;
  std::string_view deviceIdentifier;  // the first 40 bytes go out; what is missing is zero
  uint16_t eventID = 0;
  bool isReliable = false;
  bool isWithoutProfile = false;
};

// Writes the 64 bytes. REQUIRES: bytes has them.
void writeHeader(const Header& header, size_t textLength, std::span<uint8_t> bytes);
// Reads a header's bytes back. The identifier ends at its first null character and refers to the bytes; of the
// timestamp there is what the datagram has, a resolution of 4 ms. REQUIRES: bytes has 64.
Header readHeader(std::span<const uint8_t> bytes) noexcept;

// Writes the event's fields as " key=value" each, the shortest value first, and returns the length. What does not fit
// is cut between two characters. Line feeds in a key are left out, as in values, so that nobody forges lines of logs.
size_t writeText(const Dictionary& event, std::span<char> text);

// The event ID that an acknowledgement names.
uint16_t eventIDOf(std::span<const uint8_t> bytes) noexcept;

// A field's value as text: text and numbers as they are described, "null" for everything else.
String descriptionForObject(const Value& object);
// The text without line feeds, a backslash before each backslash and each "="; "empty" when nothing is left.
String sanitize(std::string_view text);

}  // namespace telvane::dashboard
