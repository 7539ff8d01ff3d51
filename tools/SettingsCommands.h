#pragma once

#include <string>

#include "foundation/Error.h"
#include "platform/UserDefaults.h"
#include "tools/Printer.h"

namespace telvane {

// What telvanectl does with this user's settings: shows and changes defaults, and the consent to diagnostics. Needs no
// daemon.
class SettingsCommands {
 public:
  // Both outlive this object.
  SettingsCommands(UserDefaults& userDefaults, Printer& printer) : _userDefaults(userDefaults), _printer(printer) {}

  // Prints the value of the key, or with an empty key the whole suite as JSON. Fails when there is none.
  Result<void> read(const std::string& suite, const std::string& key);
  enum class ValueForm { JSONOrText, Text };
  // Stores the value: read as JSON (true, 5, [1, 2]), text that is no JSON as it is; or always as text.
  Result<void> write(const std::string& suite, const std::string& key, const std::string& value, ValueForm form);
  // Removes the key, or with an empty key all that the user has set in the suite.
  Result<void> remove(const std::string& suite, const std::string& key);
  Result<void> showConsent();
  Result<void> setConsent(bool isGiven);

 private:
  UserDefaults& _userDefaults;
  Printer& _printer;
};

}  // namespace telvane
