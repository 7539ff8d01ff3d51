#pragma once

#include <string>

#include "tools/StorebagExplainReport.h"

namespace telvane {

enum class ExplainedLog { Hidden, Shown };

// The report as a person reads it: the case, the bag, and each backend with its steps; with a line feed at its end.
std::string explanationText(const StorebagExplainReport& report, ExplainedLog log);

}  // namespace telvane
