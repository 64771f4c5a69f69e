#include "host/stabilize/choice.h"

#include <gtest/gtest.h>

#include <cmath>
#include <random>
#include <vector>

namespace calmframe::host {
namespace {

// Points of a flat scene that a shaking hand films, and warps that undo the shake but for `noise`
// pixels by which each vertex of each frame is off. Every fourth vertex of the noise has it alone,
// so that no similarity undoes it.
SolvedClip Filmed(double noise) {
  constexpr int kFrames = 90, kSlots = 80;
  std::mt19937 random(6);
  std::uniform_real_distribution<double> even(-1, 1);
  SolvedClip clip;
  clip.source_width = clip.width = 400;
  clip.source_height = clip.height = 300;
  clip.frame_count = kFrames;
  clip.columns = 5;
  clip.rows = 4;
  clip.slots = kSlots;
  std::vector<Point> scene;
  for (int s = 0; s < kSlots; ++s) {
    scene.push_back({200 + 180 * even(random), 150 + 130 * even(random)});
  }
  for (int f = 0; f < kFrames; ++f) {
    const Similarity hand{1, 0.01 * even(random), 6 * even(random), 6 * even(random)};
    for (const Point& point : scene) {
      clip.tracks.push_back(hand(point));
      clip.statuses.push_back(f == 0 ? 1 : 0);
    }
    for (int r = 0; r < clip.rows; ++r) {
      for (int c = 0; c < clip.columns; ++c) {
        const Point still = Inverse(hand)({399.0 * c / 4, 299.0 * r / 3});
        clip.vertices.push_back({still.x + noise * even(random), still.y + noise * even(random)});
      }
    }
  }
  return clip;
}

TEST(ChooseTest, BendsAreKeptWhereTheyHelpAndLeftWhereTheyAreNoise) {
  const Choice good = Choose(Filmed(0), {}, 30, true);
  EXPECT_EQ(good.warps, Warps::solved);
  EXPECT_LT(good.outcome.after.mean, 0.05);
  const Choice bad = Choose(Filmed(15), {}, 30, true);
  EXPECT_EQ(bad.warps, Warps::none);
  EXPECT_FALSE(bad.outcome.bends);
  EXPECT_LT(bad.outcome.after.mean, 0.2);
  const Choice fixed = Choose(Filmed(15), {}, 30, false);
  EXPECT_EQ(fixed.warps, Warps::solved);
  EXPECT_GT(fixed.outcome.after.mean, 2 * bad.outcome.after.mean);
  for (const Choice* choice : {&good, &bad, &fixed}) {
    EXPECT_LE(choice->outcome.most_zoom, 1.5 + 1e-3);
    EXPECT_LT(choice->outcome.most_black, 1e-4);
  }
}

// The same windows, enlarged or made smaller afterwards.
TEST(ChooseTest, AnEnlargementComesOnTop) {
  const SolvedClip clip = Filmed(0);
  const Outcome plain = Choose(clip, {}, 30, true).outcome;
  FollowSettings settings;
  settings.enlarged = 1.25;
  const Outcome larger = Choose(clip, settings, 30, true).outcome;
  EXPECT_NEAR(larger.width_kept * 1.25, plain.width_kept, 1e-6);
  settings.enlarged = 0.8;
  EXPECT_GT(Choose(clip, settings, 30, true).outcome.most_black, 0.2);
}

}  // namespace
}  // namespace calmframe::host
