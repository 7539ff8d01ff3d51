#pragma once

#include <optional>
#include <string>
#include <unordered_map>
#include <unordered_set>

#include "foundation/Value.h"
#include "tools/LintReport.h"
#include "tools/StorebagKeyLint.h"

namespace telvane {

// Looks at one client entry of an HTTPS backend: each key for itself, and what keys say together about sampling,
// countries and categories.
class ClientEntryLint {
 public:
  // report, keys: outlive this.
  ClientEntryLint(LintReport& report, StorebagKeyLint& keys) : _report(report), _keys(keys) {}

  void lint(const std::string& path, const Dictionary& entry);

 private:
  using CountrySet = std::unordered_set<std::string>;

  // Returns the countries of which the array names one; nothing when it is no array or has no text.
  static std::optional<CountrySet> countriesOf(const Value& countries);
  void lintCountryThresholds(const std::string& path, const Dictionary& entry);
  // Notes the countries that the item lists, and finds those that an earlier item lists or that no device gets to.
  void lintListedCountries(const std::string& path, size_t index, const Array& countries,
                           const std::optional<CountrySet>& admitted, std::unordered_map<std::string, size_t>& listed);
  // A threshold for some countries only: the others do not report.
  void lintCoverage(const std::string& path, const std::optional<CountrySet>& admitted,
                    const std::unordered_map<std::string, size_t>& listed);
  void lintSampling(const std::string& path, const Dictionary& entry);
  void lintCategoryLists(const std::string& path, const Dictionary& entry);

  LintReport& _report;
  StorebagKeyLint& _keys;
};

}  // namespace telvane
