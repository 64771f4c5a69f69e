#include "tracking/color_pyramid.h"

#include <gmock/gmock.h>

#include <random>
#include <vector>

namespace marrow::tracking {
namespace {

// Sizes with a level too small for a filter, and with odd sides.
TEST(ColorPyramidTest, EqualsConversionAndLevelsApart) {
  std::mt19937 random(3);
  for (const auto& [w, h] :
       {std::pair{1, 1}, {30, 70}, {97, 49}, {98, 51}, {333, 200}, {1003, 801}}) {
    const std::size_t row_bytes = 4 * w + 12;
    std::vector<std::uint8_t> bytes(row_bytes * h);
    for (auto& b : bytes) b = random() & 255;
    // Bottom-up.
    const ArgbFrame frame{bytes.data() + (h - 1) * row_bytes,
                          -static_cast<std::ptrdiff_t>(row_bytes), std::size_t(w), std::size_t(h)};
    for (const std::size_t levels : {1, 3, 5}) {
      ImagePyramid expected(w, h, 3, levels);
      ImagePyramid pyramid(w, h, 3, levels, ImagePyramid::first_level::bytes);
      // What a frame before may have left.
      std::fill(pyramid.data.begin(), pyramid.data.end(), 7.0f);
      std::fill(expected.data.begin(), expected.data.end(), 7.0f);
      std::vector<float> scratch;
      std::vector<std::uint8_t> luma(w * h), expected_luma(w * h);
      ColorFromArgb(frame, expected.LevelData(0));
      BuildLevels(expected);
      ColorPyramidFromArgb(frame, pyramid, scratch, luma.data());
      LumaFromArgb(frame, expected_luma.data());
      ASSERT_EQ(luma, expected_luma);
      std::vector<float> found(pyramid.bytes.begin(), pyramid.bytes.end());
      found.insert(found.end(), pyramid.data.begin(), pyramid.data.end());
      ASSERT_TRUE(found == expected.data) << w << "x" << h << ", " << levels;
    }
  }
}

}  // namespace
}  // namespace marrow::tracking
