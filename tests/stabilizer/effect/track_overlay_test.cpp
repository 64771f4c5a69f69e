#include <gtest/gtest.h>

#include "tests/stabilizer/effect/render_service_fixture.h"

namespace kelp::effect {
namespace {

constexpr double kDot = 3.14 * 5.3 * 5.3;  // pixels that a dot touches

// A solved clip of two frames whose one track is at (20, 20) and (24, 23), shown with its tracks.
class TrackOverlayTest : public RenderServiceTest {
 protected:
  TrackOverlayTest() {
    test.Solved(ShiftingWarper(kWidth, kHeight, {{0, 0}, {10, 6}}), {});
    test.Set(kShowTracksIndex, 1);
    SetFraming(Framing::stabilize_only);
    test.RenderCopy();
  }
  HX_Err RenderDirect(TestWorld& output) {
    EXPECT_EQ(test.Call(HX_CMD_PREPARE_FRAME), HX_ERR_NONE);
    EXPECT_EQ(test.host.out.width, kWidth) << "the input's own size";
    return test.Call(HX_CMD_RENDER_FRAME, output.get());
  }
  // Pixels that are not the source's.
  int Changed(const TestWorld& world) const {
    int changed = 0;
    for (int y = 0; y < kHeight; ++y) {
      for (int x = 0; x < kWidth; ++x) {
        changed += std::abs(world.At(x, y, 1) - source_.At(x, y, 1)) > 0.01;
      }
    }
    return changed;
  }
};

TEST_F(TrackOverlayTest, BothPathsAndPartsShowTheInputWithItsTracksAtEveryDepth) {
  for (const std::int32_t depth : {8, 16, 32}) {
    UseDepth(depth);
    ASSERT_EQ(test.Plan({0, 0, kWidth, kHeight}, depth), HX_ERR_NONE);
    EXPECT_EQ(test.orders.size(), 1u);
    TestWorld planned(kWidth, kHeight, depth), part(20, 14, depth, 15, 12);
    ASSERT_EQ(test.RenderPlan(planned, depth), HX_ERR_NONE);
    EXPECT_NEAR(Changed(planned), kDot, 8) << "one dot, nothing stabilized";
    ASSERT_EQ(test.RenderPlan(part, depth), HX_ERR_NONE);
    for (int y = 0; y < 14; ++y) {
      for (int x = 0; x < 20; ++x) {
        for (int c = 0; c < 4; ++c) {
          ASSERT_EQ(part.At(x, y, c), planned.At(x + 15, y + 12, c)) << x << " " << y;
        }
      }
    }
    if (depth == 32) continue;
    TestWorld direct(kWidth, kHeight, depth);
    ASSERT_EQ(RenderDirect(direct), HX_ERR_NONE);
    EXPECT_TRUE(direct == planned);
  }
}

TEST_F(TrackOverlayTest, ShownWhileADeletionIsSolvedAndNotOutsideTheRange) {
  TestWorld output(kWidth, kHeight, 8);
  auto& contents = test.state()->shared->contents;
  contents.needs_solve = contents.subsequent_solve = true;
  ASSERT_EQ(RenderDirect(output), HX_ERR_NONE);
  EXPECT_NEAR(Changed(output), kDot, 8) << "the tracks, and no banner over them";
  contents.subsequent_solve = false;
  test.Set(kHideWarningBannerIndex, 1);
  ASSERT_EQ(RenderDirect(output), HX_ERR_NONE);
  EXPECT_EQ(Changed(output), 0);
  contents.needs_solve = false;
  test.layer.start = 2;  // the clip's third frame
  ASSERT_EQ(RenderDirect(output), HX_ERR_NONE);
  EXPECT_EQ(Changed(output), 0);
  test.layer.start = 0;
  ASSERT_EQ(RenderDirect(output), HX_ERR_NONE);
  EXPECT_NEAR(Changed(output), kDot, 8);
}

}  // namespace
}  // namespace kelp::effect
