#include "storebag/StorebagMacros.h"

#include "interfaces/StorebagKeys.h"

namespace telvane {
namespace {

constexpr std::string_view kMacroPrefix = "==";

Array splitAtCommas(std::string_view text) {
  Array parts;
  for (;;) {
    const size_t comma = text.find(',');
    parts.append(Value(text.substr(0, comma)));
    if (comma == std::string_view::npos) return parts;
    text.remove_prefix(comma + 1);
  }
}

// Recursion is bounded by the depth that the property-list parser admits.
Value expanded(Log& log, const Value& value, const Dictionary& macros) {
  if (const Value* macro = macroNamedBy(value, macros)) {
    log.message("expandMacroForDataSet: Expanding macro '{}' into '{}'", value, *macro);
    return *macro;
  }
  if (const Dictionary* dictionary = value.dictionary()) {
    Dictionary result;
    result.reserve(dictionary->size());
    for (const DictionaryEntry& entry : *dictionary) result.set(entry.key, expanded(log, entry.value, macros));
    return result;
  }
  if (const Array* array = value.array()) {
    Array result;
    result.reserve(array->size());
    for (const Value& element : *array) result.append(expanded(log, element, macros));
    return result;
  }
  return value;
}

}  // namespace

bool isMacroName(const Value& value) { return value.isString() && value.text().starts_with(kMacroPrefix); }

const Value* macroNamedBy(const Value& value, const Dictionary& macros) {
  if (!isMacroName(value)) return nullptr;
  const Value& macro = macros[value.text()];
  return macro.isPresent() ? &macro : nullptr;
}

Dictionary splitMacroValues(const Dictionary& sharedValues) {
  Dictionary macros;
  for (const DictionaryEntry& entry : sharedValues) {
    macros.set(entry.key, entry.value.isString() ? Value(splitAtCommas(entry.value.text())) : entry.value);
  }
  return macros;
}

void expandMacroForDataSet(Log& log, Dictionary& container, const Key& key, const Dictionary& macros) {
  const Value& value = container[key];
  if (!value.isPresent()) return;
  container.set(key, expanded(log, value, macros));
}

Dictionary expandStorebag(Log& log, const Dictionary& inner) {
  const Dictionary* sharedValues = inner[kStorebagSharedValues].dictionary();
  if (sharedValues == nullptr || sharedValues->empty()) return inner;
  const Dictionary macros = splitMacroValues(*sharedValues);
  Dictionary result = inner;
  result.remove(kStorebagSharedValues);
  for (const Key& key : {kEnvironmentInternal, kEnvironmentDevelopment, kEnvironmentSeed, kEnvironmentRelease}) {
    expandMacroForDataSet(log, result, key, macros);
  }
  return result;
}

}  // namespace telvane
