#include "collector/DashboardEvent.h"

#include <fmt/format.h>

#include <algorithm>
#include <cerrno>
#include <optional>

namespace telvane {
namespace {

constexpr size_t kHeaderLength = 64;
constexpr size_t kLongestDatagram = 1087;
constexpr size_t kIdentifierOffset = 20;
constexpr size_t kIdentifierLength = 40;
constexpr uint8_t kConstant = 1;
constexpr int kMicrosecondsPerFraction = 4000;
constexpr uint16_t kReliable = 1;
constexpr uint16_t kWithoutProfile = 2;
constexpr size_t kNothing = std::string_view::npos;

uint16_t get16(std::span<const uint8_t> bytes, size_t offset) {
  return static_cast<uint16_t>(bytes[offset] << 8 | bytes[offset + 1]);
}

uint32_t get32(std::span<const uint8_t> bytes, size_t offset) {
  return static_cast<uint32_t>(get16(bytes, offset)) << 16 | get16(bytes, offset + 2);
}

uint16_t complement(uint16_t value) { return static_cast<uint16_t>(~value); }

Error noEvent(std::string reason) {
  return Error::withDescription(kPlatformErrorDomain, EBADMSG, "no event of a dashboard: " + std::move(reason));
}

std::string textOf(std::span<const uint8_t> bytes) { return {bytes.begin(), bytes.end()}; }

// The next "=" that is no part of a value.
size_t nextEquals(std::string_view text, size_t from) {
  for (size_t at = from; at < text.size(); ++at) {
    if (text[at] == '=') return at;
    if (text[at] == '\\') ++at;
  }
  return kNothing;
}

std::string unescaped(std::string_view value) {
  std::string result;
  for (size_t at = 0; at < value.size(); ++at) {
    if (value[at] == '\\' && at + 1 < value.size()) ++at;
    result += value[at];
  }
  return result;
}

// Controls of one byte, and those from U+0080 to U+009F, which terminals obey as well.
std::string withoutControls(std::string line) {
  for (size_t at = 0; at < line.size(); ++at) {
    const auto byte = static_cast<uint8_t>(line[at]);
    const auto next = static_cast<uint8_t>(at + 1 < line.size() ? line[at + 1] : '\0');
    if (byte < ' ' || byte == 0x7f) line[at] = '?';
    if (byte == 0xC2 && next >= 0x80 && next <= 0x9F) line.replace(at, 2, "?");
  }
  return line;
}

}  // namespace

Result<DashboardEvent> DashboardEvent::decode(std::span<const uint8_t> datagram) {
  if (datagram.size() > kLongestDatagram) return noEvent(fmt::format("{} bytes are too many", datagram.size()));
  if (datagram.size() < kHeaderLength) return noEvent(fmt::format("{} bytes are no header", datagram.size()));
  if (datagram[2] != kConstant) return noEvent(fmt::format("byte 2 is {}, not 1", datagram[2]));
  const uint16_t length = complement(get16(datagram, 14));
  if (length != datagram.size()) {
    return noEvent(fmt::format("it says that it has {} bytes and has {}", length, datagram.size()));
  }
  const uint16_t flags = get16(datagram, 62);
  DashboardEvent event;
  event.majorVersion = datagram[0];
  event.clientType = datagram[1];
  event.time = Date(Date::TimePoint(std::chrono::seconds(get32(datagram, 4)) +
                                    std::chrono::microseconds(datagram[3] * kMicrosecondsPerFraction)));
  event.sessionID = ~get32(datagram, 8);
  event.clientVersion = complement(get16(datagram, 12));
  event.method = get16(datagram, 16);
  event.status = get16(datagram, 18);
  event.deviceIdentifier = textOf(datagram.subspan(kIdentifierOffset, kIdentifierLength));
  event.deviceIdentifier.resize(std::min(event.deviceIdentifier.size(), event.deviceIdentifier.find('\0')));
  event.eventID = get16(datagram, 60);
  event.isReliable = (flags & kReliable) != 0;
  event.isAddressedByBag = (flags & kWithoutProfile) == 0;
  event.text = textOf(datagram.subspan(kHeaderLength));
  return event;
}

Dictionary DashboardEvent::dictionary() const {
  Dictionary event;
  event.set("_method", Value(method));
  event.set("_status", Value(status));
  event.set("_eventNumber", Value(eventID));
  event.set("_sessionID", Value(sessionID));
  event.set("_clientVersion", Value(clientVersion));
  event.set("_clientTS", Value(time.secondsSince1970()));
  event.set("clientType", Value(clientType));
  event.set("majorVersion", Value(majorVersion));
  event.set("deviceIdentifier", Value(deviceIdentifier));
  event.set("fields", dashboardFields(text));
  return event;
}

std::string DashboardEvent::line() const {
  constexpr int kMicrosecondsPerMillisecond = 1000;
  std::string line = fmt::format("{}.{:03} {} client type {} session {} event {} method {} status {}{}",
                                 time.wholeSeconds(), time.microseconds() / kMicrosecondsPerMillisecond,
                                 deviceIdentifier, clientType, sessionID, eventID, method, status, text);
  return withoutControls(std::move(line));
}

Dictionary dashboardFields(std::string_view text) {
  Dictionary fields;
  std::optional<String> key;
  size_t valueStart = 0;
  for (size_t equals = nextEquals(text, 0); equals != kNothing; equals = nextEquals(text, equals + 1)) {
    // No further back than the value begins: the whole text anew for each "=" would take seconds for a hostile one.
    const size_t blank = text.substr(valueStart, equals - valueStart).rfind(' ');
    const size_t valueEnd = blank != kNothing ? valueStart + blank : valueStart;
    const size_t keyStart = blank != kNothing ? valueEnd + 1 : valueStart;
    if (key.has_value()) fields.set(*key, Value(unescaped(text.substr(valueStart, valueEnd - valueStart))));
    key = String(text.substr(keyStart, equals - keyStart));
    valueStart = equals + 1;
  }
  if (key.has_value()) fields.set(*key, Value(unescaped(text.substr(valueStart))));
  return fields;
}

}  // namespace telvane
