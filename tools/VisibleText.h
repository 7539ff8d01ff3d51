#pragma once

#include <string>
#include <string_view>

namespace telvane {

// The text as it may stand in a line on a terminal: characters that a terminal would act on, or that would make the
// line look like another one, are written as escapes ("\n", "\u009b", "\u202e"): controls, line separators, marks of
// writing direction, and invisible ones. Bytes that are no UTF-8 are written as "\xff".
std::string visibleText(std::string_view text);

}  // namespace telvane
