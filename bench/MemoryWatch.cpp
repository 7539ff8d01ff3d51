#include "bench/MemoryWatch.h"

#include <algorithm>

#include "bench/Measurement.h"
#include "bench/Samples.h"

namespace telvane::bench {

void MemoryWatch::sample() {
  const uint64_t bytes = residentMemoryOf(_pid);
  if (bytes > 0) _megabytes.push_back(static_cast<double>(bytes) / 1e6);
}

MemoryWatch::Trend MemoryWatch::trendOf(const std::vector<double>& megabytes) {
  if (megabytes.empty()) return {};
  const auto quarter = [&megabytes](size_t number) {
    return megabytes.begin() + static_cast<std::ptrdiff_t>(megabytes.size() * number / 4);
  };
  Trend trend;
  trend.warm = Samples(std::vector<double>(quarter(1), std::max(quarter(2), quarter(1) + 1))).median();
  trend.end = Samples(std::vector<double>(std::min(quarter(3), megabytes.end() - 1), megabytes.end())).median();
  trend.peak = *std::max_element(megabytes.begin(), megabytes.end());
  return trend;
}

}  // namespace telvane::bench
