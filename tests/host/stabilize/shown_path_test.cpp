#include "host/stabilize/shown_path.h"

#include <gtest/gtest.h>

#include <cmath>
#include <functional>
#include <vector>

#include "host/stabilize/warped_plane.h"
#include "tests/support/given_frames.h"

namespace calmframe::host {
namespace {

// One frame of 401 x 301 square pixels, without tracks, whose warp takes places about the middle.
SolvedClip Warped(const std::function<Point(Point)>& warp, int source_width = 401) {
  SolvedClip clip;
  clip.source_width = source_width;
  clip.width = 401;
  clip.source_height = clip.height = 301;
  clip.frame_count = clip.slots = 1;
  GivenFrames& given = GivenFrames::In(clip);
  given.tracks = {Point{}};
  given.statuses = {-1};
  clip.columns = 5;
  clip.rows = 4;
  for (int r = 0; r < clip.rows; ++r) {
    for (int c = 0; c < clip.columns; ++c) {
      const Point at = warp({100.0 * c - 200, 100.0 * r - 150});
      given.vertices.push_back({at.x + 200, at.y + 150});
    }
  }
  return clip;
}

Point Enlarged(Point p) {
  return {1.25 * p.x + 10, 1.25 * p.y - 6};
}

Point Bent(Point p) {
  return {1.1 * p.x + 0.03 * p.y + 12 * std::sin(p.y / 90), p.y - 0.04 * p.x + 0.0002 * p.x * p.x};
}

TEST(ShownPathTest, WindowsLieInTheSourceAndKnowHowFarTheyMayGo) {
  struct Case {
    const char* what;
    SolvedClip clip;
    Warps warps;
    Similarity window;  // about the middle
    WindowPlace place;
    double zoom;
  };
  const Case cases[] = {
      // 320 x 240 of the source are seen.
      {"a larger frame",
       Warped(Enlarged),
       Warps::solved,
       {},
       {{-8, 4.8}, {-40, -30}, {40, 30}},
       1.25},
      {"pixels twice as wide",
       Warped(Enlarged, 201),
       Warps::solved,
       {},
       {{-8, 4.8}, {-40, -30}, {40, 30}},
       1.25},
      // Half of it is 0.4 (200 * 0.8 + 150 * 0.6) wide, and 0.4 (200 * 0.6 + 150 * 0.8) high.
      {"a turned window",
       Warped(Enlarged),
       Warps::none,
       {0.32, 0.24, 30, -20},
       {{30, -20}, {-100, -54}, {100, 54}},
       2.5},
      {"a window beyond the picture",
       Warped(Enlarged),
       Warps::none,
       {1.1, 0, 0, 0},
       {{0, 0}, {20, 15}, {-20, -15}},
       1 / 1.1}};
  for (const Case& c : cases) {
    const Similarity& w = c.window;
    const Point shift = w({-200, -150});
    const ShownPath path = PathShown(c.clip, c.warps, {{w.a, w.b, shift.x + 200, shift.y + 150}});
    ASSERT_EQ(path.windows.size(), 1u);
    const WindowPlace& place = path.windows[0];
    EXPECT_NEAR(path.output.zooms.at(0), c.zoom, 1e-9) << c.what;
    for (const auto& [told, right] : {std::pair{place.centre, c.place.centre},
                                      {place.least, c.place.least},
                                      {place.most, c.place.most}}) {
      EXPECT_NEAR(told.x, right.x, 2e-3) << c.what;
      EXPECT_NEAR(told.y, right.y, 2e-3) << c.what;
    }
  }
}

TEST(WarpedPlaneTest, FindsTheWayBackThroughABentFrameAndBesideIt) {
  const SolvedClip clip = Warped(Bent);
  const WarpedPlane plane(clip, Warps::solved);
  for (const Point at : {Point{200, 150}, {3, 297}, {399, 1}, {-30, 80}, {130, 330}, {287, 44}}) {
    const Point back = plane.Frame(0).SourceAt(plane.Frame(0).At(at));
    EXPECT_NEAR(back.x, at.x, 2e-3);
    EXPECT_NEAR(back.y, at.y, 2e-3);
  }
  const SolvedClip folded = Warped([](Point) { return Point{}; });
  EXPECT_TRUE(std::isnan(WarpedPlane(folded, Warps::solved).Frame(0).SourceAt({3, 4}).x));
}

}  // namespace
}  // namespace calmframe::host
