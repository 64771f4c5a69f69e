#include "stabilization/factorization/moving_factorizer.h"

#include <gtest/gtest.h>

#include <algorithm>
#include <cmath>
#include <vector>

#include "stabilization/factorization/window_filters.h"
#include "tests/stabilization/clips.h"

namespace marrow::stabilization {
namespace {

constexpr double kCenterX = 960, kCenterY = 540;

struct factorization {
  moving_factorizer factorizer;
  factorization_window window;

  factorization(const stabilizer_global& global, int rank, int first, int limit, int duration = 40,
                int step = 5) {
    EXPECT_TRUE(factorizer.Setup(global.feature_count, global.frame_count, rank, duration, step));
    const std::uint64_t end =
        factorizer.Factorize(global, first, limit, kCenterX, kCenterY, window, kNoProgress);
    EXPECT_EQ(end, window.end);
  }
  int end() const { return static_cast<int>(window.end); }

  // Of the samples that take part, pixels.
  double largest_error(stabilizer_global& global) const {
    for (track_sample& s : global.output) s.error = 0;
    reprojection_errors(global, window, kCenterX, kCenterY);
    double largest = 0;
    for (const track_sample& s : global.output) largest = std::max<double>(largest, s.error);
    return largest;
  }
};

// x stands 300 pixels off the centre and y goes to and fro by 40: of rank 1 the first is kept, and
// 40^2 a sample are left by the first window, by the frames that it moves over, and by two tracks
// that are complete from the second position on.
TEST(MovingFactorizerTest, WhatLiesBeyondTheRankIsLeft) {
  stabilizer_global global = clip_of(28, {{2, 0, 28}, {2, 4, 28}}, [](std::size_t, int f) {
    return point2{kCenterX + 300, kCenterY + (f % 2 ? 40 : -40)};
  });
  const factorization found(global, 1, 0, 300, 20, 4);
  ASSERT_EQ(found.end(), 28);
  ASSERT_EQ(found.factorizer.residuals().size(), 3u);
  for (std::size_t k = 0; k < 3; ++k) {
    EXPECT_EQ(found.factorizer.residuals()[k].first, 4 * k);
    EXPECT_NEAR(found.factorizer.residuals()[k].new_tracks, k < 2 ? 1600 : 0, 1e-6) << k;
    EXPECT_NEAR(found.factorizer.residuals()[k].new_frames, k > 0 ? 1600 : 0, 1e-6) << k;
  }
  found.largest_error(global);
  for (int f = 0; f < 28; ++f) {
    EXPECT_NEAR(std::fabs(found.window.basis[f]), std::sqrt(1 / 20.0), 1e-9);
    EXPECT_NEAR(global.output_at(f, 1).error, 40, 1e-4);
  }
}

TEST(MovingFactorizerTest, MovingKeepsExactDataExactWhileTracksComeAndGo) {
  std::vector<lives> tracks;
  for (int s = 0; s < 60; ++s) {
    const int first = std::max(0, (s * 7) % 260 - 30);
    tracks.push_back({1, first, std::min(247, first + 60 + (s * 13) % 90)});
  }
  // Under the rank, and at it.
  for (int s = 0; s < 12; ++s) tracks.push_back({1, 100 + s, 103 + s + s % 2});
  stabilizer_global global = shaken_clip(247, tracks);
  for (const auto& [start, limit, end] : {std::tuple(0, 300, 247), {100, 94, 190}}) {
    const factorization found(global, 4, start, limit);
    EXPECT_EQ(found.window.first, static_cast<std::uint64_t>(start));
    EXPECT_EQ(found.end(), end);
    EXPECT_LT(found.largest_error(global), 0.02);  // f32 storage, grown over the moves
    for (std::size_t t = 0; t < global.trajectories.size(); ++t) {
      const Trajectory& tr = global.trajectories[t];
      const int shared = std::min(tr.last, end) - std::max(tr.first, start);
      EXPECT_EQ(found.window.takes_part(t), shared >= 4) << tr.first << " " << tr.last;
    }
    // One position for each step, the last one shorter by the clip's end.
    ASSERT_EQ(found.factorizer.residuals().size(), 1u + (end - start - 36) / 5);
    for (const auto& r : found.factorizer.residuals()) {
      EXPECT_LT(r.new_tracks + r.new_frames, 1e-4);
    }
  }
}

TEST(MovingFactorizerTest, WhereAWindowEnds) {
  const struct {
    int first, limit, step, end;
  } cases[] = {{0, 300, 7, 200}, {10, 94, 5, 100}, {0, 33, 5, 33}, {180, 300, 5, 200}};
  const stabilizer_global steady = shaken_clip(200, {{10, 0, 200}});
  for (const auto& e : cases) {
    EXPECT_EQ(factorization(steady, 4, e.first, e.limit, 40, e.step).end(), e.end)
        << e.first << " " << e.limit;
  }
  // One track is too few for a rank of 4 behind frame 101.
  const stabilizer_global fading = shaken_clip(200, {{1, 0, 200}, {3, 0, 101}});
  EXPECT_EQ(factorization(fading, 4, 0, 300).end(), 100);
  EXPECT_EQ(factorization(fading, 4, 150, 300).end(), 150);  // empty
  const stabilizer_global enough = shaken_clip(200, {{2, 0, 200}, {1, 0, 101}});
  EXPECT_EQ(factorization(enough, 4, 0, 300).end(), 200);
}

TEST(MovingFactorizerTest, AStretchShorterThanTheRankHasNoTracks) {
  const stabilizer_global global = shaken_clip(45, {{10, 0, 45}});
  factorization found(global, 9, 0, 300);  // leaves its memory used
  factorization_window rest;
  EXPECT_EQ(found.factorizer.Factorize(global, 40, 300, 0, 0, rest, kNoProgress), 45u);
  for (std::size_t t = 0; t < 10; ++t) EXPECT_FALSE(rest.takes_part(t));
  for (std::size_t i = 5; i < 9; ++i) {
    for (std::size_t f = 0; f < 5; ++f) EXPECT_EQ(rest.basis[i * 5 + f], 0.0);
  }
  EXPECT_FALSE(found.factorizer.Setup(0, 100, 9, 40, 5));
  EXPECT_TRUE(found.factorizer.error());
}

TEST(MovingFactorizerTest, RankAboveNineAndAboveTheOverlap) {
  synthetic::track_world_options options = world_of(120, 80);
  options.whole_clip = true;
  options.gain = 0.2;
  options.noise = 0;
  stabilizer_global global = clip_of(options);
  const double nine = factorization(global, 9, 0, 300).largest_error(global);
  EXPECT_LT(factorization(global, 12, 0, 300).largest_error(global), 0.7 * nine);
  // 10 frames shared, 12 signals: minimum-norm fits.
  EXPECT_EQ(factorization(global, 12, 0, 300, 14, 4).end(), 120);
}

}  // namespace
}  // namespace marrow::stabilization
