#include "stabilization/factorization/active_track.h"

#include <algorithm>

#include "stabilization/fade_weight.h"

namespace marrow::stabilization {

frame_span span_in_window(const Trajectory& trajectory, const factorization_window& window) {
  return {std::max(static_cast<std::size_t>(trajectory.first), std::size_t{window.first}),
          std::min(static_cast<std::size_t>(trajectory.last), std::size_t{window.end})};
}

window_tracks load_window(const stabilizer_global& global, const factorization_window& window,
                          const SolverParamsRecord& parameters, const progress_functor& progress) {
  window_tracks loaded;
  const std::size_t begin = window.trajectories_begin;
  std::size_t samples = 0;
  for (std::size_t t = begin; t < begin + window.trajectory_flags.size(); ++t) {
    const frame_span span = span_in_window(global.trajectories[t], window);
    if (window.takes_part(t) && span.first < span.end) {
      loaded.tracks.push_back({span.first - window.first, span.end - window.first, t,
                               window.coefficients_of(t), nullptr});
      samples += span.end - span.first;
    }
    progress();
  }
  loaded.fades.reserve(samples);  // the pointers into it stay
  for (active_track& track : loaded.tracks) {
    const Trajectory& t = global.trajectories[track.trajectory];
    track.fade = loaded.fades.data() + loaded.fades.size();
    for (std::size_t f = track.first; f < track.end; ++f) {
      loaded.fades.push_back(
          fade_weight(t.first, t.last, static_cast<std::int64_t>(global.frame_count),
                      static_cast<std::int64_t>(window.first + f), parameters.track_fade_duration,
                      parameters.track_fade_minimum));
    }
  }
  return loaded;
}

}  // namespace marrow::stabilization
