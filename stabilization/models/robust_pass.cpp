#include "stabilization/models/robust_pass.h"

#include <algorithm>
#include <cmath>
#include <utility>
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

void fade_about_outliers_of(std::span<std::vector<Displacement>> lists, std::size_t frame,
                            std::int32_t ramp_frames) {
  const auto end = static_cast<std::int32_t>(lists.size());
  const auto f = static_cast<std::int32_t>(frame);
  for (const Displacement& outlier : lists[frame]) {
    if (!outlier.outlier) continue;
    const auto limit = [&](Displacement& reached, std::int32_t k) {
      const double most = static_cast<double>(k) / ramp_frames + outlier.weight;
      if (most < reached.weight) reached.weight = most;
    };
    std::int32_t i = outlier.prevIndex;
    for (std::int32_t g = f - 1; i >= 0 && g >= std::max(f - ramp_frames, 0); --g) {
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

void fade_about_outliers(displacement_lists& lists, std::int32_t first, std::int32_t end,
                         std::int32_t ramp_frames) {
  const auto range = std::span(lists).subspan(first, end - first);
  for (std::size_t f = 0; f < range.size(); ++f) fade_about_outliers_of(range, f, ramp_frames);
}

robust_walk::robust_walk(const blended_tracks& tracks, std::int32_t ramp_frames,
                         std::size_t first_frame, look before)
    : frame_count_(tracks.frame_count()),
      ramp_(static_cast<std::size_t>(ramp_frames)),
      before_(std::move(before)),
      // What fades over a ramp weighs by what fades over a ramp before it, and no further: two
      // ramps add up to more than any weight.
      stream_(tracks, static_cast<std::int32_t>(first_frame - std::min(first_frame, 2 * ramp_))),
      base_(first_frame - std::min(first_frame, 2 * ramp_)),
      next_(base_),
      faded_(base_) {
  while (next_ < first_frame) next();
}

void robust_walk::read() {
  lists_.push_back(stream_.next(lists_.empty() ? nullptr : &lists_.back()));
  if (before_) before_(base_ + lists_.size() - 1, lists_.back());
  medians_.push_back(medianDeviation(lists_.back()));
}

robust_walk::step robust_walk::next() {
  for (const std::size_t end = std::min(next_ + ramp_ + 1, frame_count_); faded_ < end; ++faded_) {
    while (base_ + lists_.size() < std::min(faded_ + ramp_ + 1, frame_count_)) read();
    fade_about_outliers_of(lists_, faded_ - base_, static_cast<std::int32_t>(ramp_));
  }
  step result{std::move(lists_.front()), medians_.front()};
  lists_.erase(lists_.begin());
  medians_.erase(medians_.begin());
  base_ = ++next_;
  return result;
}

}  // namespace marrow::stabilization
