#include "platform/system/SystemLocale.h"

#include <time.h>

#include <algorithm>

namespace telvane {
namespace {

bool isUpperLetter(char c) { return c >= 'A' && c <= 'Z'; }
bool isDigit(char c) { return c >= '0' && c <= '9'; }

// The region of "language_REGION.encoding@variant": two letters, or three digits of a wider region. Nothing for C and
// POSIX, which have none.
std::optional<String> regionOf(const std::string& locale) {
  const size_t mark = locale.find('_');
  if (mark == std::string::npos) return std::nullopt;
  const std::string region = locale.substr(mark + 1, locale.find_first_of(".@", mark) - mark - 1);
  const bool isCountry = region.size() == 2 && std::all_of(region.begin(), region.end(), isUpperLetter);
  const bool isArea = region.size() == 3 && std::all_of(region.begin(), region.end(), isDigit);
  return isCountry || isArea ? std::optional<String>(region) : std::nullopt;
}

std::optional<String> countryOf(const Environment& environment) {
  const std::optional<std::string>& locale = environment.localeAll ? environment.localeAll : environment.localeDefault;
  return locale ? regionOf(*locale) : std::nullopt;
}

}  // namespace

SystemLocale::SystemLocale(const Environment& environment, const UserDefaults& userDefaults, Log& log)
    : _environmentCountry(countryOf(environment)), _userDefaults(userDefaults), _log(log) {}

std::optional<String> SystemLocale::countryCode() const {
  const Value setting = _userDefaults.objectForKey(kSuite, kCountry);
  if (const String* country = setting.string(); country != nullptr && !country->empty()) return *country;
  const bool isWrongType = setting.isPresent() && !setting.isString();
  if (isWrongType && !_isWrongTypeReported.exchange(true)) {
    _log.error("{} in the suite {} is no text: it counts as absent", kCountry, kSuite);
  }
  return _environmentCountry;
}

std::chrono::seconds SystemLocale::secondsFromGMT(Date date) const {
  ::tzset();  // the system's zone may have changed since the last call
  const auto seconds = static_cast<time_t>(date.wholeSeconds());
  struct tm local {};
  if (::localtime_r(&seconds, &local) == nullptr) return std::chrono::seconds(0);
  return std::chrono::seconds(local.tm_gmtoff);
}

}  // namespace telvane
