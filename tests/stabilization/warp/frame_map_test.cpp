#include "stabilization/warp/frame_map.h"

#include <gtest/gtest.h>

#include "tests/stabilization/clips.h"

namespace marrow::stabilization {
namespace {

// A camera that pans by 3 px a frame and is to stand still.
boost::shared_ptr<stabilizer_global> panning(int tracks, int frames) {
  auto global = still_clip(tracks, frames, under(identity3));
  for (int f = 0; f < frames; ++f) {
    for (int s = 0; s < tracks; ++s) global->input[f * tracks + s].x += 3.0f * f;
  }
  return global;
}

TEST(FrameMapTest, APairForEveryNeighbourWithinTheRadiusOnceDriven) {
  auto warper = built(panning(20, 9), 2);
  matrix3 m;
  std::vector<double> from_tracks, from_map;
  EXPECT_THROW(warper->alignFrameMtoN(0, 1, m), std::runtime_error);
  EXPECT_FALSE(warper->warpedGridOfFrame(0, 1, from_map));
  warper->drive(kNoProgress);
  EXPECT_FALSE(warper->alignFrameMtoN(8, 9, m));
  ASSERT_TRUE(warper->warpedGridOfFrame(2, 1, from_tracks));

  warper->makeFrameMap(2);
  const MtoNMap& map = *warper->frameMap();
  EXPECT_EQ(map.entries().size(), 2u * (8 + 7));
  for (const auto& [pair, motion] : map.entries()) {
    EXPECT_NEAR(motion[2], -3 * pair.first, 2e-3);
    EXPECT_NEAR(motion[0], 1, 1e-5);
  }
  EXPECT_FALSE(warper->warpedGridOfFrame(4, 1, from_map));
  ASSERT_TRUE(warper->warpedGridOfFrame(2, 1, from_map));
  EXPECT_EQ(from_tracks, from_map);
  expect_point_near({from_map[4606], from_map[4607]}, {1919 - 6, 1079}, 2e-2);
  EXPECT_THROW(warper->makeFrameMap(1, [] { throw 5; }), int);
  EXPECT_EQ(warper->frameMap().get(), &map) << "stays as it was";
}

// A track counts on the frames from its first to before its last.
TEST(FrameMapTest, SixSharedTracksMakeAnEntryAndFiveDoNot) {
  for (const int shared : {5, 6}) {
    auto global = panning(shared + 16, 6);
    for (int s = shared; s < shared + 16; ++s) {  // alive in frames 0 to 2, or 3 to 5 alone
      Trajectory& track = global->trajectories[s];
      (s < shared + 8 ? track.last : track.first) = 3;
    }
    const auto warper = driven(global, 2);
    const struct {
      int m, n;
      bool found;
    } pairs[] = {{2, 4, shared == 6}, {3, 2, shared == 6}, {3, 4, true}, {2, 1, true}};
    for (const auto& e : pairs) {
      matrix3 motion;
      ASSERT_EQ(warper->alignFrameMtoN(e.m, e.n, motion), e.found) << e.m << " " << e.n;
      EXPECT_TRUE(!e.found || std::fabs(motion[2] + 3 * e.m) < 2e-3);
    }
  }
}

// Scores rise by 1/15 a frame from frame 0, which has no tracks: 1.67 on frame 10, 2 on frame 16.
TEST(FrameMapTest, TheModelOfTheTargetFrameRules) {
  const matrix3 turned = similarity_matrix(1.03, .02, 12, 7);
  auto global = still_clip(40, 20, under(turned));
  for (Trajectory& t : global->trajectories) t.first = 1;
  const auto warper = driven(global, 2);
  matrix3 m;
  ASSERT_TRUE(warper->alignFrameMtoN(16, 10, m));
  EXPECT_EQ(m[0], 1);
  EXPECT_EQ(m[1], 0);
  ASSERT_TRUE(warper->alignFrameMtoN(10, 16, m));
  for (const point2 p : {point2{0, 0}, point2{1919, 1079}}) {
    expect_point_near(transform(m, p), transform(turned, p), 2e-3);
  }
}

// 8 tracks of weight 0.06 want to move by 10 pixels and 12 of weight 0.03 to stay, so frame 5 moves
// by 4.8 / 0.84: also for frame 1, which shares the 8 with it.
TEST(FrameMapTest, PointsGoWhereTheStoredWarpPutsThem) {
  const auto global = still_clip(20, 6, under(identity3));
  for (int s = 8; s < 20; ++s) global->trajectories[s].first = 3;
  for (int f = 0; f < 6; ++f) {
    for (int s = 0; s < 8; ++s) global->output_at(f, s).x += 10;
  }
  matrix3 m;
  ASSERT_TRUE(driven(global, 1)->alignFrameMtoN(1, 5, m));
  EXPECT_NEAR(m[2], 4.8 / 0.84, 2e-3);
}

// Corners about the frame's middle (960, 540), stretched by a along x and pressed by a along y: the
// best similarity is a shift by (960 a, -540 a), so the entries of the two models differ by 1502 a,
// of which 50 are let through.
TEST(FrameMapTest, AHomographyFarFromTheSimilarityFallsBackToIt) {
  for (const double off : {49.0, 51.0}) {
    const double a = off / 1502;
    const auto global = still_clip(8, 2, under({1 + a, 0, 0, 0, 1 - a, 0, 0, 0, 1}), on_rings);
    // Of a frame's own model it decides too.
    EXPECT_EQ(built(global, 3)->modelScore(1), off < 50 ? 3 : 2);
    const auto warper = built(global, 3, {}, {}, 1e9f);
    warper->drive(kNoProgress);
    matrix3 m;
    ASSERT_TRUE(warper->alignFrameMtoN(0, 1, m));
    EXPECT_NEAR(m[0], off < 50 ? 1 + a : 1, 1e-4);
    EXPECT_NEAR(m[4], off < 50 ? 1 - a : 1, 1e-4);
  }
}

TEST(FrameMapTest, AStrongElationFallsBackToTheSimilarity) {
  // Tracks near the origin, so that homography and similarity agree but for the bottom row.
  for (const double elation : {1.8e-4, 2.2e-4}) {
    const auto near_origin = [](std::size_t s) { return point2{30.0 * (s % 10), 30.0 * (s / 10)}; };
    const auto global = still_clip(100, 2, under({1, 0, 0, 0, 1, 0, elation, 0, 1}), near_origin);
    matrix3 m;
    ASSERT_TRUE(driven(global, 3)->alignFrameMtoN(0, 1, m));
    EXPECT_NEAR(m[6], elation < 2e-4 ? elation : 0, 2e-6);
  }
}

}  // namespace
}  // namespace marrow::stabilization
