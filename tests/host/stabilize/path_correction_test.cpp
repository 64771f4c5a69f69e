#include "host/stabilize/path_correction.h"

#include <gtest/gtest.h>

#include <algorithm>
#include <cmath>
#include <cstddef>
#include <random>
#include <vector>

#include "host/stabilize/measures.h"

namespace calmframe::host {
namespace {

constexpr std::size_t kWalkFrames = 150;

// A shaking camera's motions from each frame to the one before, each a little off, and where they
// leave a point of the scene, seen from the first frame.
struct ShakenWalk {
  std::vector<Similarity> poses, motions;  // to the scene; to the frame before
  std::vector<TrackPath> paths;

  explicit ShakenWalk(std::size_t life) {
    std::mt19937 random(3);
    std::uniform_real_distribution<double> even(-1, 1);
    for (std::size_t f = 0; f < kWalkFrames; ++f) {
      const double pan = 3.0 * static_cast<double>(f);
      poses.push_back(
          {1 + 0.01 * even(random), 0.01 * even(random), pan + 6 * even(random), 6 * even(random)});
      Similarity off{1 + 1e-3 * even(random), 1e-3 * even(random), even(random), even(random)};
      if (f == 0) off = {};
      motions.push_back(f == 0 ? Similarity()
                               : Compose(Compose(Inverse(poses[f - 1]), poses[f]), off));
    }
    // Of three points one lies on somebody who sways by four pixels.
    for (int i = 0; i < 400; ++i) {
      TrackPath path;
      path.first = static_cast<std::size_t>((even(random) + 1) / 2 * (kWalkFrames - 5));
      const Point first{300 * even(random) + 3.0 * static_cast<double>(path.first),
                        150 * even(random)};
      for (std::size_t f = path.first; f < std::min(path.first + life, kWalkFrames); ++f) {
        Point scene = first;
        if (i % 3 == 0) scene.y += 4 * std::sin(0.9 * static_cast<double>(f));
        path.points.push_back(Inverse(poses[f])(scene));
      }
      paths.push_back(path);
    }
  }

  // Of what is shown when the true poses are undone.
  double ShakeBy(const std::vector<Similarity>& by) const {
    ShownMotion shown{640, 360, {}, {}, {}, {}, {}, {}};
    shown.motions.emplace_back();
    for (std::size_t f = 1; f < kWalkFrames; ++f) {
      shown.motions.push_back(Compose(poses[f - 1], Compose(by[f], Inverse(poses[f]))));
    }
    return MeasureShake(shown, 30).mean;
  }
};

// Tracks of 60 frames and of 30, which end before a whole parabola does.
TEST(CorrectByPathsTest, WhatFitsAreOffByAddsUpNoMore) {
  for (const std::size_t life : {60, 30}) {
    const ShakenWalk walk(life);
    std::vector<Similarity> motions = walk.motions;
    CorrectByPaths(walk.paths, 2, motions);
    EXPECT_GT(walk.ShakeBy(walk.motions), 1) << life;
    EXPECT_LT(walk.ShakeBy(motions), walk.ShakeBy(walk.motions) / 4) << life;
  }
}

// Paths that are too short or too few leave the motions to the last bit.
TEST(CorrectByPathsTest, WithoutPathsNothingChanges) {
  ShakenWalk walk(11);
  std::vector<Similarity> motions = walk.motions;
  CorrectByPaths(walk.paths, 2, motions);
  for (std::size_t f = 0; f < kWalkFrames; ++f) EXPECT_EQ(motions[f].dx, walk.motions[f].dx) << f;
}

}  // namespace
}  // namespace calmframe::host
