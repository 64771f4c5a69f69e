#pragma once

#include <algorithm>
#include <cmath>
#include <string>
#include <utility>
#include <vector>

#include "stabilization/stabilizer_main.h"
#include "synthetic/track_world.h"
#include "tests/stabilization/clips.h"

// Whole clips through the solve.
namespace marrow::stabilization {

inline SolverParamsRecord params_1080p() {
  SolverParamsRecord parameters;
  parameters.reconstruction_error_threshold = 0.0045 * 1920;
  parameters.reconstruction_error_third = parameters.reconstruction_error_threshold / 3;
  return parameters;
}

inline synthetic::track_world_options world_of(int frames, int slots, double mean_life = 60) {
  synthetic::track_world_options options;
  options.frame_count = frames;
  options.slots = slots;
  options.mean_life = mean_life;
  return options;
}

inline stabilizer_global clip_of(const synthetic::track_world_options& options) {
  return *make_track_world(options).global;
}

struct solved_clip {
  stabilizer_global global;
  std::vector<transition_record> transitions;
  std::vector<factorization_window> windows;
  int result = 0;
  std::string log;
};

inline solved_clip solve(stabilizer_global global, const SolverParamsRecord& parameters,
                         const progress_functor& progress = kNoProgress) {
  solved_clip clip;
  clip.global = std::move(global);
  captured_log log;
  clip.result = stabilizer_main(clip.global, parameters, clip.transitions, clip.windows, 1920, 1080,
                                progress);
  clip.log = log.text;
  return clip;
}

// NaN where there are no numbers.
inline double median(std::vector<double> values) {
  std::erase_if(values, [](double v) { return std::isnan(v); });
  if (values.empty()) return NAN;
  const auto middle = values.begin() + static_cast<std::ptrdiff_t>(values.size() / 2);
  std::nth_element(values.begin(), middle, values.end());
  return *middle;
}

// Median over the tracks of their second difference about frame f, in pixels.
inline double median_bend(const solved_clip& clip, const std::vector<track_sample>& rows,
                          std::size_t f) {
  std::vector<double> bends;
  for (std::size_t s = 0; s < clip.global.feature_count; ++s) {
    bends.push_back(bend(clip.global, rows, s, f));
  }
  return median(bends);
}

// The positions that the warp of each frame goes by: windows blended where they overlap.
inline std::vector<track_sample> blended_output(const solved_clip& clip) {
  std::vector<track_sample> rows(clip.global.output.size(), {0, 0, -1, 0});
  const displacement_lists lists = blended_displacements(clip.global, clip.windows, params_1080p());
  for (std::size_t f = 0; f < lists.size(); ++f) {
    for (const Displacement& d : lists[f]) {
      rows[f * clip.global.feature_count + static_cast<std::size_t>(d.track->feature)] = {
          static_cast<float>(d.targetX), static_cast<float>(d.targetY), d.prevIndex < 0, 0};
    }
  }
  return rows;
}

}  // namespace marrow::stabilization
