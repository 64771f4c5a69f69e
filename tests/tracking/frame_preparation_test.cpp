#include "tracking/frame_preparation.h"

#include <gmock/gmock.h>

#include <algorithm>
#include <random>
#include <vector>

namespace marrow::tracking {
namespace {

using ::testing::ElementsAre;

TEST(FramePreparationTest, WorkedValues) {
  const std::vector<std::uint8_t> pixels = {0,   255, 255, 255, 127, 255, 0,   0,   128, 0,
                                            255, 0,   255, 0,   0,   255, 0,   128, 128, 128,
                                            0,   10,  20,  30,  0,   200, 100, 50};
  const ArgbFrame frame{pixels.data(), 28, 7, 1};
  std::vector<std::uint8_t> luma(7), mask(7);
  std::vector<float> color(21);
  LumaFromArgb(frame, luma.data());
  MaskFromArgb(frame, mask.data());
  ColorFromArgb(frame, color.data());
  EXPECT_THAT(luma, ElementsAre(255, 76, 150, 29, 128, 18, 124));
  EXPECT_THAT(mask, ElementsAre(0, 0, 1, 1, 0, 0, 0));
  EXPECT_EQ(color[18], 200.0f) << "transparent pixels keep their colour";
}

// All against plain loops: widths about a vector, padded rows, both directions, misaligned.
TEST(FramePreparationTest, EqualsThePlainLoopsForAnyWidthAndStride) {
  constexpr std::size_t kHeight = 3;
  std::mt19937 random(3);
  for (std::size_t width = 1; width < 70; ++width) {
    for (const std::ptrdiff_t padding : {0, 1, 12}) {
      for (const bool bottom_up : {false, true}) {
        const std::ptrdiff_t pitch = 4 * width + padding;
        std::vector<std::uint8_t> bytes(pitch * (kHeight - 1) + 4 * width);
        for (auto& b : bytes) b = random() & 255;
        const ArgbFrame frame{bytes.data() + (bottom_up ? pitch * (kHeight - 1) : 0),
                              bottom_up ? -pitch : pitch, width, kHeight};
        // A value behind each image must stay.
        const std::size_t size = width * kHeight;
        std::vector<float> color(3 * size + 1, 7), expected_color;
        std::vector<std::uint8_t> luma(size + 1, 7), mask = luma, both_luma = luma,
                                                     both_color(3 * size + 1, 7);
        std::vector<std::uint8_t> expected_luma, expected_mask;
        for (std::size_t i = 0; i < size; ++i) {
          const std::size_t y = i / width;
          const auto* p = &bytes[(bottom_up ? kHeight - 1 - y : y) * pitch + 4 * (i % width)];
          expected_luma.push_back((9798 * p[1] + 19235 * p[2] + 3735 * p[3] + 16384) / 32768);
          expected_mask.push_back(p[0] > 127 ? 1 : 0);
          expected_color.insert(expected_color.end(), p + 1, p + 4);
        }
        for (auto* expected : {&expected_luma, &expected_mask}) expected->push_back(7);
        expected_color.push_back(7);
        LumaFromArgb(frame, luma.data());
        MaskFromArgb(frame, mask.data());
        ColorFromArgb(frame, color.data());
        ColorAndLumaFromArgb(frame, both_color.data(), both_luma.data());
        ASSERT_EQ(luma, expected_luma);
        ASSERT_EQ(both_luma, expected_luma);
        ASSERT_EQ(mask, expected_mask);
        ASSERT_EQ(color, expected_color);
        ASSERT_TRUE(std::equal(color.begin(), color.end(), both_color.begin()));
      }
    }
  }
}

}  // namespace
}  // namespace marrow::tracking
