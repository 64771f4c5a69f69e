#include "stabilizer/render/render_geometry.h"

#include <gtest/gtest.h>

namespace {

TEST(FitZoom, CoversTheFrameWithinItsLimitsElseCentresTheWindow) {
  const struct {
    float scale;
    int width, height;
    float action_safe, maximum, additional, zoom;
    int left, top, right, bottom;
  } cases[] = {{1, 1920, 1080, 0, 1.5f, 1, 1.0009259f, 0, 0, 1920, 1080},
               {1, 1918, 1078, 0, 1.5f, 1, 1.0027829f, 0, 0, 1920, 1080},
               {1, 1800, 1000, 0, 1.5f, 1, 1.081f, 0, 0, 1920, 1080},
               {1, 1000, 600, 0, 1.5f, 1, 1.5f, 210, 90, 1710, 990},
               {1, 1800, 1000, .1f, 1.5f, 1, 1, 60, 40, 1860, 1040},
               {1, 1800, 1000, 0, 1, 1, 1, 60, 40, 1860, 1040},
               {1, 1800, 1000, 0, 1, .5f, .5f, 510, 290, 1410, 790},
               {.5f, 1800, 1000, 0, 1.5f, 1, 1.081f, 0, 0, 960, 540}};
  for (const auto& c : cases) {
    SCOPED_TRACE(testing::Message() << c.width << " by " << c.height << ", " << c.maximum);
    Renderer r({-4.5, 0, 1925.25, 1083}, 1920, 1080, 64, 36, c.scale, c.scale);
    EXPECT_NEAR(r.fitZoom(1920, 1080, c.width, c.height, c.action_safe, c.maximum, c.additional),
                c.zoom, 1e-6);
    EXPECT_EQ(r.outLeft, c.left);
    EXPECT_EQ(r.outTop, c.top);
    EXPECT_EQ(r.outRight, c.right);
    EXPECT_EQ(r.outBottom, c.bottom);
  }
}

TEST(Renderer, TheSourceIsAsLargeAsItsLayerWhateverItsPixels) {
  const struct {
    int square, layer, half;  // of 10:11, 16:15, 64:45, 1:1
  } cases[] = {{315, 346, 173}, {341, 320, 160}, {1024, 720, 360}, {333, 333, 167}};
  for (const auto& c : cases) {
    const double scale = double(c.layer) / c.square;
    const auto at = [&](double ratio) {
      return Renderer({0, 0, c.square - 1.0, 99}, c.square, 100, 5, 3, ratio * scale, ratio);
    };
    EXPECT_EQ(at(1).sourceWidth, c.layer);
    EXPECT_EQ(at(1).cellWidth, (c.layer - 1) / 4.0);
    EXPECT_EQ(at(0.5).sourceWidth, c.half);
    EXPECT_EQ(at(1 / 3.0).sourceHeight, 34);
  }
}

}  // namespace
