#pragma once

#include <algorithm>
#include <cmath>
#include <vector>

namespace bench {

// A set of measured values.
class Percentiles {
 public:
  void add(double value) { _values.push_back(value); }

  [[nodiscard]] size_t size() const { return _values.size(); }

  // The nearest-rank percentile for `part` (0 to 1); 0 without values.
  [[nodiscard]] double at(double part) const {
    if (_values.empty()) return 0;
    std::vector<double> sorted = _values;
    std::sort(sorted.begin(), sorted.end());
    const double rank = std::ceil(part * static_cast<double>(sorted.size()));
    return sorted[static_cast<size_t>(std::max(rank, 1.0)) - 1];
  }

 private:
  std::vector<double> _values;
};

}  // namespace bench
