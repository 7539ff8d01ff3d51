#pragma once

#include <atomic>
#include <string>

#include "platform/Locale.h"
#include "platform/Log.h"
#include "platform/UserDefaults.h"
#include "platform/system/Environment.h"

namespace telvane {

// The country of the user's setting "Country" in the suite com.corvex.locale, else of LC_ALL or LANG; the time zone of
// TZ, else the system's.
class SystemLocale final : public Locale {
 public:
  // The defaults and the log outlive this object.
  SystemLocale(const Environment& environment, const UserDefaults& userDefaults, Log& log);

  std::optional<String> countryCode() const override;
  std::chrono::seconds secondsFromGMT(Date date) const override;

  static constexpr Key kSuite{"com.corvex.locale"};
  static constexpr Key kCountry{"Country"};

 private:
  const std::optional<String> _environmentCountry;
  const UserDefaults& _userDefaults;
  Log& _log;
  mutable std::atomic<bool> _isWrongTypeReported = false;
};

}  // namespace telvane
