#include "platform/system/DefaultsConsent.h"

namespace telvane {

bool DefaultsConsent::isSubmissionAllowed() const {
  const Value setting = _userDefaults.objectForKey(kSuite, kAutoSubmit);
  const std::optional<bool> answer = setting.boolean();
  if (setting.isPresent() && !answer && !_isWrongTypeReported.exchange(true)) {
    _log.error("{} in the suite {} is no boolean: it counts as no", kAutoSubmit, kSuite);
  }
  return answer.value_or(false);
}

}  // namespace telvane
