#include "stabilization/models/robust_pass.h"

#include <algorithm>
#include <cmath>
#include <vector>

#include "stabilization/models/motion_fits.h"

namespace marrow::stabilization {
namespace {

constexpr std::size_t kLeastEntries = 6;
constexpr double kLeastUnit = 0.5;  // pixels
constexpr double kOutlierUnits = 3.0;
constexpr double kWeightlessUnits = 4.75;

}  // namespace

double medianDeviation(std::span<Displacement> list) {
  if (list.size() < kLeastEntries) return 0.0;
  const matrix3 fit = fitSimilarity(list);
  std::vector<double> residuals;
  residuals.reserve(list.size());
  for (const Displacement& d : list) residuals.push_back(distance_off(fit, d));
  std::vector<double> sorted = residuals;
  const auto middle = sorted.begin() + static_cast<std::ptrdiff_t>(sorted.size() / 2);
  std::nth_element(sorted.begin(), middle, sorted.end(), [](double a, double b) {
    return a < b || (std::isnan(b) && !std::isnan(a));  // a weightless list has no other residuals
  });
  const double median = *middle;
  const double unit = median > kLeastUnit ? median : kLeastUnit;
  for (std::size_t i = 0; i < list.size(); ++i) {
    if (!(residuals[i] > kOutlierUnits * unit)) continue;
    const double r = residuals[i] / unit;
    list[i].outlier = true;
    list[i].weight = r >= kWeightlessUnits ? 0.0 : list[i].weight * std::exp(-2.0 * (r - 3.0));
  }
  return median;
}

void fade_about_outliers(displacement_lists& lists, std::int32_t first, std::int32_t end,
                         std::int32_t ramp_frames, const progress_functor& progress) {
  for (std::int32_t f = first; f < end; ++f) {
    progress();
    for (const Displacement& outlier : lists[f]) {
      if (!outlier.outlier) continue;
      const auto limit = [&](Displacement& reached, std::int32_t k) {
        const double most = static_cast<double>(k) / ramp_frames + outlier.weight;
        if (most < reached.weight) reached.weight = most;
      };
      std::int32_t i = outlier.prevIndex;
      for (std::int32_t g = f - 1; i >= 0 && g >= std::max(f - ramp_frames, first); --g) {
        limit(lists[g][i], f - g);
        i = lists[g][i].prevIndex;
      }
      i = outlier.nextIndex;
      for (std::int32_t g = f + 1; i >= 0 && g <= std::min(f + ramp_frames, end - 1); ++g) {
        limit(lists[g][i], g - f);
        i = lists[g][i].nextIndex;
      }
    }
  }
}

}  // namespace marrow::stabilization
