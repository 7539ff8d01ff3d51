#include "tools/ClientEntryLint.h"

#include <fmt/format.h>

#include <algorithm>
#include <vector>

#include "interfaces/StorebagKeys.h"
#include "tools/EventFilterLint.h"
#include "tools/LintText.h"

namespace telvane {
namespace {

using linttext::pathTo;
using linttext::quoted;
using linttext::shortForm;

// A number as devices read a threshold; nothing when they find none.
std::optional<double> thresholdOf(const Value& value) {
  return value.isNumber() || value.isString() ? std::optional(value.realValue()) : std::nullopt;
}

bool hasElements(const Value& value) { return value.isArray() && !value.array()->empty(); }

std::string upperCased(std::string_view text) {
  std::string result(text);
  for (char& c : result) c = c >= 'a' && c <= 'z' ? static_cast<char>(c - 'a' + 'A') : c;
  return result;
}

}  // namespace

void ClientEntryLint::lint(const std::string& path, const Dictionary& entry) {
  _keys.lint(path, StorebagLevel::ClientEntry, entry);
  if (const Array* filters = entry[kClientEntryFilters].array()) {
    EventFilterLint(_report, _keys).lint(pathTo(path, kClientEntryFilters), *filters);
  }
  lintCountryThresholds(path, entry);
  lintSampling(path, entry);
  lintCategoryLists(path, entry);
}

std::optional<ClientEntryLint::CountrySet> ClientEntryLint::countriesOf(const Value& countries) {
  CountrySet codes;
  const Array* array = countries.array();
  if (array == nullptr) return std::nullopt;
  for (const Value& element : *array) {
    if (element.isString()) codes.insert(upperCased(element.text()));
  }
  return codes.empty() ? std::nullopt : std::optional(std::move(codes));
}

void ClientEntryLint::lintCountryThresholds(const std::string& path, const Dictionary& entry) {
  const Array* items = entry[kClientEntryPerCountrySamplingThresholds].array();
  if (items == nullptr || items->empty()) return;
  const Value& whitelist = entry[kClientEntryLocaleWhitelist];
  if (whitelist.isArray() && !_report.mayGoOn(whitelist.array()->size())) return;
  const std::optional<CountrySet> admitted = countriesOf(whitelist);
  std::unordered_map<std::string, size_t> listed;
  const std::string place = pathTo(path, kClientEntryPerCountrySamplingThresholds);
  for (size_t i = 0; i < items->size() && _report.mayGoOn(); ++i) {
    const Dictionary* item = (*items)[i].dictionary();
    if (item == nullptr) {
      _keys.reportKind(pathTo(place, i), "a dictionary with country and threshold", (*items)[i], "it is passed over");
      continue;
    }
    _keys.lint(pathTo(place, i), StorebagLevel::CountryThreshold, *item);
    const Array* countries = (*item)[kPerCountryCountry].array();
    if (countries != nullptr) {
      lintListedCountries(pathTo(pathTo(place, i), kPerCountryCountry), i, *countries, admitted, listed);
    }
  }
  if (!entry.contains(kClientEntrySamplingThreshold)) lintCoverage(path, admitted, listed);
}

void ClientEntryLint::lintListedCountries(const std::string& path, size_t index, const Array& countries,
                                          const std::optional<CountrySet>& admitted,
                                          std::unordered_map<std::string, size_t>& listed) {
  for (size_t i = 0; i < countries.size() && _report.mayGoOn(); ++i) {
    if (!countries[i].isString()) continue;
    const std::string code(countries[i].text());
    const auto [first, isNew] = listed.emplace(code, index);
    if (!isNew) {
      _report.warning(pathTo(path, i),
                      fmt::format("{} stands in item {} already, which is the one that counts; take it "
                                  "out here or there",
                                  quoted(code), first->second));
    } else if (admitted.has_value() && !admitted->contains(upperCased(code))) {
      _report.warning(pathTo(path, i), fmt::format("{} is not in locale_whitelist, so no device there gets this far; "
                                                   "add it there or take it out here",
                                                   quoted(code)));
    }
  }
}

void ClientEntryLint::lintCoverage(const std::string& path, const std::optional<CountrySet>& admitted,
                                   const std::unordered_map<std::string, size_t>& listed) {
  std::vector<std::string> uncovered;
  if (admitted.has_value()) {
    for (const std::string& code : *admitted) {
      if (!listed.contains(code)) uncovered.push_back(quoted(code));
    }
  }
  std::sort(uncovered.begin(), uncovered.end());
  const std::string who = uncovered.empty() ? std::string("devices that are set to no country")
                                            : fmt::format("devices in {}", linttext::listed(uncovered));
  _report.warning(pathTo(path, kClientEntrySamplingThreshold),
                  fmt::format("is missing, so {} do not report; add it (0 says the same)", who));
}

void ClientEntryLint::lintSampling(const std::string& path, const Dictionary& entry) {
  const std::optional<double> threshold = thresholdOf(entry[kClientEntrySamplingThreshold]);
  const bool hasCountryThresholds = hasElements(entry[kClientEntryPerCountrySamplingThresholds]);
  const bool isThresholdMissing = !entry.contains(kClientEntrySamplingThreshold);
  if (isThresholdMissing && !hasCountryThresholds) {
    _report.error(pathTo(path, kClientEntrySamplingThreshold),
                  "is missing: no device reports; add it (number from 0 to 1)");
  }
  const std::optional<double> override = thresholdOf(entry[kClientEntryOverrideSampling]);
  if (!override.has_value() || hasCountryThresholds) return;
  const std::string place = pathTo(path, kClientEntryOverrideSampling);
  if (isThresholdMissing) {
    _report.warning(place, "is never looked at, because there is no sampling_threshold; add one or take this out");
  } else if (threshold.has_value() && *threshold >= 1) {
    _report.warning(place,
                    "is never looked at, because with this sampling_threshold every device reports; take it out");
  } else if (threshold.has_value() && *override > 0 && *override <= *threshold) {
    _report.warning(
        place,
        fmt::format("is {}, not above sampling_threshold ({}): every device that sampling left out is "
                    "disabled; write more to let some be promoted, or 0 to say that none is",
                    shortForm(entry[kClientEntryOverrideSampling]), shortForm(entry[kClientEntrySamplingThreshold])));
  }
}

void ClientEntryLint::lintCategoryLists(const std::string& path, const Dictionary& entry) {
  const Array* whitelist = entry[kClientEntryEventWhitelist].array();
  const Array* blacklist = entry[kClientEntryEventBlacklist].array();
  if (whitelist == nullptr || blacklist == nullptr || whitelist->empty()) return;
  if (!_report.mayGoOn(whitelist->size() + blacklist->size())) return;
  std::unordered_set<int32_t> barred;
  for (const Value& category : *blacklist) barred.insert(category.int32Value());
  const std::string place = pathTo(path, kClientEntryEventWhitelist);
  const auto isBarred = [&barred](const Value& category) { return barred.contains(category.int32Value()); };
  if (std::all_of(whitelist->begin(), whitelist->end(), isBarred)) {
    _report.error(place, "admits nothing: every category in it is in event_blacklist, too; take them out of one list");
    return;
  }
  for (size_t i = 0; i < whitelist->size() && _report.mayGoOn(); ++i) {
    if (!isBarred((*whitelist)[i])) continue;
    _report.warning(pathTo(place, i), fmt::format("{} is in event_blacklist, too, and never leaves the device; take it "
                                                  "out of one list",
                                                  shortForm((*whitelist)[i])));
  }
}

}  // namespace telvane
