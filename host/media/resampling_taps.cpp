#include "host/media/resampling_taps.h"

#include <algorithm>
#include <cmath>
#include <map>

namespace calmframe::media {
namespace {

double Keys(double x) {
  constexpr double c = 0.6;  // of Mitchell and Netravali's family of cubics, with b = 0
  x = std::fabs(x);
  if (x < 1) return 1 + x * x * ((-18 + 6 * c) / 6 + x * ((12 - 6 * c) / 6));
  if (x < 2) return 24 * c / 6 + x * (-48 * c / 6 + x * (30 * c / 6 + x * (-6 * c / 6)));
  return 0;
}

}  // namespace

ResamplingTaps::ResamplingTaps(int from, int to, double shift) {
  const double scale = static_cast<double>(to) / from;
  const double step = std::min(scale, 1.0);
  const int reach = std::max(2 * static_cast<int>(std::ceil(2 / step)), 1);
  std::vector<std::map<int, double>> rows(static_cast<std::size_t>(to));
  for (int i = 0; i < to; ++i) {
    const double at = (i + 0.5) / scale + shift;
    const double first = std::floor(at - reach / 2.0 + 0.5) + 0.5;
    double total = 0;
    for (int k = 0; k < reach; ++k) total += Keys((first + k - at) * step);
    std::map<int, double>& row = rows[static_cast<std::size_t>(i)];
    for (int k = 0; k < reach; ++k) {
      const double x = first + k;
      const double inside = x < 0 ? -x : x >= from ? std::min(2.0 * from - x, from - 0.5) : x;
      row[static_cast<int>(std::floor(inside))] += Keys((x - at) * step) / total;
    }
    std::erase_if(row, [](const auto& tap) { return tap.second == 0; });
    width = std::max(width, static_cast<std::size_t>(row.rbegin()->first - row.begin()->first + 1));
  }
  for (const std::map<int, double>& row : rows) {
    const int begin = std::min(row.begin()->first, from - static_cast<int>(width));
    left.push_back(begin);
    double error = 0;  // of a weight's rounding, which the next one makes up for
    for (int k = begin; k < begin + static_cast<int>(width); ++k) {
      const auto tap = row.find(k);
      const double wanted = (tap == row.end() ? 0.0 : tap->second) - error;
      weights.push_back(static_cast<float>(wanted));
      error = static_cast<double>(weights.back()) - wanted;
    }
  }
}

}  // namespace calmframe::media
