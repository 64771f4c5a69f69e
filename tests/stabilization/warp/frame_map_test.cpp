#include "stabilization/warp/frame_map.h"

#include <gtest/gtest.h>

#include "tests/stabilization/warper_clips.h"

namespace marrow::stabilization {
namespace {

// A camera that pans by 3 px a frame and is to stand still.
boost::shared_ptr<stabilizer_global> panning(int tracks, int frames) {
  auto global = boost::make_shared<stabilizer_global>(empty_clip(tracks, frames));
  std::mt19937 random(4);
  std::uniform_real_distribution<double> unit(0, 1);
  for (int s = 0; s < tracks; ++s) {
    const point2 p = {100 + unit(random) * 1500, 100 + unit(random) * 800};
    add_track(
        *global, s, 0, frames,
        [&](int f) {
          return point2{p.x + 3 * f, p.y};
        },
        [&](int f, point2 q) {
          return point2{q.x - 3 * f, q.y};
        });
  }
  return global;
}

TEST(FrameMapTest, APairForEveryNeighbourWithinTheRadius) {
  auto warper = driven(panning(20, 9), 2);
  warper->makeFrameMap(2);
  const MtoNMap& map = *warper->frameMap();
  EXPECT_EQ(map.entries().size(), 2u * (8 + 7));
  matrix3 m;
  EXPECT_FALSE(map.lookup(3, 3, m));
  EXPECT_FALSE(map.lookup(1, 4, m));
  EXPECT_FALSE(map.lookup(0, -1, m));
  for (const auto& [pair, motion] : map.entries()) {
    EXPECT_NEAR(motion[2], -3 * pair.first, 2e-3);
    EXPECT_NEAR(motion[0], 1, 1e-5);
  }
  warper->makeFrameMap(0);
  EXPECT_TRUE(warper->frameMap()->entries().empty());
}

TEST(FrameMapTest, ProgressMayEndItAndLeavesTheMapAsItWas) {
  struct cancelled {};
  auto warper = driven(panning(20, 9), 2);
  warper->makeFrameMap(1);
  const auto before = warper->frameMap();
  int left = 4;
  const progress_functor progress = [&] {
    if (left-- == 0) throw cancelled();
  };
  EXPECT_THROW(warper->makeFrameMap(2, progress), cancelled);
  EXPECT_EQ(warper->frameMap(), before);
}

TEST(FrameMapTest, SixSharedTracksMakeAnEntryAndFiveDoNot) {
  for (const int shared : {5, 6}) {
    auto global = panning(shared + 8, 6);
    for (int s = shared; s < shared + 8; ++s) {  // alive in frames 3 to 5 alone
      global->trajectories[s].first = 3;
      for (int f = 0; f < 3; ++f) global->output_at(f, s).status = -1;
    }
    const auto warper = driven(global, 2);
    matrix3 m;
    EXPECT_EQ(warper->alignFrameMtoN(1, 4, m), shared == 6);
    EXPECT_TRUE(warper->alignFrameMtoN(5, 4, m));
    if (shared == 6) {
      ASSERT_TRUE(warper->alignFrameMtoN(1, 4, m));
      EXPECT_NEAR(m[2], -3, 2e-3);
    }
  }
}

TEST(FrameMapTest, TheModelOfTheTargetFrameRules) {
  const matrix3 turned = similarity_matrix(1.03, .02, 12, 7);
  const auto global = clip_of(40, 3, [&](int, point2 p) { return transform(turned, p); });
  matrix3 m;
  ASSERT_TRUE(driven(global, 1.5)->alignFrameMtoN(0, 1, m));
  EXPECT_EQ(m[0], 1);
  EXPECT_EQ(m[1], 0);
  ASSERT_TRUE(driven(global, 2)->alignFrameMtoN(0, 1, m));
  for (const point2 p : {point2{0, 0}, point2{1919, 1079}}) {
    EXPECT_NEAR(transform(m, p).x, transform(turned, p).x, 2e-3);
    EXPECT_NEAR(transform(m, p).y, transform(turned, p).y, 2e-3);
  }
}

TEST(FrameMapTest, AStrongElationFallsBackToTheSimilarity) {
  // Tracks near the origin, so that homography and similarity agree but for the bottom row.
  for (const double elation : {1.8e-4, 2.2e-4}) {
    const matrix3 tilted = {1, 0, 0, 0, 1, 0, elation, 0, 1};
    auto global = boost::make_shared<stabilizer_global>(empty_clip(100, 2));
    for (int s = 0; s < 100; ++s) {
      add_track(
          *global, s, 0, 2,
          [&](int) {
            return point2{30.0 * (s % 10), 30.0 * (s / 10)};
          },
          [&](int, point2 p) { return transform(tilted, p); });
    }
    matrix3 m;
    ASSERT_TRUE(driven(global, 3)->alignFrameMtoN(0, 1, m));
    if (elation < 2e-4) {
      EXPECT_NEAR(m[6], elation, 2e-6);
    } else {
      EXPECT_EQ(m[6], 0);
    }
  }
}

TEST(FrameMapTest, NeedsADrivenWarperAndGivesGridsOfNeighbours) {
  auto warper = built(panning(20, 4), 2);
  matrix3 m;
  std::vector<double> from_tracks, from_map;
  EXPECT_THROW(warper->alignFrameMtoN(0, 1, m), std::runtime_error);
  EXPECT_FALSE(warper->warpedGridOfFrame(0, 1, from_map));
  warper->drive([] {});
  EXPECT_FALSE(warper->alignFrameMtoN(3, 4, m));
  ASSERT_TRUE(warper->warpedGridOfFrame(2, 1, from_tracks));
  warper->makeFrameMap(1);
  ASSERT_TRUE(warper->warpedGridOfFrame(2, 1, from_map));
  EXPECT_EQ(from_tracks, from_map);
  const std::size_t last = 2 * (36 * 64 - 1);
  EXPECT_NEAR(from_map[last], 1919 - 6, 2e-2);
  EXPECT_NEAR(from_map[last + 1], 1079, 2e-2);
  EXPECT_FALSE(warper->warpedGridOfFrame(3, 1, from_map));
}

}  // namespace
}  // namespace marrow::stabilization
