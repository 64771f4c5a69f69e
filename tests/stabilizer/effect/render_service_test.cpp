#include <gtest/gtest.h>

#include <boost/make_shared.hpp>

#include "stabilization/warp/frame_map.h"
#include "stabilizer/effect/src/stabilizer_effect.h"
#include "tests/stabilizer/effect/render_service_fixture.h"

namespace kelp::effect {
namespace {

using marrow::stabilization::point2;

TEST_F(RenderServiceTest, SizesAndRectanglesOfBothPaths) {
  Solve();
  SetFraming(Framing::stabilize_only);
  ASSERT_EQ(test.Call(HX_CMD_PREPARE_FRAME), HX_ERR_NONE);
  EXPECT_EQ(test.host.out.width, 73);
  EXPECT_EQ(test.host.out.height, 53);
  EXPECT_EQ(test.host.out.origin_x, 4);
  EXPECT_EQ(test.host.out.origin_y, 2);
  ASSERT_EQ(test.Plan({0, 0, 64, 48}, 8), HX_ERR_NONE);
  ExpectRect(test.plan.full_rect, -4, -2, 69, 51);
  ExpectRect(test.plan.result_rect, 0, 0, 64, 48);
  ASSERT_EQ(test.Plan({10, 10, 100, 20}, 8), HX_ERR_NONE);
  ExpectRect(test.plan.result_rect, 10, 10, 69, 20);
  EXPECT_EQ(test.plan.may_exceed, 0);

  // Half size: bounds 36.5 x 26.5, so 37 x 27 on 32 x 24.
  test.host.in.downsample_x = test.host.in.downsample_y = {1, 2};
  ASSERT_EQ(test.Plan({0, 0, 32, 24}, 8), HX_ERR_NONE);
  ExpectRect(test.plan.full_rect, -2, -1, 35, 26);
  test.host.in.downsample_x = test.host.in.downsample_y = {1, 1};

  for (const Framing framing : {Framing::crop, Framing::crop_auto_scale}) {
    SetFraming(framing);
    ASSERT_EQ(test.Plan({10, 10, 20, 20}, 8), HX_ERR_NONE);
    ExpectRect(test.plan.full_rect, 0, 0, 64, 48);
    ExpectRect(test.plan.result_rect, 0, 0, 64, 48);
    EXPECT_EQ(test.plan.may_exceed, 1);
    ASSERT_EQ(test.Call(HX_CMD_PREPARE_FRAME), HX_ERR_NONE);
    EXPECT_EQ(test.host.out.width, 64);
    EXPECT_EQ(test.host.out.origin_x, 0);
  }
  // What can't be rendered stays as large as the layer.
  SetFraming(Framing::stabilize_only);
  test.layer.refusal = u"No.";
  ASSERT_EQ(test.Call(HX_CMD_PREPARE_FRAME), HX_ERR_NONE);
  EXPECT_EQ(test.host.out.width, 64);
}

TEST_F(RenderServiceTest, APlanOrdersItsFrameAndTheMarginWithinTheClip) {
  const std::vector<point2> still(10, point2{0, 0});
  test.layer.start = 5;
  test.Solved(ShiftingWarper(kWidth, kHeight, still), {});
  test.RenderCopy();
  using Orders = std::map<std::int32_t, double>;
  test.host.in.current_time = 4;
  ASSERT_EQ(test.Plan({0, 0, 64, 48}, 8), HX_ERR_NONE);
  EXPECT_EQ(test.orders, (Orders{{9, 4 / 25.0}}));
  // The layer was trimmed by two frames since: ids stay, times move.
  test.layer.start = 7;
  ASSERT_EQ(test.Plan({0, 0, 64, 48}, 8), HX_ERR_NONE);
  EXPECT_EQ(test.orders, (Orders{{11, 4 / 25.0}}));
  test.layer.start = 5;

  SetFraming(Framing::synthesize_edges);
  test.Set(kSynthesisInputRangeIndex, 0.1);  // 2.5 frames, so 3
  ASSERT_EQ(test.Plan({0, 0, 64, 48}, 8), HX_ERR_NONE);
  Orders around;
  for (int frame = 6; frame <= 12; ++frame) around[frame] = (frame - 5) / 25.0;
  EXPECT_EQ(test.orders, around);
  test.host.in.current_time = 9;
  ASSERT_EQ(test.Plan({0, 0, 64, 48}, 8), HX_ERR_NONE);
  EXPECT_EQ(test.orders.size(), 4u) << "nothing behind the last analysed frame, 14";
  EXPECT_EQ(test.orders.rbegin()->first, 14);

  test.layer.refusal = u"No.";
  test.host.in.current_time = 4;
  ASSERT_EQ(test.Plan({0, 0, 64, 48}, 8), HX_ERR_NONE);
  EXPECT_EQ(test.orders, (Orders{{9, 4 / 25.0}}));
}

// A pixel of the output shows the source half a pixel up and left of where its warp comes from.
TEST_F(RenderServiceTest, DrawsTheWarpAtEveryDepthOnBothPaths) {
  Solve();
  SetFraming(Framing::stabilize_only);
  for (const std::int32_t depth : {8, 16, 32}) {
    const double tolerance = depth == 8 ? 0.4 : 2e-3;
    UseDepth(depth);
    for (const std::int32_t frame : {0, 1}) {
      test.host.in.current_time = frame;
      ASSERT_EQ(test.Plan({-100, -100, 100, 100}, depth), HX_ERR_NONE);
      TestWorld planned(73, 53, depth, -4, -2);
      ASSERT_EQ(test.RenderPlan(planned, depth), HX_ERR_NONE);
      ExpectColumn(planned, 30, 20, 30 - 10 * frame - 0.5, tolerance);
      EXPECT_NEAR(100 * planned.At(30, 20, 2), 20 - 6 * frame - 0.5, tolerance);
      EXPECT_EQ(planned.At(72 * (1 - frame), 20, 0), 0) << "outside of the frame";
      EXPECT_EQ(test.polygon_frame, frame);

      // The part (10, 10) to (40, 30) of the layer is the same picture from (14, 12) on.
      TestWorld part(30, 20, depth, 10, 10);
      ASSERT_EQ(test.RenderPlan(part, depth), HX_ERR_NONE);
      ExpectColumn(part, 16, 8, 30 - 10 * frame - 0.5, tolerance);

      if (depth == 32) continue;
      TestWorld direct(73, 53, depth, -4, -2);
      ASSERT_EQ(RenderDirect(direct), HX_ERR_NONE);
      EXPECT_TRUE(direct == planned);
    }
  }
  EXPECT_EQ(test.host.Count("utility 3"), 4);
  EXPECT_EQ(test.host.Count("utility 7"), 4);
}

// Five frames whose union is (-6, -4) to (75, 50): a plane of 81 x 54, the layer at (8, 3) of it.
// All show the same source: what a neighbour fills shows the source's column for its own shift.
TEST_F(RenderServiceTest, EdgesAreFilledFromTheFramesAround) {
  test.Solved(ShiftingWarper(kWidth, kHeight, {{0, 0}, {6, 2}, {-6, 3}, {12, -4}, {3, 0}}, 2), {});
  test.RenderCopy();
  SetFraming(Framing::synthesize_edges);
  test.Set(kSynthesisInputRangeIndex, 0.08);  // 2 frames
  test.Set(kSynthesisEdgeFeatherIndex, 0);
  for (const std::int32_t depth : {8, 16, 32}) {
    UseDepth(depth);
    const double tolerance = depth == 8 ? 0.4 : 2e-3;
    test.host.in.current_time = 2;
    ASSERT_EQ(test.Plan({-100, -100, 100, 100}, depth), HX_ERR_NONE);
    ASSERT_EQ(test.orders.size(), 5u);
    TestWorld planned(81, 54, depth, -8, -3);
    ASSERT_EQ(test.RenderPlan(planned, depth), HX_ERR_NONE);
    // Plane x - 6: column 30 of the plane shows source 30 - 6 + 6 of frame 2, less half a pixel.
    ExpectColumn(planned, 30, 20, 29.5, tolerance);
    // Right of its 57 (and the border's two pixels) frame 3 comes first.
    ExpectColumn(planned, 66, 20, 66 - 6 - 12 - 0.5, tolerance);
    ExpectColumn(planned, 79, 20, 79 - 6 - 12 - 0.5, tolerance);
    // Above its 3, too: frame 3 begins at -4.
    EXPECT_NEAR(100 * planned.At(30, 3, 2), 3 - 0.5, tolerance);
    EXPECT_NEAR(planned.At(0, 1, 0), 0, 0) << "no frame reaches there";
    if (depth < 32) {
      TestWorld direct(81, 54, depth, -8, -3);
      ASSERT_EQ(RenderDirect(direct), HX_ERR_NONE);
      EXPECT_TRUE(direct == planned);
    }
    // The first and the last frame have neighbours on one side.
    for (const std::int32_t frame : {0, 4}) {
      test.host.in.current_time = frame;
      ASSERT_EQ(test.Plan({-100, -100, 100, 100}, depth), HX_ERR_NONE);
      ASSERT_EQ(test.orders.size(), 3u);
      TestWorld end(81, 54, depth, -8, -3);
      ASSERT_EQ(test.RenderPlan(end, depth), HX_ERR_NONE);
      const int shift = frame == 0 ? 6 : 12;  // of frames 1 and 3
      ExpectColumn(end, 73, 20, 73 - 6 - shift - 0.5, tolerance);
    }
  }
  EXPECT_EQ(test.layers_out, 0);
}

TEST_F(RenderServiceTest, FeatherAndCropsFollowTheHorizontalScaleAndTheBoostIsItsDefault) {
  test.Solved(ShiftingWarper(kWidth, kHeight, {{0, 0}}), {});
  test.RenderCopy();
  SetFraming(Framing::synthesize_edges);
  for (int y = 0; y < kHeight; ++y) {
    for (int x = 0; x < kWidth; ++x) source_.Set(x, y, 0.5, 0.5);
  }
  test.Set(kSynthesisEdgeFeatherIndex, 0);
  test.Set(kSynthesisTopIndex, 10);
  test.Set(kSynthesisLeftIndex, 3);
  TestWorld whole(63, 47, 8, 0, 0);
  ASSERT_EQ(RenderDirect(whole), HX_ERR_NONE);
  EXPECT_EQ(whole.At(30, 9, 0), 0);
  EXPECT_EQ(whole.At(30, 10, 0), 1) << "half of an alpha, five times";
  EXPECT_EQ(whole.At(2, 20, 0), 0);
  EXPECT_EQ(whole.At(3, 20, 0), 1);
  // Half the columns, all rows.
  test.host.in.downsample_x = {1, 2};
  TestWorld half(32, 47, 8, 0, 0);
  ASSERT_EQ(RenderDirect(half), HX_ERR_NONE);
  EXPECT_EQ(half.At(20, 4, 0), 0);
  EXPECT_EQ(half.At(20, 5, 0), 1);
  EXPECT_EQ(half.At(1, 20, 0), 0);
  EXPECT_EQ(half.At(2, 20, 0), 1);
  // Feathered: at the outermost pixel 5 times the middle of 2 / 11^2 and 8 / 11^2.
  test.host.in.downsample_x = {1, 1};
  test.Set(kSynthesisTopIndex, 0);
  test.Set(kSynthesisLeftIndex, 0);
  test.Set(kSynthesisEdgeFeatherIndex, 10);
  ASSERT_EQ(RenderDirect(whole), HX_ERR_NONE);
  EXPECT_NEAR(whole.At(1, 20, 0), 5 * 5 / 121.0, 5 / 255.0);
}

TEST_F(RenderServiceTest, NoSizeLeavesTheOutputClear) {
  Solve();
  SetFraming(Framing::stabilize_only);
  test.Set(kAdditionalScaleIndex, 0);
  TestWorld output(73, 53, 8, -4, -2);
  ASSERT_EQ(RenderDirect(output), HX_ERR_NONE);
  for (const int x : {0, 36, 72}) EXPECT_EQ(output.At(x, 26, 0), 0);
  EXPECT_EQ(test.polygon_frame, -1);
}

TEST_F(RenderServiceTest, WhatIsNotFinishedIsTheInputWithABanner) {
  Solve();
  test.state()->shared->contents.needs_solve = true;
  TestWorld output(kWidth, kHeight, 8);
  ASSERT_EQ(RenderDirect(output), HX_ERR_NONE);
  ExpectColumn(output, 40, 46, 40, 0.3);
  EXPECT_GT(std::abs(100 * output.At(1, 12, 1) - 1), 20) << "the band";
  test.Set(kHideWarningBannerIndex, 1);
  ASSERT_EQ(RenderDirect(output), HX_ERR_NONE);
  for (int y = 0; y < kHeight; ++y) ExpectColumn(output, 1, y, 1, 0.3);

  // Finished, but nothing to draw with.
  test.state()->shared->contents.needs_solve = false;
  test.state()->shared->contents.warper.reset();
  test.Set(kHideWarningBannerIndex, 0);
  ASSERT_EQ(RenderDirect(output), HX_ERR_NONE);
  for (int y = 0; y < kHeight; ++y) ExpectColumn(output, 1, y, 1, 0.3);
}

TEST_F(RenderServiceTest, AChangedRangeShowsTheStabilizedFrameWithABanner) {
  Solve();
  SetFraming(Framing::crop);
  test.host.in.current_time = 1;
  test.layer.count = 5;
  TestWorld output(kWidth, kHeight, 8), without(kWidth, kHeight, 8);
  ASSERT_EQ(RenderDirect(output), HX_ERR_NONE);
  test.Set(kHideWarningBannerIndex, 1);
  ASSERT_EQ(RenderDirect(without), HX_ERR_NONE);
  EXPECT_FALSE(output == without);
  test.layer.count = 2;
  ASSERT_EQ(RenderDirect(output), HX_ERR_NONE);
  EXPECT_TRUE(output == without) << "ready, without a banner";
}

TEST_F(RenderServiceTest, AOneByOneSourceIsPassedOn) {
  test.host.in.width = test.host.in.height = 1;
  ASSERT_EQ(test.Call(HX_CMD_RESTORE_INSTANCE), HX_ERR_NONE);
  ASSERT_EQ(test.Plan({3, 4, 9, 10}, 8), HX_ERR_NONE);
  ExpectRect(test.plan.result_rect, 3, 4, 9, 10);
  ASSERT_EQ(test.orders.size(), 1u);
  TestWorld output(1, 1, 8);
  ASSERT_EQ(test.RenderPlan(output, 8), HX_ERR_NONE);
  EXPECT_EQ(output.At(0, 0, 0), 1);
  EXPECT_EQ(output.At(0, 0, 3), 64 / 255.0);
  ASSERT_EQ(RenderDirect(output), HX_ERR_NONE);
  EXPECT_EQ(test.state(), nullptr);
}

TEST_F(RenderServiceTest, AFailingRenderGivesBackAllThatItTook) {
  test.Solved(ShiftingWarper(kWidth, kHeight, {{0, 0}, {10, 6}}, 1), {});
  test.RenderCopy();
  SetFraming(Framing::synthesize_edges);
  // A neighbour that a plan ordered and the host then has not.
  ASSERT_EQ(test.Plan({-100, -100, 100, 100}, 8), HX_ERR_NONE);
  test.refused_layer = 1;
  TestWorld refused(73, 53, 8, -4, -2);
  EXPECT_EQ(test.RenderPlan(refused, 8), FakeHost::kFault);
  EXPECT_EQ(test.layers_out, 0);
  int transfers = 0;
  for (int n = 1; n < 500; ++n) {
    test.host.ForgetOperations();
    test.host.FailOperation(n);
    TestWorld output(73, 53, 8, -4, -2);
    HX_Err code = test.Call(HX_CMD_PREPARE_FRAME);
    if (code == HX_ERR_NONE) code = test.Call(HX_CMD_RENDER_FRAME, output.get());
    const auto& operations = test.host.operations();
    if (operations.size() < static_cast<std::size_t>(n)) {
      test.host.FailOperation(0);
      EXPECT_GE(transfers, 1);
      return;
    }
    if (operations[static_cast<std::size_t>(n) - 1].name == "transfer") {
      EXPECT_EQ(code, FakeHost::kFault);
      ++transfers;
    }
    // The render's end is the one call whose failure is nobody's business.
    if (operations[static_cast<std::size_t>(n) - 1].name == "utility 7") {
      EXPECT_EQ(code, HX_ERR_NONE);
    } else if (operations[static_cast<std::size_t>(n) - 1].name == "utility 3") {
      EXPECT_EQ(code, FakeHost::kFault);
      EXPECT_EQ(test.host.Count("utility 7"), 0);
    }
  }
  FAIL() << "no end of host calls";
}

}  // namespace
}  // namespace kelp::effect
