#pragma once

#include <span>
#include <string>
#include <string_view>

#include "foundation/Value.h"

// How findings about a bag are written: places, values and lists of names, each on one line whatever the bag holds.
namespace telvane::linttext {

// The place of a key in a dictionary, or of an element in an array, below the place of the whole: "release/splunk",
// "clients[2]". A key with other characters than letters, digits and ".-_=" is quoted. An empty parent is the bag.
std::string pathTo(std::string_view parent, std::string_view key);
std::string pathTo(std::string_view parent, size_t index);

// The text in quotes, cut after some 60 bytes, without a character that a terminal would act on.
std::string quoted(std::string_view text);
// Texts quoted, numbers as they are, everything else by its kind.
std::string shortForm(const Value& value);
// "text", "an array", "null".
std::string_view kindName(const Value& value) noexcept;
// "US, CA, GB and 3 more".
std::string listed(std::span<const std::string> names);

}  // namespace telvane::linttext
