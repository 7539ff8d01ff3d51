#pragma once

#include <cstdint>
#include <string>
#include <vector>

namespace telvane::testing {

// Whether memory grows from round to round, which a leak does as long as the run goes on, or has levelled off, as
// caches, pools and a fragmented heap do after some rounds.
//
// rounds: bytes at the end of each. margin: so many bytes more may be taken on average in the last third of the rounds
// than in the middle third. Returns what is wrong in one line; empty when memory is level, and for fewer than 9 rounds,
// which tell nothing.
std::string memoryGrowth(const std::vector<int64_t>& rounds, int64_t margin);

}  // namespace telvane::testing
