#include "stabilization/factorization/window_filters.h"

#include <algorithm>
#include <cmath>
#include <vector>

#include "platform/tessel/debug.h"
#include "stabilization/factorization/active_track.h"

namespace marrow::stabilization {

namespace {

// Calls `visit(trajectory, span)` for each trajectory that takes part.
template <class Visit>
void ForEachTrack(const stabilizer_global& global, const factorization_window& window,
                  Visit visit) {
  const std::size_t begin = window.trajectories_begin;
  for (std::size_t t = begin; t < begin + window.trajectory_flags.size(); ++t) {
    if (window.takes_part(t)) visit(t, span_in_window(global.trajectories[t], window));
  }
}

std::size_t FeatureOf(const stabilizer_global& global, std::size_t trajectory) {
  return static_cast<std::size_t>(global.trajectories[trajectory].feature);
}

}  // namespace

void reprojection_errors(stabilizer_global& global, const factorization_window& window,
                         double center_x, double center_y) {
  const std::size_t length = window.end - window.first;
  std::vector<double> x(length), y(length);
  ForEachTrack(global, window, [&](std::size_t t, frame_span span) {
    const double* coefficients = window.coefficients_of(t);
    std::fill(x.begin(), x.end(), center_x);
    std::fill(y.begin(), y.end(), center_y);
    for (std::size_t i = 0; i < window.rank; ++i) {
      const double cx = coefficients[i];
      const double cy = coefficients[window.rank + i];
      const double* row = &window.basis[i * length];
      for (std::size_t f = span.first - window.first; f < span.end - window.first; ++f) {
        x[f] += cx * row[f];
        y[f] += cy * row[f];
      }
    }
    const std::size_t feature = FeatureOf(global, t);
    for (std::size_t f = span.first; f < span.end; ++f) {
      const track_sample& sample = global.input_at(f, feature);
      const double dx = x[f - window.first] - sample.x;
      const double dy = y[f - window.first] - sample.y;
      global.output_at(f, feature).error = static_cast<float>(std::sqrt(dx * dx + dy * dy));
    }
  });
}

void drop_short_tracks(const stabilizer_global& global, factorization_window& window,
                       std::int64_t short_trajectory_duration) {
  const std::int64_t least =
      std::min(static_cast<std::int64_t>(window.end - window.first), short_trajectory_duration);
  ForEachTrack(global, window, [&](std::size_t t, frame_span span) {
    if (static_cast<std::int64_t>(span.end) - static_cast<std::int64_t>(span.first) < least) {
      window.trajectory_flags[t - window.trajectories_begin] = 0;
    }
  });
}

void drop_outliers(const stabilizer_global& global, factorization_window& window,
                   double threshold) {
  ForEachTrack(global, window, [&](std::size_t t, frame_span span) {
    for (std::size_t f = span.first; f < span.end; ++f) {
      if (!(global.output_at(f, FeatureOf(global, t)).error <= threshold)) {
        window.trajectory_flags[t - window.trajectories_begin] = 0;
        return;
      }
    }
  });
}

quality_result quality_check(const stabilizer_global& global, const factorization_window& window,
                             const SolverParamsRecord& parameters, double threshold,
                             const progress_functor& progress) {
  const window_tracks loaded = load_window(global, window, parameters, progress);
  const std::size_t length = window.end - window.first;
  if (static_cast<std::int64_t>(length) < (parameters.factorization_window_overlap >> 1)) {
    return {false, window.first, window.end};
  }
  std::vector<double> sums(length);
  for (const active_track& track : loaded.tracks) {
    for (std::size_t f = track.first; f < track.end; ++f) sums[f] += track.fade[f - track.first];
    progress();
  }
  if (tessel::debug::LogEnabled()) {
    for (std::size_t f = 0; f < length; ++f) {
      tessel::debug::Log("Frame %d, sum of weights = %f", static_cast<int>(window.first + f),
                         sums[f]);
    }
  }
  std::size_t bad = 1;
  while (bad + 1 < length && !(sums[bad] < threshold)) ++bad;
  if (bad + 1 >= length) return {};
  std::size_t good = bad;
  while (good < length - 1 && sums[good] < threshold) ++good;
  progress();
  return {false, window.first + bad, std::min<std::uint64_t>(window.first + good, window.end)};
}

}  // namespace marrow::stabilization
