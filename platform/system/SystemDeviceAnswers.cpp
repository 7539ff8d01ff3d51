#include "platform/system/SystemDeviceAnswers.h"

#include <sys/utsname.h>

#include <algorithm>
#include <charconv>
#include <vector>

#include "platform/Crypto.h"
#include "platform/system/DictionaryFiles.h"
#include "platform/system/FileAccess.h"
#include "platform/system/UTF8.h"

namespace telvane {
namespace {

constexpr uint64_t kLargestSource = 64u << 10;
constexpr size_t kLongestAnswer = 256;
constexpr size_t kMachineIDBytes = 16;
constexpr size_t kUniqueDeviceIDBytes = 20;
// Tells the identifiers of this program from those that others derive from the same machine.
constexpr std::string_view kPurpose = "Telvane UniqueDeviceID 1";
constexpr std::string_view kOverrides = "/etc/telvane/device.plist";
constexpr std::array<Key, 8> kKeys = {DeviceAnswers::kUniqueDeviceID, DeviceAnswers::kProductVersion,
                                      DeviceAnswers::kBuildVersion,   DeviceAnswers::kHWModelStr,
                                      DeviceAnswers::kSerialNumber,   DeviceAnswers::kProductType,
                                      DeviceAnswers::kDeviceName,     DeviceAnswers::kReleaseType};
// What makers leave in fields that they did not fill in.
constexpr std::array<std::string_view, 7> kPlaceholders = {"To Be Filled By O.E.M.",
                                                           "Default string",
                                                           "System Product Name",
                                                           "System Serial Number",
                                                           "Not Specified",
                                                           "None",
                                                           "0"};

std::span<const uint8_t> bytesOf(std::string_view text) {
  return {reinterpret_cast<const uint8_t*>(text.data()), text.size()};
}

std::string_view trimmed(std::string_view text) {
  constexpr std::string_view kBlanks(" \t\r\n\0", 5);
  const size_t start = text.find_first_not_of(kBlanks);
  if (start == std::string_view::npos) return {};
  return text.substr(start, text.find_last_not_of(kBlanks) - start + 1);
}

std::string contentOf(const std::string& path) {
  const Result<fileaccess::Content> file = fileaccess::read(path, kLargestSource);
  return file ? std::string(file->data.view()) : std::string();
}

// The first of the files with a usable text; of a device-tree list, its first member.
std::string firstUsable(const std::string& root, std::initializer_list<const char*> paths) {
  for (const char* path : paths) {
    const std::string content = contentOf(root + path);
    const std::string_view text = trimmed(std::string_view(content).substr(0, content.find('\0')));
    const bool isPlaceholder = std::find(kPlaceholders.begin(), kPlaceholders.end(), text) != kPlaceholders.end();
    if (!text.empty() && text.size() <= kLongestAnswer && !isPlaceholder) return utf8::repaired(text);
  }
  return {};
}

std::string_view unquoted(std::string_view text) {
  const bool isQuoted =
      text.size() >= 2 && (text.front() == '"' || text.front() == '\'') && text.back() == text.front();
  return isQuoted ? text.substr(1, text.size() - 2) : text;
}

// The value of NAME=value in os-release; empty when there is none.
std::string releaseField(std::string_view release, std::string_view name) {
  while (!release.empty()) {
    const size_t end = std::min(release.find('\n'), release.size());
    const std::string_view line = trimmed(release.substr(0, end));
    release.remove_prefix(std::min(end + 1, release.size()));
    if (line.starts_with(name) && line.substr(name.size()).starts_with('=')) {
      return utf8::repaired(unquoted(line.substr(name.size() + 1)).substr(0, kLongestAnswer));
    }
  }
  return {};
}

// Empty when the text is no machine id (a machine at its first start has "uninitialized").
std::string uniqueDeviceID(std::string_view machineID) {
  std::array<uint8_t, kMachineIDBytes> key{};
  const std::string_view digits = trimmed(machineID);
  if (digits.size() != 2 * key.size()) return {};
  for (size_t i = 0; i < key.size(); ++i) {
    const char* start = digits.data() + 2 * i;
    if (std::from_chars(start, start + 2, key[i], 16).ptr != start + 2) return {};
  }
  const crypto::SHA256Digest digest = crypto::hmacSHA256(key, bytesOf(kPurpose));
  return crypto::lowercaseHex(std::span(digest).first<kUniqueDeviceIDBytes>());
}

std::string orElse(std::string text, std::string other) { return text.empty() ? std::move(other) : std::move(text); }

void setUnlessEmpty(Dictionary& answers, const Key& key, const std::string& text) {
  if (!text.empty()) answers.set(key, text);
}

Dictionary askMachine(const std::string& root) {
  utsname kernel{};
  ::uname(&kernel);
  const std::string release = orElse(contentOf(root + "/etc/os-release"), contentOf(root + "/usr/lib/os-release"));
  const std::string product =
      orElse(firstUsable(root, {"/sys/class/dmi/id/product_name", "/proc/device-tree/compatible"}), "Linux");
  Dictionary answers;
  setUnlessEmpty(answers, DeviceAnswers::kUniqueDeviceID, uniqueDeviceID(contentOf(root + "/etc/machine-id")));
  answers.set(DeviceAnswers::kProductVersion, orElse(releaseField(release, "VERSION_ID"), kernel.release));
  answers.set(DeviceAnswers::kBuildVersion, orElse(releaseField(release, "BUILD_ID"), kernel.release));
  answers.set(DeviceAnswers::kHWModelStr,
              orElse(firstUsable(root, {"/sys/class/dmi/id/board_name", "/proc/device-tree/model"}), kernel.machine));
  answers.set(DeviceAnswers::kProductType, product);
  answers.set(DeviceAnswers::kDeviceName, orElse(firstUsable(root, {"/sys/class/dmi/id/product_family"}), product));
  answers.set(
      DeviceAnswers::kSerialNumber,
      orElse(firstUsable(root, {"/sys/class/dmi/id/product_serial", "/proc/device-tree/serial-number"}), "unknown"));
  return answers;
}

}  // namespace

SystemDeviceAnswers::SystemDeviceAnswers(const Paths& paths, Log& log, const std::string& systemRoot)
    : _answers(askMachine(systemRoot)) {
  const std::string path = paths.belowRoot(std::string(kOverrides));
  const Dictionary overrides = DictionaryFiles(log).read(path).dictionary;
  for (const Key& key : kKeys) {
    const Value& value = overrides[key];
    if (value.isString()) {
      _answers.set(key, value);
    } else if (value.isPresent()) {
      log.error("The file {} has no text for {}: it counts as absent", path, key);
    }
  }
}

std::optional<String> SystemDeviceAnswers::answer(const Key& key) const {
  const String* text = _answers[key].string();
  return text == nullptr ? std::nullopt : std::optional(*text);
}

}  // namespace telvane
