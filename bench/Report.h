#pragma once

#include <cstdint>

#include "bench/FigureTable.h"

namespace telvane::bench {

// What the parts of a measurement add to.
struct Report {
  FigureTable figures;
  // What was sent, and what was counted where it arrived.
  uint64_t sentEvents = 0;
  uint64_t arrivedEvents = 0;
};

}  // namespace telvane::bench
