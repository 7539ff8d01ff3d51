#pragma once

#include <cstddef>
#include <vector>

namespace telvane::bench {

// What was measured several times. On a host that others use, the median says what a thing costs, and the distance
// between the least and the most says how far to believe it.
class Samples {
 public:
  Samples() = default;
  explicit Samples(std::vector<double> values) : _values(std::move(values)) {}
  void add(double value) { _values.push_back(value); }
  size_t count() const noexcept { return _values.size(); }
  bool isEmpty() const noexcept { return _values.empty(); }
  // The value that this share of the samples does not exceed; share: from 0 (the least) to 1. 0 when there are none.
  double percentile(double share) const;
  // The middle one, or the mean of the middle two.
  double median() const;
  double least() const { return percentile(0); }
  double most() const { return percentile(1); }

 private:
  std::vector<double> _values;
};

}  // namespace telvane::bench
