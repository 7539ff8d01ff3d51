#include "tools/EventFilterLint.h"

#include <fmt/format.h>

#include <algorithm>
#include <unordered_map>
#include <vector>

#include "interfaces/EventKeys.h"
#include "interfaces/StorebagKeys.h"
#include "tools/LintText.h"

namespace telvane {
namespace {

using linttext::pathTo;

constexpr std::string_view kRemove = kFilterActions[0];
constexpr std::string_view kSHA256 = kFilterActions[1];
constexpr std::string_view kBlacklistValues = kFilterActions[2];
constexpr std::string_view kWhitelistValues = kFilterActions[3];

std::string lowerCased(std::string_view text) {
  std::string result(text);
  for (char& c : result) c = c >= 'A' && c <= 'Z' ? static_cast<char>(c - 'A' + 'a') : c;
  return result;
}

int32_t numberOrAny(const Value& value) { return value.isPresent() ? value.int32Value() : -1; }

}  // namespace

bool EventFilterLint::Reach::covers(const Reach& other) const noexcept {
  return (method < 0 || method == other.method) && (status < 0 || status == other.status);
}

EventFilterLint::Reach EventFilterLint::reachOf(const Dictionary& filter, size_t index) {
  return {.method = numberOrAny(filter[kFilterMethod]), .status = numberOrAny(filter[kFilterStatus]), .index = index};
}

void EventFilterLint::lint(const std::string& path, const Array& filters) {
  std::unordered_map<std::string, std::vector<Reach>> earlier;
  for (size_t i = 0; i < filters.size() && _report.mayGoOn(); ++i) {
    const std::string place = pathTo(path, i);
    const Dictionary* filter = filters[i].dictionary();
    if (filter == nullptr) {
      _keys.reportKind(place, "a dictionary, a filter", filters[i], "it disables the backend");
      continue;
    }
    _keys.lint(place, StorebagLevel::Filter, *filter);
    lintAction(place, *filter);
    const String* key = (*filter)[kFilterKey].string();
    if (key == nullptr) continue;
    const Reach reach = reachOf(*filter, i);
    lintBodyField(place, *filter, reach);
    std::vector<Reach>& sameField = earlier[lowerCased(*key)];
    if (!_report.mayGoOn(sameField.size())) return;
    const auto first =
        std::find_if(sameField.begin(), sameField.end(), [&reach](const Reach& other) { return other.covers(reach); });
    if (first != sameField.end()) {
      _report.error(place, fmt::format("is never tried: filters[{}] is for the same field and for all of its events; "
                                       "remove one of them, or put this one first",
                                       first->index));
    }
    sameField.push_back(reach);
  }
}

void EventFilterLint::lintAction(const std::string& path, const Dictionary& filter) {
  const Value& action = filter[kFilterAction];
  if (!action.isPresent()) {
    _report.warning(pathTo(path, kFilterAction),
                    "is missing: the field stays, and later filters do not see it; write what is to be done");
  }
  lintValues(path, filter, action.text());
}

void EventFilterLint::lintValues(const std::string& path, const Dictionary& filter, std::string_view action) {
  const Value& values = filter[kFilterValue];
  const std::string place = pathTo(path, kFilterValue);
  const bool isBlacklist = action == kBlacklistValues;
  if (!isBlacklist && action != kWhitelistValues) {
    if (values.isPresent()) {
      _report.warning(place,
                      fmt::format("is not looked at: only {} and {} look for texts; remove it, or change the action",
                                  kBlacklistValues, kWhitelistValues));
    }
    return;
  }
  const bool isMissing = !values.isPresent();
  if (!isMissing && !(values.isArray() && values.array()->empty())) return;
  _report.error(place, fmt::format("is {}: {}; add the texts to look for", isMissing ? "missing" : "empty",
                                   isBlacklist ? "the filter takes nothing out"
                                               : "the filter takes every text out (\"remove\" says so)"));
}

// Filters also go over the body that is posted, which has neither a category nor a type and so counts as 0 and 0.
void EventFilterLint::lintBodyField(const std::string& path, const Dictionary& filter, const Reach& reach) {
  if (reach.method > 0 || reach.status > 0) return;
  const std::string field = lowerCased(filter[kFilterKey].text());
  const std::string_view action = filter[kFilterAction].text();
  const bool isAltered = action == kRemove || action == kSHA256;
  if (field == lowerCased(kBodyEvents) && isAltered) {
    _report.error(pathTo(path, kFilterKey),
                  "is also the field of the posted body that holds all events, which are lost; name the field "
                  "otherwise, or give a method");
  } else if ((field == lowerCased(kBodyClientId) || field == lowerCased(kBodyPostTime)) && isAltered) {
    _report.warning(pathTo(path, kFilterKey),
                    "is also a field of the posted body, which collectors expect; give a method to mean events only");
  }
}

}  // namespace telvane
