#pragma once

#include "bench/Report.h"
#include "bench/RoadOptions.h"

namespace telvane::bench {

// 26 client types with 4 sessions each at once. Each type is a process of its own, as in life: a type is a kind of
// program, and one process with all 104 sessions would encode all events in one thread and measure itself. Each session
// has its own connection. All are open and configured before the first event is sent.
void measureManySessions(const RoadOptions& options, Report& report);

}  // namespace telvane::bench
