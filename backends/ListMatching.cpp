#include "backends/ListMatching.h"

#include <algorithm>

namespace telvane {
namespace {

constexpr char lowerCased(char c) noexcept { return c >= 'A' && c <= 'Z' ? static_cast<char>(c - 'A' + 'a') : c; }

constexpr bool isSameLetter(char a, char b) noexcept { return lowerCased(a) == lowerCased(b); }

template <class Matches>
bool matchAny(const NameList& list, std::string_view wholeString, bool whitelist, Matches matches) noexcept {
  if (list.empty()) return whitelist;
  if (wholeString.data() == nullptr) return !whitelist;
  return std::any_of(list.begin(), list.end(), matches);
}

}  // namespace

bool equalsIgnoringCase(std::string_view a, std::string_view b) noexcept {
  return a.size() == b.size() && std::equal(a.begin(), a.end(), b.begin(), isSameLetter);
}

bool containsIgnoringCase(std::string_view text, std::string_view part) noexcept {
  return !part.empty() && std::search(text.begin(), text.end(), part.begin(), part.end(), isSameLetter) != text.end();
}

NameList namesSeparatedByCommas(const Value& value) {
  NameList names;
  if (!value.isString()) return names;
  std::string_view text = value.text();
  for (size_t comma = text.find(','); comma != std::string_view::npos; comma = text.find(',')) {
    names.push_back(text.substr(0, comma));
    text.remove_prefix(comma + 1);
  }
  names.push_back(text);
  return names;
}

NameList namesOfArray(const Value& value) {
  NameList names;
  if (const Array* array = value.array()) {
    names.reserve(array->size());
    for (const Value& element : *array) names.push_back(element.text());
  }
  return names;
}

bool matchExactStringWithList(const NameList& list, std::string_view wholeString, bool whitelist) noexcept {
  return matchAny(list, wholeString, whitelist,
                  [wholeString](std::string_view name) { return equalsIgnoringCase(wholeString, name); });
}

bool matchStringWithList(const NameList& list, std::string_view wholeString, bool whitelist) noexcept {
  return matchAny(list, wholeString, whitelist,
                  [wholeString](std::string_view name) { return containsIgnoringCase(wholeString, name); });
}

}  // namespace telvane
