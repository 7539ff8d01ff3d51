#include "tools/MacroLint.h"

#include <fmt/format.h>

#include <vector>

#include "interfaces/StorebagKeys.h"
#include "tools/LintText.h"
#include "tools/StorebagKeyTable.h"

namespace telvane {
namespace {

using linttext::pathTo;
using linttext::quoted;

constexpr std::string_view kMacroPrefix = "==";
constexpr size_t kMostNames = 100;  // among which a similar one is looked for

bool isSection(std::string_view key) {
  const StorebagKey* row = findStorebagKey(StorebagLevel::Bag, key);
  return row != nullptr && row->shape == StorebagShape::Section;
}

}  // namespace

MacroLint::MacroLint(LintReport& report, const Dictionary& bag)
    : _report(report), _bag(bag), _macros(bag[kStorebagSharedValues].dictionary()) {}

void MacroLint::lint() {
  for (const DictionaryEntry& entry : _bag) {
    if (entry.key == kStorebagSharedValues) continue;
    lintValue(pathTo({}, entry.key), entry.value, isSection(entry.key) ? Place::Section : Place::Elsewhere);
  }
  if (_macros != nullptr) lintDefinitions(pathTo({}, kStorebagSharedValues));
}

void MacroLint::lintValue(const std::string& path, const Value& value, Place place) {
  if (!_report.mayGoOn()) return;
  if (const Dictionary* dictionary = value.dictionary()) {
    for (const DictionaryEntry& entry : *dictionary) lintValue(pathTo(path, entry.key), entry.value, place);
  } else if (const Array* array = value.array()) {
    for (size_t i = 0; i < array->size(); ++i) lintValue(pathTo(path, i), (*array)[i], place);
  } else if (value.text().starts_with(kMacroPrefix)) {
    lintReference(path, value.text(), place);
  }
}

void MacroLint::lintReference(const std::string& path, std::string_view text, Place place) {
  const bool isDefined = _macros != nullptr && _macros->contains(text);
  if (place == Place::MacroValue) {
    _report.error(path, fmt::format("{} stands in a macro, where none is expanded; write its value", quoted(text)));
  } else if (place == Place::Elsewhere) {
    _report.error(path, fmt::format("{} stands outside the environment sections, where no macro is expanded; write its "
                                    "value",
                                    quoted(text)));
  } else if (isDefined) {
    _used.emplace(text);
    _notes.emplace(path,
                   fmt::format("from the macro {}{}", quoted(text),
                               (*_macros)[text].isString() ? ", whose text is split at the commas into an array" : ""));
  } else {
    std::vector<std::string_view> names;
    if (_macros != nullptr && _macros->size() <= kMostNames) {
      for (const DictionaryEntry& macro : *_macros) {
        if (macro.key.view().starts_with(kMacroPrefix)) names.push_back(macro.key);
      }
    }
    const auto nearest = nearestName(text, names);
    _report.error(path,
                  fmt::format("{} is a macro that shared_values does not define, and stays as it is; {}", quoted(text),
                              nearest ? fmt::format("did you mean {}?", quoted(*nearest)) : "define it there"));
  }
}

void MacroLint::lintDefinitions(const std::string& path) {
  for (const DictionaryEntry& macro : *_macros) {
    if (!_report.mayGoOn()) return;
    const std::string place = pathTo(path, macro.key);
    if (!macro.key.view().starts_with(kMacroPrefix)) {
      _report.error(place,
                    "can never be used, because the name of a macro begins with \"==\"; begin it so, also where it "
                    "is used");
    } else if (!_used.contains(macro.key.view())) {
      _report.warning(place, "is never used; remove it, or use it in a section");
    }
    lintValue(place, macro.value, Place::MacroValue);
  }
}

}  // namespace telvane
