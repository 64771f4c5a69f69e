#include "stabilizer/effect/src/stabilizer_state.h"

#include <gtest/gtest.h>

#include <boost/make_shared.hpp>

#include "tests/support/parameter_values.h"

namespace kelp::effect {
namespace {

// One frame that stays where it is.
boost::shared_ptr<const marrow::stabilization::CPWarper> StandingWarper(std::int32_t width,
                                                                        std::int32_t height) {
  const auto warper = boost::make_shared<marrow::stabilization::CPWarper>(1, width, height);
  const auto record =
      boost::make_shared<marrow::stabilization::VarVector>(warper->gridCols(), warper->gridRows());
  for (std::size_t i = 0; i < record->values.size(); i += 2) {
    const auto vertex = static_cast<std::int32_t>(i / 2);
    record->values[i] = vertex % record->cols * (width - 1.0) / (record->cols - 1);
    record->values[i + 1] = vertex / record->cols * (height - 1.0) / (record->rows - 1);
  }
  warper->storeFrameWarp(record, true);
  return warper;
}

boost::shared_ptr<const cropper> Window(std::int32_t width, std::int32_t height) {
  const auto crop = boost::make_shared<cropper>(1, 1920, 1080);
  crop->cropWidth = width;
  crop->cropHeight = height;
  return crop;
}

// A state of a 1920 x 1080 clip with that crop window.
struct ZoomCase {
  ZoomCase(std::int32_t width, std::int32_t height, Framing framing) {
    values[kFramingIndex] = static_cast<int>(framing);
    state.warper = StandingWarper(1920, 1080);
    state.crop = Window(width, height);
  }
  double Zoom(bool auto_scale, bool additional, float scale = 1) {
    renderer = Renderer(state.warper->unionBounds(), 1920, 1080, 64, 36, scale, scale);
    return state.GetZoom(values, renderer, auto_scale, additional);
  }
  bool OverCropped() { return state.IsOverCropped(values); }
  void ExpectOut(int left, int top, int right, int bottom) const {
    EXPECT_EQ(renderer.outLeft, left);
    EXPECT_EQ(renderer.outTop, top);
    EXPECT_EQ(renderer.outRight, right);
    EXPECT_EQ(renderer.outBottom, bottom);
  }

  ParameterValues values;
  StabilizerState state{HX_InData{}, false};
  Renderer renderer{{0, 0, 1, 1}, 1, 1, 2, 2, 1, 1};
};

TEST(StabilizerStateTest, ZoomAndOutputRectangle) {
  ZoomCase whole(1920, 1080, Framing::crop_auto_scale);
  EXPECT_NEAR(whole.Zoom(true, true), 1081.0 / 1080, 1e-6);  // the height wins
  whole.ExpectOut(0, 0, 1920, 1080);

  ZoomCase half(960, 540, Framing::crop_auto_scale);
  EXPECT_EQ(half.Zoom(true, true), 1.5);  // Maximum Scale
  half.ExpectOut(240, 135, 1680, 945);
  EXPECT_EQ(half.Zoom(true, true, 0.5f), 1.5);
  half.ExpectOut(120, 68, 840, 473);

  ZoomCase smaller(1700, 1000, Framing::crop);
  smaller.values[kAdditionalScaleIndex] = 50;
  EXPECT_EQ(smaller.Zoom(true, true), 0.5);
  smaller.ExpectOut(535, 290, 1385, 790);
  EXPECT_EQ(smaller.Zoom(true, false), 1.0);
  EXPECT_EQ(smaller.Zoom(false, true), 0.5);

  ZoomCase none(0, 540, Framing::crop);
  none.values[kAdditionalScaleIndex] = 50;
  EXPECT_EQ(none.Zoom(true, true), 0.5);
  none.ExpectOut(0, 0, 0, 0);
}

// At 1920 x 1080 the limits are 768 and 432, of the window as it is shown.
TEST(StabilizerStateTest, OverCropped) {
  const struct {
    std::int32_t width, height;
    Framing framing;
    bool over_cropped;
  } cases[] = {{768, 432, Framing::crop, false},
               {767, 432, Framing::crop, true},
               {1900, 431, Framing::crop, true},
               {767, 431, Framing::stabilize_only, false},
               {512, 288, Framing::crop_auto_scale, false},  // 1.5 times makes 768 x 432
               {511, 288, Framing::crop_auto_scale, true},
               {0, 0, Framing::crop_auto_scale, true}};
  for (const auto& c : cases) {
    EXPECT_EQ(ZoomCase(c.width, c.height, c.framing).OverCropped(), c.over_cropped)
        << c.width << " x " << c.height;
  }
}

TEST(StabilizerStateTest, MarginInFramesRoundsHalvesUp) {
  ParameterValues values;
  values[kFramingIndex] = static_cast<int>(Framing::synthesize_edges);
  EXPECT_EQ(MarginInFrames(values, 30), 15u);
  EXPECT_EQ(MarginInFrames(values, 25), 13u);
  EXPECT_EQ(MarginInFrames(values, 30000.0 / 1001), 15u);
  values[kSynthesisInputRangeIndex] = 0.01;
  EXPECT_EQ(MarginInFrames(values, 30), 0u);
  values[kSynthesisInputRangeIndex] = 999;
  EXPECT_EQ(MarginInFrames(values, 1e9), 2147483647u);
  values[kFramingIndex] = static_cast<int>(Framing::crop);
  EXPECT_EQ(MarginInFrames(values, 30), 0u);
}

}  // namespace
}  // namespace kelp::effect
