#pragma once

#include "bench/FigureTable.h"

namespace telvane::bench {

// What the parts of a measurement add to.
struct Report {
  FigureTable figures;
  // Counted where they arrived. A part that misses one does not get as far as adding.
  uint64_t arrivedEvents = 0;
};

}  // namespace telvane::bench
