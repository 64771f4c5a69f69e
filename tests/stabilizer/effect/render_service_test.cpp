#include "tests/stabilizer/effect/shifted_clip.h"

// Renders of warps that the test knows. That what is not ready is the input below a banner, and
// what a layer of one pixel shows, is asked of the plug-in in tests/contract.
namespace calmframe::host {
namespace {

using RenderServiceTest = ShiftedClipTest;
using Rect = std::vector<int>;

// The second frame is moved by (10, 6): the outlines' union is (0, 0) to (73, 53), so a plane of
// 73 x 53 whose surplus of 9 x 5 puts the layer at trunc(4.5), trunc(2.5) = (4, 2) of the output.
const std::vector<marrow::stabilization::point2> kTwoFrames = {{0, 0}, {10, 6}};

bool IsClear(const WorldBuffer& pixels) {
  const HX_Rect rect = pixels.rect();
  for (int y = rect.top; y < rect.bottom; ++y) {
    for (int x = rect.left; x < rect.right; ++x) {
      if (ChannelAt(pixels, x, y, 0) != 0) return false;
    }
  }
  return true;
}

TEST_F(RenderServiceTest, SizesAndRectanglesOfBothPaths) {
  Solve(kTwoFrames, {{kFraming, 3}});
  const auto expect = [&](const RenderRequest& request, const Rect& full, const Rect& drawn) {
    const RenderedFrame planned = hosted().Render(request);
    const RenderedFrame direct = hosted().Render(request, Path::direct);
    ASSERT_TRUE(planned.pixels && direct.pixels);
    EXPECT_EQ(Sides(planned.full_rect), full);
    EXPECT_EQ(Sides(direct.full_rect), full);
    EXPECT_EQ(Sides(planned.pixels->rect()), drawn);
  };
  const RenderRequest part{0, 8, {1, 1}, HX_Rect{10, 10, 100, 20}};
  expect(part, {0, 0, 64, 48}, {0, 0, 64, 48});  // what is cropped comes whole
  hosted().Set(kFraming, 1);
  expect({0}, {-4, -2, 69, 51}, {0, 0, 64, 48});
  expect(part, {-4, -2, 69, 51}, {10, 10, 69, 20});
  // Bounds of 36.5 x 26.5, so 37 x 27 on 32 x 24.
  expect({0, 8, {1, 2}}, {-2, -1, 35, 26}, {0, 0, 32, 24});
  hosted().Refuse("No.");
  expect({0}, {0, 0, 64, 48}, {0, 0, 64, 48});
  hosted().Refuse("");
}

TEST_F(RenderServiceTest, APlanOrdersItsFrameAndTheMarginWithinTheClip) {
  Solve(Shifts(10), {{kFraming, 4}, {kSynthesisInputRange, 0.1}}, 3);  // 2.5 frames, so 3
  EXPECT_EQ(OrdersOf(4), 7u);
  EXPECT_EQ(OrdersOf(8), 5u);
  hosted().Place(2, 8);  // frames 0 and 1 were analysed, but don't stand on the layer any more
  EXPECT_EQ(OrdersOf(2), 7u);
  EXPECT_NEAR(ChannelAt(*DrawBoth(Whole(2)), 30, 20, 3), 4 / 16.0, 0.003) << "times have moved";
  hosted().Set(kFraming, 1);
  EXPECT_EQ(OrdersOf(4), 1u);
  hosted().Refuse("No.");
  EXPECT_EQ(OrdersOf(4), 1u);
  hosted().Refuse("");
}

TEST_F(RenderServiceTest, ALayerThatBeginsBeforeItsMediaShowsEachFrameThroughItsOwnWarp) {
  Solve({{0, 0}, {2, 2}, {10, 6}, {0, 0}}, {{kFraming, 1}});
  hosted().Place(-1, 5);
  const auto third = DrawBoth(Whole(3));  // frame 2 of the source
  ExpectShown(*third, 26, 18, 30 - 10 - 0.5, 20 - 6 - 0.5);
}

// A pixel of the output shows the source half a pixel up and left of where its warp comes from.
TEST_F(RenderServiceTest, DrawsTheWarpAtEveryDepthOnBothPaths) {
  Solve(kTwoFrames, {{kFraming, 1}});
  for (const int depth : {8, 16, 32}) {
    for (const int frame : {0, 1}) {
      const double column = 30 - 10 * frame - 0.5, row = 20 - 6 * frame - 0.5;
      const auto whole = DrawBoth(Whole(frame, depth));
      EXPECT_EQ(Sides(whole->rect()), (Rect{-4, -2, 69, 51}));
      ExpectShown(*whole, 26, 18, column, row);
      EXPECT_EQ(ChannelAt(*whole, frame ? -4 : 68, 18, 0), 0) << "outside of the frame";
      if (depth == 8) {  // a renderer that has planned nothing
        const RenderedFrame fresh = hosted().effect().MakeRenderer()->Direct(Whole(frame));
        EXPECT_TRUE(fresh.pixels && Same(*whole, *fresh.pixels));
      }
      ExpectShown(*DrawBoth({frame, depth, {1, 1}, HX_Rect{10, 10, 40, 30}}), 26, 18, column, row);
      // The outline, in the output's pixels.
      const std::vector<float> outline = hosted().effect().shared()->PolygonOf(frame);
      ASSERT_GE(outline.size(), 8u);
      for (const int axis : {0, 1}) {
        double least = 1e9, most = -1e9;
        for (std::size_t i = axis; i < outline.size(); i += 2) {
          least = std::min<double>(least, outline[i]);
          most = std::max<double>(most, outline[i]);
        }
        EXPECT_NEAR(least, (axis ? 6 : 10) * frame, 0.6);
        EXPECT_NEAR(most, axis ? 47 + 6 * frame : 63 + 10 * frame, 0.6);
      }
    }
  }
}

// Five frames whose union is (-6, -4) to (75, 50): a plane of 81 x 54, the layer at (8, 3) of it.
// All show the same source: what a neighbour fills shows the source's column for its own shift.
TEST_F(RenderServiceTest, EdgesAreFilledFromTheFramesAround) {
  Solve({{0, 0}, {6, 2}, {-6, 3}, {12, -4}, {3, 0}},
        {{kFraming, 4}, {kSynthesisInputRange, 0.08}, {kSynthesisEdgeFeather, 0}}, 2);
  for (const int depth : {8, 16, 32}) {
    const auto middle = DrawBoth(Whole(2, depth));
    EXPECT_EQ(Sides(middle->rect()), (Rect{-8, -3, 73, 51}));
    // Column 30 of the plane shows source 30 - 6 + 6 of frame 2, less half a pixel.
    ExpectShown(*middle, 30 - 8, 20 - 3, 29.5, 20 - 4 - 3 - 0.5);
    // Right of its 57 (and the border's two pixels) frame 3 comes first.
    ExpectShown(*middle, 79 - 8, 20 - 3, 79 - 6 - 12 - 0.5, 20 - 4 + 4 - 0.5);
    EXPECT_EQ(ChannelAt(*middle, 0 - 8, 1 - 3, 0), 0) << "no frame reaches there";
  }
}

TEST_F(RenderServiceTest, FeatherAndCropsFollowTheScaleAndTheBoostIsItsDefault) {
  Solve({{0, 0}},
        {{kFraming, 4}, {kSynthesisEdgeFeather, 0}, {kSynthesisTop, 10}, {kSynthesisLeft, 3}}, 13,
        [](std::int64_t, int, int) {
          return HX_PixelFloat{1, 0.5f, 0.5f, 0.25f};
        });
  const auto whole = DrawBoth(Whole(0));
  EXPECT_EQ(ChannelAt(*whole, 30, 9, 0), 0);
  EXPECT_EQ(ChannelAt(*whole, 30, 10, 0), 1) << "half of an alpha, five times";
  EXPECT_EQ(ChannelAt(*whole, 2, 20, 0), 0);
  EXPECT_EQ(ChannelAt(*whole, 3, 20, 0), 1);
  const auto half = DrawBoth(Whole(0, 8, 2));
  EXPECT_EQ(ChannelAt(*half, 20, 4, 0), 0);
  EXPECT_EQ(ChannelAt(*half, 20, 5, 0), 1);
  // Feathered: at the outermost pixel 5 times the middle of 2 / 11^2 and 8 / 11^2.
  for (const std::int32_t index : {kSynthesisTop, kSynthesisLeft}) hosted().Set(index, 0);
  hosted().Set(kSynthesisEdgeFeather, 10);
  EXPECT_NEAR(ChannelAt(*DrawBoth(Whole(0)), 1, 20, 0), 5 * 5 / 121.0, 5 / 255.0);
}

TEST_F(RenderServiceTest, NoSizeLeavesTheOutputClear) {
  Solve(kTwoFrames, {{kFraming, 1}, {kAdditionalScale, 0}});
  EXPECT_TRUE(IsClear(*DrawBoth(Whole(0))));
  EXPECT_TRUE(hosted().effect().shared()->PolygonOf(0).empty());
}

// Also where a banner would be, and where the nearest frame stands in.
TEST_F(RenderServiceTest, WhatTheMediaHasNoFrameForIsClear) {
  Solve(kTwoFrames, {{kFraming, 1}});
  hosted().Place(-1, 4);
  for (const char* refusal : {"", "No."}) {
    hosted().Refuse(refusal);
    for (const int frame : {0, 1, 2, 3}) {
      for (const int depth : {8, 16, 32}) {
        EXPECT_EQ(IsClear(*DrawBoth(Whole(frame, depth))), frame % 3 == 0) << refusal << frame;
      }
    }
  }
  hosted().Refuse("");
}

// What fails anywhere, and is given back then, is asked of the plug-in in tests/contract.
TEST_F(RenderServiceTest, AFailingRenderSaysSo) {
  Solve(kTwoFrames, {{kFraming, 4}, {kSynthesisInputRange, 0.04}}, 1);
  const auto expect = [this](Path path, const std::string& name, int times) {
    for (int n = 1; n <= times; ++n) {
      Operations::Get().FailNth(n, name);
      EXPECT_EQ(hosted().Render(Whole(0), path).result.code, kFaultCode) << name << n;
      Operations::Get().FailNone();
    }
  };
  expect(Path::direct, "transfer", 1);
  expect(Path::planned, "transfer", 1);
  expect(Path::planned, "plan.checkout_layer", 2);
  expect(Path::planned, "render.checkout_layer_pixels", 2);
  expect(Path::planned, "render.checkout_output", 1);
  for (const char* name : {"Stabilizer Host.SetFramePolygon", "acquire Stabilizer Host Suite"}) {
    Operations::Get().FailAlways(name);
    for (const Path path : {Path::direct, Path::planned}) {
      const RenderedFrame frame = hosted().Render(Whole(0), path);
      EXPECT_TRUE(frame.result.ok() && frame.pixels) << "the outline alone is missing";
    }
    Operations::Get().FailNone();
  }
  EXPECT_TRUE(hosted().Messages().empty());
}

}  // namespace
}  // namespace calmframe::host
