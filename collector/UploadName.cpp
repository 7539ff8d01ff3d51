#include "collector/UploadName.h"

#include <algorithm>
#include <charconv>

namespace telvane {
namespace {

constexpr size_t kLongestName = 200;
constexpr std::string_view kDefaultName = "upload";
// What a daemon puts behind the file's name, in which a '&' may stand as it is.
constexpr std::string_view kBehindName = "&raw=true";

bool isPlain(char c) {
  return (c >= '0' && c <= '9') || (c >= 'A' && c <= 'Z') || (c >= 'a' && c <= 'z') || c == '-' || c == '_' || c == '.';
}

std::string percentDecoded(std::string_view text) {
  std::string decoded;
  for (size_t i = 0; i < text.size(); ++i) {
    unsigned byte = 0;
    const std::string_view digits = text[i] == '%' ? text.substr(i + 1, 2) : std::string_view();
    const auto [end, failure] = std::from_chars(digits.data(), digits.data() + digits.size(), byte, 16);
    const bool isEncoded = digits.size() == 2 && failure == std::errc() && end == digits.data() + digits.size();
    decoded += isEncoded ? static_cast<char>(byte) : text[i];
    if (isEncoded) i += 2;
  }
  return decoded;
}

// What stands behind "KEY=" in the query, to its end.
std::string_view restFrom(std::string_view target, std::string_view key) {
  size_t at = target.find('?');
  while (at != std::string_view::npos) {
    const std::string_view rest = target.substr(at + 1);
    if (rest.starts_with(key) && rest.substr(key.size()).starts_with('=')) return rest.substr(key.size() + 1);
    at = target.find('&', at + 1);
  }
  return {};
}

}  // namespace

std::string queryValue(std::string_view target, std::string_view key) {
  const std::string_view rest = restFrom(target, key);
  return percentDecoded(rest.substr(0, rest.find('&')));
}

std::string uploadName(std::string_view target) {
  std::string_view value = restFrom(target, "filename");
  value = value.ends_with(kBehindName) ? value.substr(0, value.size() - kBehindName.size())
                                       : value.substr(0, value.find('&'));
  std::string name = percentDecoded(value);
  if (name.size() > kLongestName) name.erase(0, name.size() - kLongestName);
  std::replace_if(
      name.begin(), name.end(), [](char c) { return !isPlain(c); }, '_');
  if (name.starts_with('.')) name.front() = '_';
  const bool saysNothing = std::all_of(name.begin(), name.end(), [](char c) { return c == '_' || c == '.'; });
  return saysNothing ? std::string(kDefaultName) : name;
}

}  // namespace telvane
