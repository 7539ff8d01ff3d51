#include "util/DataHelpers.h"

#include <algorithm>
#include <cctype>
#include <cmath>

#include "interfaces/DefaultsKeys.h"
#include "interfaces/SessionKeys.h"
#include "platform/Compression.h"
#include "platform/Crypto.h"
#include "platform/Platform.h"

namespace telvane {
namespace {

// The codes by which the compressor explains itself; they are part of the texts below.
enum CompressorCode {
  kVersionError = -6,
  kBufferError = -5,
  kMemoryError = -4,
  kDataError = -3,
  kStreamError = -2,
  kErrno = -1
};

std::string_view initialiseErrorText(int code) {
  switch (code) {
    case kVersionError:
      return "The version of zlib.h and the version of the library linked do not match.";
    case kMemoryError:
      return "Insufficient memory.";
    case kStreamError:
      return "Invalid parameter passed in to function.";
    default:
      return "Unknown error code.";
  }
}

std::string_view deflateErrorText(int code) {
  switch (code) {
    case kVersionError:
      return "The version of zlib.h and the version of the library linked do not match.";
    case kBufferError:
      return "Ran out of output buffer for writing compressed bytes.";
    case kMemoryError:
      return "Memory could not be allocated for processing.";
    case kDataError:
      return "The deflate data was invalid or incomplete.";
    case kStreamError:
      return "The stream state was inconsistent (e.g., next_in or next_out was NULL).";
    case kErrno:
      return "Error occured while reading file.";
    default:
      return "Unknown error code.";
  }
}

void logFailure(Log& log, const compression::Failure& failure) {
  if (failure.step == compression::Failure::Step::Initialise) {
    log.error("compressDataWithZlibOrGzip: deflateInit2() Error: \"{}\" Message: \"{}\"",
              initialiseErrorText(failure.code), failure.message);
  } else {
    log.error("compressDataWithZlibOrGzip: zlib error while attempting compression: \"{}\" Message: \"{}\"",
              deflateErrorText(failure.code), failure.message);
  }
}

std::string lowerCased(std::string_view text) {
  std::string result(text);
  std::transform(result.begin(), result.end(), result.begin(),
                 [](unsigned char c) { return static_cast<char>(std::tolower(c)); });
  return result;
}

bool hasControlCharacter(std::string_view text) {
  return std::any_of(text.begin(), text.end(), [](unsigned char c) { return c < ' ' || c == 0x7F; });
}

std::string digestOf(std::string_view text) {
  return crypto::lowercaseHex(crypto::sha256({reinterpret_cast<const uint8_t*>(text.data()), text.size()}));
}

// The settings of all clients are in one file, of which a single name must not take much, or what cannot be written.
std::string identifierKey(std::string_view clientPart, std::string_view suffixPart) {
  constexpr size_t kLongestParts = 256;  // bytes, of both
  const bool isPlain = clientPart.size() <= kLongestParts && suffixPart.size() <= kLongestParts - clientPart.size() &&
                       !hasControlCharacter(clientPart) && !hasControlCharacter(suffixPart);
  if (isPlain) return fmt::format("uuid:{}:{}", clientPart, suffixPart);
  return fmt::format("uuid:{}:{}", digestOf(clientPart), digestOf(suffixPart));
}

uint32_t allocationSize(const Value& value) noexcept {
  switch (value.kind()) {
    case Value::Kind::String:
      return static_cast<uint32_t>(sizeof(Value) + value.text().size());
    case Value::Kind::Data:
      return static_cast<uint32_t>(sizeof(Value) + value.data()->size());
    default:
      return sizeof(Value);
  }
}

}  // namespace

std::optional<Data> compressDataWithZlibOrGzip(Log& log, bool useGzip, std::string_view data) {
  if (data.empty()) {
    log.error("compressDataWithZlibOrGzip: Cannot compress empty NSData");
    return std::nullopt;
  }
  auto compressed = compression::deflate(useGzip ? compression::Framing::Gzip : compression::Framing::Zlib, data);
  if (compressed.has_error()) {
    logFailure(log, compressed.error());
    return std::nullopt;
  }
  log.message("compressDataWithZlibOrGzip: Compressed file from {} to {}", data.size(), compressed->size());
  return std::move(*compressed);
}

std::optional<Data> gzipDeflate(Log& log, std::string_view data) { return compressDataWithZlibOrGzip(log, true, data); }

String getPersistentIdentifierForCustomClientIDSuffix(Platform& platform, std::string_view clientPart,
                                                      std::string_view suffixPart) {
  const std::string key = identifierKey(clientPart, suffixPart);
  const Value value = platform.userDefaults.objectForKeyOrStore(
      kTelvaneDefaultsSuite, key, [&platform] { return Value(platform.random.newUUID().string()); });
  platform.log.message("getPersistentIdentifierForCustomClientIDSuffix: The value for {}: {}", key, value);
  return value.isString() ? *value.string() : String(description(value));
}

void copyUniqueDeviceID(const DeviceAnswers& deviceAnswers, std::span<char> buffer) {
  const auto answer = deviceAnswers.answer(DeviceAnswers::kUniqueDeviceID);
  if (!answer.has_value() || buffer.empty()) return;
  const std::string_view text = answer->view().substr(0, buffer.size() - 1);
  std::fill(std::copy(text.begin(), text.end(), buffer.begin()), buffer.end(), '\0');
}

String clientServiceKey(const Value& userInfo) {
  const Dictionary* dictionary = userInfo.dictionary();
  if (dictionary == nullptr) return ":";
  return lowerCased((*dictionary)[kTelvaneUserInfoClientName].text()) + ":" +
         lowerCased((*dictionary)[kTelvaneUserInfoServiceName].text());
}

std::optional<String> userDefaultsString(const UserDefaults& userDefaults, const Key& key) {
  const Value value = userDefaults.objectForKey(kTelvaneDefaultsSuite, key);
  if (!value.isString()) return std::nullopt;
  return *value.string();
}

double timeOfDayToSeconds(int64_t seconds, int32_t microseconds) noexcept {
  return static_cast<double>(seconds) + static_cast<double>(microseconds) / 1e6;
}

double finiteOrMinusOne(double value) noexcept { return std::isfinite(value) ? value : -1.0; }

int64_t minuteRounding(int64_t seconds, bool isInternalBuild) noexcept {
  constexpr int64_t kSecondsPerMinute = 60;
  return isInternalBuild ? seconds : seconds / kSecondsPerMinute * kSecondsPerMinute;
}

uint32_t objectSizeEstimate(const Value& value) noexcept {
  if (const Dictionary* dictionary = value.dictionary()) return objectSizeEstimate(*dictionary);
  uint32_t sum = 0;
  if (const Array* array = value.array()) {
    for (const Value& element : *array) sum += allocationSize(element) + objectSizeEstimate(element);
  }
  return sum;
}

uint32_t objectSizeEstimate(const Dictionary& dictionary) noexcept {
  uint32_t sum = 0;
  for (const DictionaryEntry& entry : dictionary) {
    sum += static_cast<uint32_t>(sizeof(DictionaryEntry) - sizeof(Value) + entry.key.size());
    sum += allocationSize(entry.value) + objectSizeEstimate(entry.value);
  }
  return sum;
}

}  // namespace telvane
