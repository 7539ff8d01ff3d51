#include "backends/SecuredURL.h"

#include <fmt/format.h>

#include "backends/ListMatching.h"

namespace telvane {
namespace {

constexpr std::string_view kSecureScheme = "https";
constexpr std::string_view kSchemeEnd = "://";

}  // namespace

std::string securedURL(std::string_view url, bool isInternalBuild) {
  const size_t schemeSize = url.find(kSchemeEnd);
  if (isInternalBuild || equalsIgnoringCase(url.substr(0, schemeSize), kSecureScheme)) return std::string(url);
  const std::string_view rest =
      schemeSize != std::string_view::npos ? url.substr(schemeSize + kSchemeEnd.size()) : std::string_view();
  return fmt::format("{}{}{}", kSecureScheme, kSchemeEnd, rest.substr(0, rest.find(kSchemeEnd)));
}

}  // namespace telvane
