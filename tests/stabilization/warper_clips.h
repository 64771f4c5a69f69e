#pragma once

#include <boost/make_shared.hpp>

#include "stabilization/warp/cp_warper.h"
#include "tests/stabilization/clips.h"

// Whole clips for the warper: random tracks over 1920 x 1080 that live all the time.
namespace marrow::stabilization {

inline constexpr int kWidth = 1920, kHeight = 1080;

// Tracks that stand still and want to be at wanted(f, source); one window covers the clip.
template <class Wanted>
boost::shared_ptr<stabilizer_global> clip_of(int tracks, int frames, Wanted wanted) {
  auto global = boost::make_shared<stabilizer_global>(empty_clip(tracks, frames));
  std::mt19937 random(11);
  std::uniform_real_distribution<double> x(0, kWidth - 1), y(0, kHeight - 1);
  for (int s = 0; s < tracks; ++s) add_still(*global, s, 0, frames, {x(random), y(random)}, wanted);
  return global;
}

// Two rings of four corners about the frame's middle, 400 and 200 pixels to each side.
template <class Wanted>
boost::shared_ptr<stabilizer_global> rings_clip(int frames, Wanted wanted) {
  auto global = boost::make_shared<stabilizer_global>(empty_clip(8, frames));
  for (int s = 0; s < 8; ++s) {
    const double ring = s < 4 ? 400 : 200;
    const point2 p = {960 + (s & 1 ? ring : -ring), 540 + (s & 2 ? ring : -ring)};
    add_still(*global, s, 0, frames, p, wanted);
  }
  return global;
}

// A warper with its models decided. homography_limit: what a frame's homography may be off.
inline boost::shared_ptr<CPWarper> built(
    const boost::shared_ptr<stabilizer_global>& global, float method,
    const std::vector<factorization_window>& windows,
    const std::vector<transition_record>& transitions = {},
    float homography_limit = SolverParamsRecord().homography_limit) {
  const int frames = static_cast<int>(global->frame_count);
  auto warper = boost::make_shared<CPWarper>(frames, kWidth, kHeight);
  SolverParamsRecord parameters;
  parameters.method_level = method;
  parameters.track_fade_minimum = 0;
  parameters.homography_limit = homography_limit;
  warper->buildDisplacements(global, windows, transitions, parameters, kNoProgress);
  return warper;
}

inline boost::shared_ptr<CPWarper> built(const boost::shared_ptr<stabilizer_global>& global,
                                         float method) {
  return built(global, method, {window_over(0, global->frame_count)});
}

inline boost::shared_ptr<CPWarper> driven(const boost::shared_ptr<stabilizer_global>& global,
                                          float method) {
  auto warper = built(global, method);
  warper->drive(kNoProgress);
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
