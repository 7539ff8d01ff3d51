#pragma once

#include "bench/Report.h"
#include "bench/RoadOptions.h"

namespace telvane::bench {

// The memory of daemon and client over a long run of batched events with filters and white list, and then how often the
// daemon wakes up when there is nothing left to do.
void measureMemoryOverTime(const RoadOptions& options, Report& report);

}  // namespace telvane::bench
