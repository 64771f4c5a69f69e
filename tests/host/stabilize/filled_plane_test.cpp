#include "host/stabilize/filled_plane.h"

#include <gtest/gtest.h>

#include <vector>

#include "tests/support/given_frames.h"

namespace calmframe::host {
namespace {

// Four frames of a camera that pans by 30 pixels, all at rest. Behind the third lie the two before
// it, to the left, and the last, to the right. `off`: how far the left third of each neighbour's
// tracks, which are deleted, lies from where it should.
SolvedClip Panned(const std::vector<double>& off) {
  SolvedClip clip;
  clip.source_width = clip.width = 400;
  clip.source_height = clip.height = 300;
  clip.frame_count = 4;
  clip.columns = clip.rows = 2;
  clip.slots = 30;
  GivenFrames& given = GivenFrames::In(clip);
  for (int f = 0; f < clip.frame_count; ++f) {
    for (const Point& corner : GridAtRest(clip)) given.vertices.push_back(corner);
    for (int s = 0; s < clip.slots; ++s) {
      const double x = 20 + s / 5 * 72, y = 90 + s % 5 * 30;
      given.tracks.push_back({x + 30 * (2 - f) + (x < 140 ? off[f] : 0), y});
      const bool deleted = x < 140;
      given.statuses.push_back(f == 0 ? (deleted ? -10 : 1) : (deleted ? -11 : 0));
    }
    if (f != 2) clip.neighbours.push_back({f, 2, {1, 0, 30.0 * (f - 2), 0, 1, 0, 0, 0, 1}});
  }
  return clip;
}

TEST(FilledPlaneTest, AWindowGrowsOverWhatGoesOnFromItsFrame) {
  struct Case {
    std::vector<double> off;
    int reach;
    double left;  // pixels to the left of the middle, less a step of 2 at most
  };
  constexpr double kRim = 4;
  // From the frame's edge, 199.5 off the middle.
  for (const Case& c : {Case{{0, 0, 0, 0}, 2, 259.5 - kRim}, Case{{0, 0, 0, 0}, 1, 229.5 - kRim},
                        Case{{12, 0, 0, 0}, 2, 229.5 - kRim},  // a tear of 8 and more counts
                        Case{{7, 7, 0, 0}, 2, 259.5 - kRim},
                        Case{{0, 12, 0, 0}, 2, 199.5 - kRim},  // it hides what is further away
                        Case{{0, 0, 0, 12}, 2, 259.5 - kRim}}) {
    const SolvedClip clip = Panned(c.off);
    const WarpedPlane plane(clip, Warps::solved);
    const FilledPlane filled(plane, {c.reach, kRim});
    const std::vector<HalfPlane> sides = filled.RegionAround(2, {0.95, 0, 0, 0});
    ASSERT_EQ(sides.size(), 4u);
    const double limits[] = {149.5 - kRim, 229.5 - kRim, 149.5 - kRim, c.left};
    for (int side = 0; side < 4; ++side) {
      EXPECT_LE(sides[side].limit, limits[side] + 1e-9) << side;
      EXPECT_GT(sides[side].limit, limits[side] - 2) << side;
    }
    // What is torn is not open. A window of 360 pixels, from 240 to the left of the middle on.
    EXPECT_NEAR(filled.UncoveredShare(2, {0.9, 0, -60, 0}), c.reach == 1 ? 14.0 / 360 : 0, 0.01);
  }
}

}  // namespace
}  // namespace calmframe::host
