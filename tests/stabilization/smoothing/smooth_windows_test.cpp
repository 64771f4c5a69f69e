#include "stabilization/smoothing/smooth_windows.h"

#include <gtest/gtest.h>

#include <cmath>
#include <cstddef>
#include <vector>

#include "tests/stabilization/clips.h"

// A clip in which every kind of join occurs: a transition at its start, a window behind it, a
// transition behind the window's cleaned tail, a window behind that, a transition to the end.
namespace marrow::stabilization {
namespace {

// Shaky, with parallax; every ninth point is a thing that moves by itself, which the robust pass of
// the tail has to weigh down.
point2 point_of_chain(std::size_t slot, int frame) {
  const double f = frame;
  const double depth = 1 + 0.3 * static_cast<double>(slot % 5);
  double x = 40.0 + static_cast<double>(slot * 97 % 560) -
             (1.5 * f + 4 * std::sin(0.9 * f) + 2 * std::sin(2.3 * f + 1)) / depth;
  double y =
      30.0 + static_cast<double>(slot * 61 % 420) - (3 * std::cos(1.1 * f) + 0.4 * f) / depth;
  if (slot % 9 == 4) {
    x += 9 * std::sin(1.7 * f);
    y += 7 * std::cos(1.3 * f);
  }
  return transform(similarity{1, 0.01 * std::sin(0.7 * f), 0, 0}, {x, y});
}

solved_clip solve_chain(SolverParamsRecord parameters, point2 (*point)(std::size_t, int)) {
  std::vector<lives> tracks = {{18, 6, 36}, {18, 46, 76}};
  for (int i = 0; i < 6; ++i) tracks.push_back({1, 0, 10 + i});
  for (int i = 0; i < 8; ++i) tracks.push_back({1, 22 + 2 * i, 40 + 2 * i});
  for (int i = 0; i < 6; ++i) tracks.push_back({1, 64 + 2 * i, 80 + 2 * i});
  parameters.rank = 3;
  parameters.duration = 20;
  parameters.short_trajectory_duration = 5;
  parameters.smoothness_lambda = 30;
  parameters.transition_stab_lambda = 15;
  parameters.conservative_factorization = false;
  parameters.factorization_window_overlap = 10;
  parameters.reconstruction_error_threshold = 1e9;  // keeps what moves by itself
  return solve(clip_of(90, tracks, point), parameters);
}

// The numbers come from a plain program of its own, dense and in double precision, with
// Gauss-Newton steps until they vanish in place of the transition's solver.
TEST(SmoothWindowsTest, WindowsAndTransitionsJoin) {
  const solved_clip clip = solve_chain({}, point_of_chain);
  ASSERT_EQ(clip.result, 1);
  ASSERT_EQ(spans_of(clip.windows), "6 36;46 76;");
  ASSERT_EQ(spans_of(clip.transitions), "solved 0 16;solved 36 56;solved 76 88;unsolved 88 90;");
  const struct {
    std::size_t frame, slot;
    double x, y;
  } expected[] = {
      {3, 36, 168.0263, 124.6415},   // the first transition alone
      {10, 2, 225.7169, 149.8166},   // the window where it joins that transition
      {10, 40, 548.9573, 365.4897},  // a thing that moves by itself
      {30, 2, 206.2699, 143.9824},   // the window's tail, put back
      {30, 43, 267.6755, 125.9977},  //
      {35, 7, 126.9493, 27.5084},    //
      {38, 45, 428.0542, 239.6935},  // the second transition, behind the cleaned tail
      {52, 20, 223.0553, 388.3340},  // the second window
      {80, 53, 76.9118, 306.1153},   // the last transition, behind a tail with targets of its own
      {85, 55, 206.2843, 411.2861},  //
  };
  for (const auto& e : expected) {
    const track_sample& sample = clip.global.output_at(e.frame, e.slot);
    EXPECT_GE(sample.status, 0);
    EXPECT_NEAR(sample.x, e.x, 2e-3) << "frame " << e.frame << ", slot " << e.slot;
    EXPECT_NEAR(sample.y, e.y, 2e-3) << "frame " << e.frame << ", slot " << e.slot;
  }
}

// Without own motion every track stands still from bridge to window and from window to bridge: each
// takes over where the frame before it left the tracks.
TEST(SmoothWindowsTest, WithoutMotionTracksStandStillAcrossTheBridges) {
  SolverParamsRecord parameters;
  parameters.no_motion = true;
  const solved_clip clip = solve_chain(parameters, [](std::size_t slot, int f) {
    const point2 rest = scattered(slot), shift = shaken({0, 0}, f);
    return point2{rest.x + shift.x, rest.y + shift.y};
  });
  ASSERT_EQ(clip.result, 1);
  ASSERT_EQ(spans_of(clip.windows), "6 36;46 76;");
  ASSERT_EQ(spans_of(clip.transitions), "solved 0 16;solved 36 56;solved 76 90;");
  std::size_t steps = 0;
  for (std::size_t f = 1; f < 90; ++f) {
    if (f >= 46 && f < 56) continue;  // the second window's start has its own table
    for (std::size_t s = 0; s < clip.global.feature_count; ++s) {
      const track_sample &before = clip.global.output_at(f - 1, s),
                         &at = clip.global.output_at(f, s);
      if (before.status < 0 || at.status < 0) continue;
      expect_point_near(position(at), position(before), 0.05);
      ++steps;
    }
  }
  EXPECT_GT(steps, 800u);
}

}  // namespace
}  // namespace marrow::stabilization
