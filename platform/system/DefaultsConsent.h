#pragma once

#include <atomic>

#include "foundation/Key.h"
#include "platform/Consent.h"
#include "platform/Log.h"
#include "platform/UserDefaults.h"

namespace telvane {

// The boolean "AutoSubmit" in the suite com.corvex.diagnostics, read anew at each question. Anything but a boolean that
// is true means no.
class DefaultsConsent final : public Consent {
 public:
  // Both outlive this object.
  DefaultsConsent(const UserDefaults& userDefaults, Log& log) noexcept : _userDefaults(userDefaults), _log(log) {}

  bool isSubmissionAllowed() const override;

  static constexpr Key kSuite{"com.corvex.diagnostics"};
  static constexpr Key kAutoSubmit{"AutoSubmit"};

 private:
  const UserDefaults& _userDefaults;
  Log& _log;
  mutable std::atomic<bool> _isWrongTypeReported = false;
};

}  // namespace telvane
