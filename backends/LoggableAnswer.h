#pragma once

#include <string>
#include <string_view>

namespace telvane {

// Of a server's answer, as much as a log line should hold, in bytes.
inline constexpr size_t kMostLoggedAnswer = 4096;

// What a server said, for the log: it may be anything of any length. Controls would act on the terminal that shows the
// log, so each becomes a blank, but for line feeds, which the log itself sees to. What is cut off behind
// kMostLoggedAnswer, between two characters, is counted.
std::string loggableAnswer(std::string_view text);

}  // namespace telvane
