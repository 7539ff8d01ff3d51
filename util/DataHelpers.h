#pragma once

#include <cstdint>
#include <optional>
#include <span>

#include "foundation/Data.h"
#include "foundation/Date.h"
#include "foundation/Value.h"
#include "platform/DeviceAnswers.h"
#include "platform/Log.h"
#include "platform/Random.h"
#include "platform/UserDefaults.h"

// Small services that the daemon's classes share.
namespace telvane {

struct Platform;

// Compresses in gzip or zlib framing. Nothing (and an error line) for empty input or when zlib refuses.
std::optional<Data> compressDataWithZlibOrGzip(Log& log, bool useGzip, std::string_view data);
// The same with gzip.
std::optional<Data> gzipDeflate(Log& log, std::string_view data);

// Returns the identifier kept for the two parts (each may be empty), making and storing one on first use. It is kept
// under "uuid:<client part>:<suffix part>". Parts come from clients: where they are longer than 256 bytes together, or
// one has control characters, each stands there by its SHA-256.
String getPersistentIdentifierForCustomClientIDSuffix(Platform& platform, std::string_view clientPart,
                                                      std::string_view suffixPart);

// Copies the unique device ID as NUL-terminated UTF-8 into the buffer, cut to its size; leaves the buffer alone when
// the device has none.
void copyUniqueDeviceID(const DeviceAnswers& deviceAnswers, std::span<char> buffer);

// "%@:%@" of the lower-cased client name and service name, an empty text for a missing one.
String clientServiceKey(const Value& userInfo);

// The text under the key in the suite of Telvane's own settings; nothing when it is absent or no text.
std::optional<String> userDefaultsString(const UserDefaults& userDefaults, const Key& key);

double timeOfDayToSeconds(int64_t seconds, int32_t microseconds) noexcept;
// The value, or -1.0 when it is infinite or not a number.
double finiteOrMinusOne(double value) noexcept;
// Unchanged on internal builds, else truncated toward zero to a multiple of 60, so that what leaves a customer's device
// carries no seconds.
int64_t minuteRounding(int64_t seconds, bool isInternalBuild) noexcept;
// Estimates the memory of a container's content in bytes: keys, values and, recursively, what they contain; 0 for
// anything but a container. Wraps at 32 bits.
uint32_t objectSizeEstimate(const Value& value) noexcept;
uint32_t objectSizeEstimate(const Dictionary& dictionary) noexcept;

// An absent value for absent text, which shows as "(null)" in lines and headers.
template <class T>
Value valueOf(const std::optional<T>& value) {
  return value.has_value() ? Value(*value) : Value();
}

}  // namespace telvane
