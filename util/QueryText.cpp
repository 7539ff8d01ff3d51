#include "util/QueryText.h"

#include <algorithm>

namespace telvane {
namespace {

constexpr std::string_view kHexadecimal = "0123456789ABCDEF";
constexpr std::string_view kAllowedInQuery = "-._~!$&'()*+,;=:@/?";
constexpr std::string_view kAllowedElsewhere = "#[]";

bool isLetterOrDigit(char c) { return (c >= '0' && c <= '9') || (c >= 'A' && c <= 'Z') || (c >= 'a' && c <= 'z'); }

bool isIn(std::string_view set, char c) { return set.find(c) != std::string_view::npos; }

bool isHexadecimal(char c) { return (c >= '0' && c <= '9') || ((c | 0x20) >= 'a' && (c | 0x20) <= 'f'); }

// Whether the text begins as the scheme, in any case, whatever follows.
bool hasScheme(std::string_view text, std::string_view scheme) {
  return text.size() >= scheme.size() && std::equal(scheme.begin(), scheme.end(), text.begin(),
                                                    [](char wanted, char c) { return wanted == (c | 0x20); });
}

bool isURLText(std::string_view text) {
  for (size_t i = 0; i < text.size(); ++i) {
    if (text[i] == '%') {
      if (i + 2 >= text.size() || !isHexadecimal(text[i + 1]) || !isHexadecimal(text[i + 2])) return false;
    } else if (!isLetterOrDigit(text[i]) && !isIn(kAllowedInQuery, text[i]) && !isIn(kAllowedElsewhere, text[i])) {
      return false;
    }
  }
  return true;
}

}  // namespace

std::string percentEncodedForQuery(std::string_view text) {
  std::string encoded;
  encoded.reserve(text.size());
  for (const char c : text) {
    if (isLetterOrDigit(c) || isIn(kAllowedInQuery, c)) {
      encoded += c;
    } else {
      const auto byte = static_cast<unsigned char>(c);
      encoded += {'%', kHexadecimal[byte >> 4], kHexadecimal[byte & 15]};
    }
  }
  return encoded;
}

bool isWebURL(std::string_view text) {
  constexpr std::string_view kSchemeEnd = "://";
  const size_t schemeSize = text.find(kSchemeEnd);
  const bool isWeb = schemeSize != std::string_view::npos &&
                     ((schemeSize == 4 && hasScheme(text, "http")) || (schemeSize == 5 && hasScheme(text, "https")));
  if (!isWeb || !isURLText(text)) return false;
  const std::string_view rest = text.substr(schemeSize + kSchemeEnd.size());
  return !rest.empty() && !isIn("/?#", rest.front());
}

}  // namespace telvane
