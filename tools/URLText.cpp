#include "tools/URLText.h"

#include <algorithm>
#include <charconv>

namespace telvane {
namespace {

constexpr std::string_view kSchemeEnd = "://";

bool isLetter(char c) noexcept { return (c >= 'a' && c <= 'z') || (c >= 'A' && c <= 'Z'); }
bool isDigit(char c) noexcept { return c >= '0' && c <= '9'; }
bool isVisible(char c) noexcept { return c > ' ' && c < '\x7f'; }
bool isOfHost(char c) noexcept { return isLetter(c) || isDigit(c) || c == '-' || c == '.' || c == '_'; }
bool isOfAddress(char c) noexcept { return isDigit(c) || isLetter(c) || c == ':' || c == '.'; }
bool isOfMark(char c) noexcept { return (c >= 'A' && c <= 'Z') || c == '_'; }

bool isMark(std::string_view authority) noexcept {
  if (authority.size() < 3 || !authority.starts_with('@') || !authority.ends_with('@')) return false;
  const std::string_view name = authority.substr(1, authority.size() - 2);
  return std::all_of(name.begin(), name.end(), isOfMark);
}

std::optional<uint16_t> portOf(std::string_view text) noexcept {
  uint16_t port = 0;
  const auto [end, fault] = std::from_chars(text.data(), text.data() + text.size(), port);
  const bool isWhole = fault == std::errc() && end == text.data() + text.size();
  return isWhole && port > 0 ? std::optional(port) : std::nullopt;
}

// A name, or an IPv6 address in brackets.
bool isHost(std::string_view host) noexcept {
  if (!host.starts_with('[')) return !host.empty() && std::all_of(host.begin(), host.end(), isOfHost);
  if (host.size() < 4 || !host.ends_with(']')) return false;
  const std::string_view address = host.substr(1, host.size() - 2);
  return std::all_of(address.begin(), address.end(), isOfAddress);
}

URLText::Parsed fault(const char* text) { return {.url = std::nullopt, .fault = text}; }

}  // namespace

URLText::Parsed URLText::parse(std::string_view text) {
  if (!std::all_of(text.begin(), text.end(), isVisible)) return fault("holds blanks or other characters to be escaped");
  const size_t schemeSize = text.find(kSchemeEnd);
  if (schemeSize == std::string_view::npos) return fault("does not begin with https://");
  URLText url;
  url.scheme = text.substr(0, schemeSize);
  if (url.scheme.empty() || !std::all_of(url.scheme.begin(), url.scheme.end(), isLetter)) {
    return fault("does not begin with https://");
  }
  std::string_view authority = text.substr(schemeSize + kSchemeEnd.size());
  authority = authority.substr(0, authority.find_first_of("/?#"));
  if (authority.empty()) return fault("has no host");
  if (isMark(authority)) {
    url.host = authority;
    url.isPlaceholder = true;
    return {.url = url, .fault = {}};
  }
  if (authority.find('@') != std::string_view::npos) return fault("has a user name, which would stand in every bag");
  const size_t colon = authority.rfind(':');
  const bool hasPort = colon != std::string_view::npos && authority.find(']', colon) == std::string_view::npos;
  url.host = authority.substr(0, hasPort ? colon : authority.size());
  if (!isHost(url.host)) return fault("has no host");
  if (!hasPort) return {.url = url, .fault = {}};
  url.port = portOf(authority.substr(colon + 1));
  if (!url.port.has_value()) return fault("has a port that is none");
  return {.url = url, .fault = {}};
}

bool URLText::hasScheme(std::string_view name) const noexcept {
  return std::equal(scheme.begin(), scheme.end(), name.begin(), name.end(),
                    [](char a, char b) { return (a >= 'A' && a <= 'Z' ? a - 'A' + 'a' : a) == b; });
}

}  // namespace telvane
