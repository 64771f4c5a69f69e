#include "tracking/window_stack.h"

#include <gtest/gtest.h>

#include <cmath>

#include "tests/tracking/tracker_images.h"

namespace marrow::tracking {
namespace {

using testing::kNaN;
using testing::Picture;
using testing::Sample;

TEST(WindowStackTest, LimitsDifferByOneBetweenTheAxes) {
  const ImagePyramid pyramid(1920, 1080, 3, 5);
  // The fifth level has 120 x 68 pixels: columns 16 to 102, rows 16 to 49 of it.
  const struct {
    float x, y;
    std::size_t levels;
  } places[] = {{16, 500, 1},  {15.999f, 500, 0}, {1902.99f, 500, 1}, {1903, 500, 0},
                {900, 16, 1},  {900, 15.999f, 0}, {900, 1061.99f, 1}, {900, 1062, 0},
                {256, 500, 5}, {255.9f, 500, 4},  {1647.9f, 500, 5},  {1648, 500, 4},
                {900, 256, 5}, {900, 255.9f, 4},  {900, 799.9f, 5},   {900, 800, 4}};
  for (const auto& p : places) {
    EXPECT_EQ(CountWindowLevels(9, p.x, p.y, {15, 15, 3}, pyramid), p.levels) << p.x << ',' << p.y;
  }
  EXPECT_EQ(CountWindowLevels(2, 900, 500, {15, 15, 3}, pyramid), 2u);
  // Small images, and positions that are no numbers.
  const window_shape shape{3, 3, 1};
  EXPECT_EQ(CountWindowLevels(1, 4, 4, shape, ImagePyramid(10, 11, 1, 1)), 1u);
  EXPECT_EQ(CountWindowLevels(1, 4, 4, shape, ImagePyramid(9, 11, 1, 1)), 0u);
  EXPECT_EQ(CountWindowLevels(1, 4, 4, shape, ImagePyramid(10, 10, 1, 1)), 0u);
  for (const float bad : {kNaN, 1e30f, -1e30f, -50.0f, INFINITY}) {
    EXPECT_EQ(CountWindowLevels(2, bad, 500, shape, pyramid), 0u);
    EXPECT_EQ(CountWindowLevels(2, 500, bad, shape, pyramid), 0u);
  }
}

// A product of coordinates is what bilinear interpolation reproduces exactly.
TEST(WindowStackTest, PlanesOfEveryLevelShowTheWindowAndItsDifferences) {
  const ImagePyramid pyramid = Picture(160, 144, 3, 3, [](double x, double y, double c) {
    return x * y / 64 + 2 * x - c * y + 10 * c;
  });
  WindowStack stack(2, 2, 3, 3);
  const float x = 70.3f, y = 61.7f;
  ASSERT_EQ(ExtractWindowStack(3, x, y, pyramid, stack), 3u);
  ASSERT_EQ(stack.levels_built, 3u);
  for (int level = 0; level < 3; ++level) {
    const double step = 1 << level;  // level-0 pixels to a pixel of the level
    for (const Sample& s : testing::Samples(stack.shape, stack.Level(level))) {
      const double px = x + step * s.u, py = y + step * s.v, c = s.c;
      ASSERT_NEAR(s.value, px * py / 64 + 2 * px - c * py + 10 * c, 2e-3) << level;
      ASSERT_NEAR(s.gx, 2 * step * (py / 64 + 2), 2e-3) << level;
      ASSERT_NEAR(s.gy, 2 * step * (px / 64 - c), 2e-3) << level;
    }
  }
  EXPECT_EQ(ExtractWindowStack(3, 2.9f, y, pyramid, stack), 0u);
  EXPECT_EQ(stack.levels_built, 0u);
}

}  // namespace
}  // namespace marrow::tracking
