#pragma once

#include "bench/Report.h"
#include "bench/RoadOptions.h"

namespace telvane::bench {

// One client that sends batched events as fast as it can: without rules; with filters and a white list; with these and
// the daemon's log at its usual level; with filters of which one makes a digest. In each round the four and the ceiling
// run one after the other, and ratios are taken within a round, because a host that others use is slower at one time
// than at another.
void measureBatchedEvents(const RoadOptions& options, Report& report);

}  // namespace telvane::bench
