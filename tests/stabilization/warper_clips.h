#pragma once

#include <boost/make_shared.hpp>

#include "stabilization/warp/cp_warper.h"
#include "tests/stabilization/displacement_lists.h"

// Whole clips for the warper: random tracks over 1920 x 1080 that live all the time.
namespace marrow::stabilization {

inline constexpr int kWidth = 1920, kHeight = 1080;

// Tracks that stand still and want to be at wanted(f, source); one window covers the clip.
template <class Wanted>
boost::shared_ptr<stabilizer_global> clip_of(int tracks, int frames, Wanted wanted) {
  auto global = boost::make_shared<stabilizer_global>(empty_clip(tracks, frames));
  std::mt19937 random(11);
  std::uniform_real_distribution<double> unit(0, 1);
  for (int s = 0; s < tracks; ++s) {
    const point2 p = {unit(random) * (kWidth - 1), unit(random) * (kHeight - 1)};
    add_track(
        *global, s, 0, frames, [&](int) { return p; }, wanted);
  }
  return global;
}

inline std::vector<factorization_window> whole_clip(int frames) {
  factorization_window window;
  window.end = frames;
  return {window};
}

inline boost::shared_ptr<CPWarper> built(boost::shared_ptr<stabilizer_global> global, float method,
                                         const std::vector<transition_record>& transitions = {},
                                         bool window = true) {
  const int frames = static_cast<int>(global->frame_count);
  auto warper = boost::make_shared<CPWarper>(frames, kWidth, kHeight);
  SolverParamsRecord parameters;
  parameters.method_level = method;
  parameters.track_fade_minimum = 0;
  warper->buildDisplacements(global,
                             window ? whole_clip(frames) : std::vector<factorization_window>{},
                             transitions, parameters, [] {});
  return warper;
}

inline boost::shared_ptr<CPWarper> driven(boost::shared_ptr<stabilizer_global> global, float method,
                                          const std::vector<transition_record>& transitions = {},
                                          bool window = true) {
  auto warper = built(global, method, transitions, window);
  warper->drive([] {});
  return warper;
}

// Largest distance, in pixels, of a frame's vertices from the rest grid under m.
inline double distance_from(const CPWarper& warper, int frame, const matrix3& m) {
  const VarVector& grid = *warper.frameWarp(frame);
  double largest = 0;
  for (int r = 0; r < grid.rows; ++r) {
    for (int c = 0; c < grid.cols; ++c) {
      const point2 p = transform(m, {c * warper.cellWidth(), r * warper.cellHeight()});
      const point2 v = grid.vertex(c, r);
      const double d = std::hypot(v.x - p.x, v.y - p.y);
      if (!(d <= largest)) largest = d;
    }
  }
  return largest;
}

}  // namespace marrow::stabilization
