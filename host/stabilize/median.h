#pragma once

#include <algorithm>
#include <cstddef>
#include <vector>

namespace calmframe::host {

// Of an even number of values the upper of the two in the middle. Leaves them in another order;
// there must be one.
inline double Median(std::vector<double>& values) {
  const auto middle = values.begin() + static_cast<std::ptrdiff_t>(values.size() / 2);
  std::nth_element(values.begin(), middle, values.end());
  return *middle;
}

}  // namespace calmframe::host
