#include "backends/DashboardDatagram.h"

#include <algorithm>
#include <cstring>
#include <string>
#include <vector>

#include "foundation/Description.h"

namespace telvane::dashboard {
namespace {

constexpr size_t kMajorVersionOffset = 0;
constexpr size_t kComponentTypeOffset = 1;
constexpr size_t kConstantOffset = 2;
constexpr size_t kFractionOffset = 3;
constexpr size_t kSecondsOffset = 4;
constexpr size_t kSessionIDOffset = 8;
constexpr size_t kClientVersionOffset = 12;
constexpr size_t kLengthOffset = 14;
constexpr size_t kMethodOffset = 16;
constexpr size_t kResponseCodeOffset = 18;
constexpr size_t kIdentifierOffset = 20;
constexpr size_t kFlagsOffset = 62;

constexpr uint8_t kConstant = 1;
constexpr int32_t kMicrosecondsPerFraction = 4000;
constexpr uint16_t kReliable = 1;
constexpr uint16_t kWithoutProfile = 2;

void put16(std::span<uint8_t> bytes, size_t offset, uint16_t value) {
  bytes[offset] = static_cast<uint8_t>(value >> 8);
  bytes[offset + 1] = static_cast<uint8_t>(value);
}

void put32(std::span<uint8_t> bytes, size_t offset, uint32_t value) {
  put16(bytes, offset, static_cast<uint16_t>(value >> 16));
  put16(bytes, offset + 2, static_cast<uint16_t>(value));
}

uint16_t get16(std::span<const uint8_t> bytes, size_t offset) noexcept {
  return static_cast<uint16_t>(bytes[offset] << 8 | bytes[offset + 1]);
}

uint32_t get32(std::span<const uint8_t> bytes, size_t offset) noexcept {
  return static_cast<uint32_t>(get16(bytes, offset)) << 16 | get16(bytes, offset + 2);
}

uint16_t complement(uint16_t value) noexcept { return static_cast<uint16_t>(~value); }

bool continuesCharacter(char byte) noexcept { return (static_cast<unsigned char>(byte) & 0xC0) == 0x80; }

size_t characterCount(std::string_view text) noexcept {
  return static_cast<size_t>(
      std::count_if(text.begin(), text.end(), [](char byte) { return !continuesCharacter(byte); }));
}

// The largest length up to the limit that cuts no character.
size_t lengthWithin(std::string_view text, size_t limit) noexcept {
  if (text.size() <= limit) return text.size();
  constexpr size_t kLongestCharacter = 4;
  for (size_t length = limit; length > 0 && limit - length < kLongestCharacter; --length) {
    if (!continuesCharacter(text[length])) return length;
  }
  return limit;  // no UTF-8
}

std::string withoutLineFeeds(std::string_view text) {
  std::string result(text);
  std::erase(result, '\n');
  return result;
}

struct Item {
  std::string_view key;
  String value;
  size_t length = 0;  // characters of the value
};

std::vector<Item> itemsByLength(const Dictionary& event) {
  std::vector<Item> items;
  items.reserve(event.size());
  for (const DictionaryEntry& entry : event) {
    String value = descriptionForObject(entry.value);
    const size_t length = characterCount(value);
    items.push_back({entry.key, std::move(value), length});
  }
  std::stable_sort(items.begin(), items.end(), [](const Item& a, const Item& b) { return a.length < b.length; });
  return items;
}

}  // namespace

void writeHeader(const Header& header, size_t textLength, std::span<uint8_t> bytes) {
  bytes[kMajorVersionOffset] = header.majorVersion;
  bytes[kComponentTypeOffset] = header.componentType;
  bytes[kConstantOffset] = kConstant;
  bytes[kFractionOffset] = static_cast<uint8_t>(header.timestamp.microseconds() / kMicrosecondsPerFraction);
  put32(bytes, kSecondsOffset, static_cast<uint32_t>(header.timestamp.wholeSeconds()));
  put32(bytes, kSessionIDOffset, ~header.sessionID);
  put16(bytes, kClientVersionOffset, complement(header.clientVersion));
  put16(bytes, kLengthOffset, complement(static_cast<uint16_t>(kHeaderLength + textLength)));
  put16(bytes, kMethodOffset, header.method);
  put16(bytes, kResponseCodeOffset, header.responseCode);
  const std::span<uint8_t> identifier = bytes.subspan(kIdentifierOffset, kIdentifierLength);
  std::fill(identifier.begin(), identifier.end(), uint8_t{0});
  const std::string_view given = header.deviceIdentifier.substr(0, kIdentifierLength);
  std::copy(given.begin(), given.end(), identifier.begin());
  put16(bytes, kEventIDOffset, header.eventID);
  put16(bytes, kFlagsOffset,
        static_cast<uint16_t>((header.isReliable ? kReliable : 0) | (header.isWithoutProfile ? kWithoutProfile : 0)));
}

Header readHeader(std::span<const uint8_t> bytes) noexcept {
  const uint16_t flags = get16(bytes, kFlagsOffset);
  const auto* const identifier = reinterpret_cast<const char*>(bytes.data() + kIdentifierOffset);
  return {
      .majorVersion = bytes[kMajorVersionOffset],
      .componentType = bytes[kComponentTypeOffset],
      .timestamp = Date(Date::TimePoint(std::chrono::seconds(get32(bytes, kSecondsOffset)) +
                                        std::chrono::microseconds(bytes[kFractionOffset] * kMicrosecondsPerFraction))),
      .sessionID = ~get32(bytes, kSessionIDOffset),
      .clientVersion = complement(get16(bytes, kClientVersionOffset)),
      .method = get16(bytes, kMethodOffset),
      .responseCode = get16(bytes, kResponseCodeOffset),
      .deviceIdentifier = std::string_view(identifier, strnlen(identifier, kIdentifierLength)),
      .eventID = get16(bytes, kEventIDOffset),
      .isReliable = (flags & kReliable) != 0,
      .isWithoutProfile = (flags & kWithoutProfile) != 0};
}

size_t writeText(const Dictionary& event, std::span<char> text) {
  std::string whole;
  for (const Item& item : itemsByLength(event)) {
    whole += ' ';
    whole += withoutLineFeeds(item.key);
    whole += '=';
    whole += sanitize(item.value).view();
    if (whole.size() > text.size()) break;  // the rest has no room
  }
  const size_t length = lengthWithin(whole, text.size());
  std::copy_n(whole.begin(), length, text.begin());
  return length;
}

uint16_t eventIDOf(std::span<const uint8_t> bytes) noexcept { return get16(bytes, kEventIDOffset); }

String descriptionForObject(const Value& object) {
  if (const String* text = object.string()) return *text;
  return object.isNumber() ? String(description(object)) : String::fromStatic("null");
}

String sanitize(std::string_view text) {
  std::string result;
  result.reserve(text.size());
  for (const char c : text) {
    if (c == '\n') continue;
    if (c == '\\' || c == '=') result += '\\';
    result += c;
  }
  return result.empty() ? String::fromStatic("empty") : String(result);
}

}  // namespace telvane::dashboard
