#include "stabilizer/effect/src/stabilizer_state.h"

#include <gtest/gtest.h>

#include <boost/make_shared.hpp>

#include "stabilizer/effect/src/table_reader.h"
#include "tests/support/shifting_warper.h"

namespace kelp::effect {
namespace {

boost::shared_ptr<const cropper> Window(std::int32_t width, std::int32_t height) {
  const auto crop = boost::make_shared<cropper>(1, 1920, 1080);
  crop->cropWidth = width;
  crop->cropHeight = height;
  return crop;
}

// A state of a 1920 x 1080 clip with that crop window.
struct ZoomCase {
  ZoomCase(std::int32_t width, std::int32_t height, const Controls& controls)
      : values(ValuesOf(controls)) {
    state.warper = ShiftingWarper(1920, 1080, {{0, 0}});
    state.crop = Window(width, height);
  }
  double Zoom(bool auto_scale, bool additional, float scale = 1) {
    renderer = Renderer(state.warper->unionBounds(), 1920, 1080, 64, 36, scale, scale);
    return state.GetZoom(TableReader(values, false), renderer, auto_scale, additional);
  }
  bool OverCropped() { return state.IsOverCropped(TableReader(values, false)); }
  void ExpectOut(int left, int top, int right, int bottom) const {
    EXPECT_EQ(renderer.outLeft, left);
    EXPECT_EQ(renderer.outTop, top);
    EXPECT_EQ(renderer.outRight, right);
    EXPECT_EQ(renderer.outBottom, bottom);
  }

  const ParameterValues values;
  StabilizerState state{HX_InData{}, false};
  Renderer renderer{{0, 0, 1, 1}, 1, 1, 2, 2, 1, 1};
};

TEST(StabilizerStateTest, ZoomAndOutputRectangle) {
  ZoomCase whole(1920, 1080, {});
  EXPECT_NEAR(whole.Zoom(true, true), 1081.0 / 1080, 1e-6);  // the height wins
  whole.ExpectOut(0, 0, 1920, 1080);

  ZoomCase half(960, 540, {});
  EXPECT_EQ(half.Zoom(true, true), 1.5);  // Maximum Scale
  half.ExpectOut(240, 135, 1680, 945);
  EXPECT_EQ(half.Zoom(true, true, 0.5f), 1.5);
  half.ExpectOut(120, 68, 840, 473);

  Controls small;
  small.framing = Framing::crop;
  small.additional_scale = 50;
  ZoomCase smaller(1700, 1000, small);
  EXPECT_EQ(smaller.Zoom(true, true), 0.5);
  smaller.ExpectOut(535, 290, 1385, 790);
  EXPECT_EQ(smaller.Zoom(true, false), 1.0);
  EXPECT_EQ(smaller.Zoom(false, true), 0.5);

  ZoomCase none(0, 540, small);
  EXPECT_EQ(none.Zoom(true, true), 0.5);
  none.ExpectOut(0, 0, 0, 0);
}

// At 1920 x 1080 the limits are 768 and 432, of the window as it is shown.
TEST(StabilizerStateTest, OverCropped) {
  Controls crop_only, stabilize_only;
  crop_only.framing = Framing::crop;
  stabilize_only.framing = Framing::stabilize_only;
  EXPECT_FALSE(ZoomCase(768, 432, crop_only).OverCropped());
  EXPECT_TRUE(ZoomCase(767, 432, crop_only).OverCropped());
  EXPECT_TRUE(ZoomCase(1900, 431, crop_only).OverCropped());
  EXPECT_FALSE(ZoomCase(767, 431, stabilize_only).OverCropped());
  EXPECT_FALSE(ZoomCase(512, 288, {}).OverCropped());  // 1.5 times makes 768 x 432
  EXPECT_TRUE(ZoomCase(511, 288, {}).OverCropped());
  EXPECT_TRUE(ZoomCase(0, 0, {}).OverCropped());
}

TEST(StabilizerStateTest, MarginInFramesRoundsHalvesUp) {
  Controls edges;
  edges.framing = Framing::synthesize_edges;
  ParameterValues values = ValuesOf(edges);
  const TableReader params(values, false);
  EXPECT_EQ(MarginInFrames(params, 30), 15u);
  EXPECT_EQ(MarginInFrames(params, 25), 13u);
  EXPECT_EQ(MarginInFrames(params, 30000.0 / 1001), 15u);
  values[kSynthesisInputRangeIndex] = 0.01;
  EXPECT_EQ(MarginInFrames(params, 30), 0u);
  values[kSynthesisInputRangeIndex] = 999;
  EXPECT_EQ(MarginInFrames(params, 1e9), 2147483647u);
  values[kFramingIndex] = static_cast<int>(Framing::crop);
  EXPECT_EQ(MarginInFrames(params, 30), 0u);
}

}  // namespace
}  // namespace kelp::effect
