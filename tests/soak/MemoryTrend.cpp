#include "tests/soak/MemoryTrend.h"

#include <fmt/format.h>

#include <numeric>

namespace telvane::testing {
namespace {

constexpr size_t kThirds = 3;
constexpr size_t kFewestRounds = 9;

}  // namespace

std::string memoryGrowth(const std::vector<int64_t>& rounds, int64_t margin) {
  if (rounds.size() < kFewestRounds) return {};
  const auto third = static_cast<std::ptrdiff_t>(rounds.size() / kThirds);
  const auto averageOf = [third](auto begin) { return std::accumulate(begin, begin + third, int64_t{0}) / third; };
  const int64_t middle = averageOf(rounds.end() - 2 * third);
  const int64_t last = averageOf(rounds.end() - third);
  if (last <= middle + margin) return {};
  return fmt::format("memory grows: {} bytes on average in the last {} rounds, {} in the {} before", last, third,
                     middle, third);
}

}  // namespace telvane::testing
