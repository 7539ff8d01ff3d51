#pragma once

#include <string_view>
#include <vector>

#include "foundation/Value.h"

// Lists of names in a storebag, matched without regard to the case of ASCII letters.
namespace telvane {

using NameList = std::vector<std::string_view>;

bool equalsIgnoringCase(std::string_view a, std::string_view b) noexcept;
// Whether the text has the part somewhere. An empty part is in no text.
bool containsIgnoringCase(std::string_view text, std::string_view part) noexcept;

// The parts between the commas, blanks and all; an empty list when the value is no text. Views of the value's text.
NameList namesSeparatedByCommas(const Value& value);
// One name per element, an empty one for an element that is no text; an empty list when the value is no array. Views of
// the elements' text.
NameList namesOfArray(const Value& value);

// Whether one of the names equals the text. An empty list answers with whitelist; absent text (a null view) with its
// opposite.
bool matchExactStringWithList(const NameList& list, std::string_view wholeString, bool whitelist) noexcept;
// The same, whether the text contains one of the names.
bool matchStringWithList(const NameList& list, std::string_view wholeString, bool whitelist) noexcept;

}  // namespace telvane
