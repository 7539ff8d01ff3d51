#include "bench/Samples.h"

#include <algorithm>
#include <cmath>

namespace telvane::bench {
namespace {

std::vector<double> sorted(std::vector<double> values) {
  std::sort(values.begin(), values.end());
  return values;
}

}  // namespace

double Samples::percentile(double share) const {
  if (_values.empty()) return 0;
  const double count = static_cast<double>(_values.size());
  const size_t rank = static_cast<size_t>(std::clamp(std::ceil(share * count), 1.0, count));
  return sorted(_values)[rank - 1];
}

double Samples::median() const {
  if (_values.empty()) return 0;
  const std::vector<double> values = sorted(_values);
  const size_t middle = values.size() / 2;
  return values.size() % 2 == 1 ? values[middle] : (values[middle - 1] + values[middle]) / 2;
}

}  // namespace telvane::bench
