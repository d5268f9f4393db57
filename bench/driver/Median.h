#pragma once

#include <algorithm>
#include <cstddef>
#include <numeric>
#include <vector>

namespace orva::bench {

using Times = std::vector<double>;

/// The median; `values` is not empty.
inline double Median(Times values) {
  const std::size_t middle = values.size() / 2;
  std::ranges::sort(values);
  return values.size() % 2 == 1 ? values[middle] : (values[middle - 1] + values[middle]) / 2;
}

inline double Total(const Times& values) {
  return std::accumulate(values.begin(), values.end(), 0.0);
}

} // namespace orva::bench
