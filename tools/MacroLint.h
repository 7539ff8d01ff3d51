#pragma once

#include <map>
#include <set>
#include <string>

#include "foundation/Value.h"
#include "tools/LintReport.h"

namespace telvane {

// Finds macros that are never used, never defined, or stand where none is expanded. Looks at the bag as its author
// wrote it, before macros are expanded. Made for one bag.
class MacroLint {
 public:
  // report: outlives this. bag: no deeper than property lists may be.
  MacroLint(LintReport& report, const Dictionary& bag);

  void lint();
  // The places of the bag whose value is a macro's, with a note that says so. Filled by lint.
  const std::map<std::string, std::string, std::less<>>& notes() const noexcept { return _notes; }

 private:
  // Where a text stands decides whether a macro in it is expanded.
  enum class Place : uint8_t { Section, MacroValue, Elsewhere };

  void lintValue(const std::string& path, const Value& value, Place place);
  void lintReference(const std::string& path, std::string_view text, Place place);
  void lintDefinitions(const std::string& path);

  LintReport& _report;
  const Dictionary& _bag;
  const Dictionary* const _macros;  // null when the bag has none
  std::set<std::string, std::less<>> _used;
  std::map<std::string, std::string, std::less<>> _notes;
};

}  // namespace telvane
