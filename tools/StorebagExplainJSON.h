#pragma once

#include "foundation/Value.h"
#include "tools/StorebagExplainReport.h"

namespace telvane {

// The report for programs. What JSON has no form for, or what is nested deeply, stands there as the text that describes
// it, so that it can always be written.
Dictionary explanationDictionary(const StorebagExplainReport& report);

}  // namespace telvane
