#include "interfaces/FileURL.h"

#include <charconv>

namespace telvane {
namespace {

constexpr std::string_view kScheme = "file:";
constexpr std::string_view kHexadecimal = "0123456789ABCDEF";
constexpr std::string_view kUnreserved = "-._~/!$&'()*+,;=:@";

bool isLetterOrDigit(char c) { return (c >= '0' && c <= '9') || (c >= 'A' && c <= 'Z') || (c >= 'a' && c <= 'z'); }

// Returns the byte that two hexadecimal digits make, or -1.
int byteOf(std::string_view digits) {
  int byte = -1;
  const auto [end, failure] = std::from_chars(digits.data(), digits.data() + digits.size(), byte, 16);
  const bool isWhole = digits.size() == 2 && digits[0] != '-' && failure == std::errc() && end == digits.end();
  return isWhole ? byte : -1;
}

std::string withoutPercentEncoding(std::string_view text) {
  std::string path;
  for (size_t i = 0; i < text.size(); ++i) {
    if (text[i] != '%') {
      path += text[i];
      continue;
    }
    const int byte = byteOf(text.substr(i + 1, 2));
    if (byte <= 0) return {};
    path += static_cast<char>(byte);
    i += 2;
  }
  return path;
}

}  // namespace

std::string pathOfFileURL(std::string_view url) {
  if (url.find('\0') != std::string_view::npos) return {};
  if (url.substr(0, kScheme.size()) != kScheme) return std::string(url);
  url.remove_prefix(kScheme.size());
  if (url.substr(0, 2) == "//") url.remove_prefix(std::min(url.find('/', 2), url.size()));
  return withoutPercentEncoding(url.substr(0, url.find_first_of("?#")));
}

std::string fileURLOfPath(std::string_view path) {
  if (path.empty() || path.front() != '/') return std::string(path);
  std::string url = "file://";
  for (const char c : path) {
    if (isLetterOrDigit(c) || kUnreserved.find(c) != std::string_view::npos) {
      url += c;
    } else {
      const auto byte = static_cast<unsigned char>(c);
      url += {'%', kHexadecimal[byte >> 4], kHexadecimal[byte & 15]};
    }
  }
  return url;
}

}  // namespace telvane
