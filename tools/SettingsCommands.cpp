#include "tools/SettingsCommands.h"

#include "foundation/Description.h"
#include "platform/JSON.h"
#include "platform/system/DefaultsConsent.h"

namespace telvane {
namespace {

Error fault(const std::string& text) { return Error::withDescription("TelvaneControl", 1, text); }

// Text bare, everything else as JSON; what JSON has no form for as its description.
std::string shown(const Value& value) {
  if (value.isString()) return std::string(value.text());
  const Result<std::string> text = json::serialize(value, json::Style::Pretty);
  return text.has_value() ? *text : description(value);
}

}  // namespace

Result<void> SettingsCommands::read(const std::string& suite, const std::string& key) {
  if (key.empty()) {
    _printer.line(shown(_userDefaults.dictionaryRepresentation(suite)));
    return {};
  }
  const Value value = _userDefaults.objectForKey(suite, key);
  if (!value.isPresent()) return fault("there is no " + key + " in " + suite);
  _printer.line(shown(value));
  return {};
}

Result<void> SettingsCommands::write(const std::string& suite, const std::string& key, const std::string& value,
                                     ValueForm form) {
  if (form == ValueForm::Text) return _userDefaults.setObject(suite, key, value);
  const Result<Value> parsed = json::parse(value);
  if (parsed.has_error()) return _userDefaults.setObject(suite, key, value);
  if (!parsed->isPresent()) return fault("null is no value; use telvanectl defaults delete");
  return _userDefaults.setObject(suite, key, *parsed);
}

Result<void> SettingsCommands::remove(const std::string& suite, const std::string& key) {
  if (!key.empty()) return _userDefaults.setObject(suite, key, {});
  for (const DictionaryEntry& entry : _userDefaults.dictionaryRepresentation(suite)) {
    Result<void> removed = _userDefaults.setObject(suite, entry.key.view(), {});
    if (removed.has_error()) return removed;
  }
  return {};
}

Result<void> SettingsCommands::showConsent() {
  const Value consent = _userDefaults.objectForKey(DefaultsConsent::kSuite.view(), DefaultsConsent::kAutoSubmit.view());
  _printer.line(consent.boolean().value_or(false) ? "on" : "off");
  return {};
}

Result<void> SettingsCommands::setConsent(bool isGiven) {
  return _userDefaults.setObject(DefaultsConsent::kSuite.view(), DefaultsConsent::kAutoSubmit.view(), isGiven);
}

}  // namespace telvane
