#pragma once

#include <string>

#include "foundation/Export.h"
#include "foundation/Value.h"

namespace telvane {

// Describes a value as log lines and texts show it: text bare at the top level (quoted inside containers when it holds
// more than letters, digits, '_', '.', '/', '$'), numbers plain (a boolean as 1 or 0, a real with up to 17 significant
// digits, shortest form that reads back), data and dates as their own descriptions, an absent value as "(null)",
// containers as indented lists: "(\n    1,\n    2\n)" and "{\n    key = value;\n}" with keys in ascending byte order.
// Inside quotes, a quote, a backslash, a line feed, a carriage return and a tab are written with a backslash.
// Containers deeper than 64 levels end in "...".
TELVANE_EXPORT std::string description(const Value& value);
TELVANE_EXPORT std::string description(const Dictionary& dictionary);
TELVANE_EXPORT std::string description(const Array& array);

}  // namespace telvane
