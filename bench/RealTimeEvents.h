#pragma once

#include "bench/Report.h"
#include "bench/RoadOptions.h"

namespace telvane::bench {

// Real-time events one by one, from the client's call to their arrival, each beside a bare post of the same request.
// See RealTimeClient.cpp for what is measured.
void measureRealTimeEvents(const RoadOptions& options, Report& report);

}  // namespace telvane::bench
