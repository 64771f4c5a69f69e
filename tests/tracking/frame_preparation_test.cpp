#include "tracking/frame_preparation.h"

#include <gmock/gmock.h>

#include <random>
#include <vector>

namespace marrow::tracking {
namespace {

using ::testing::Each;
using ::testing::ElementsAre;

TEST(LumaTest, WorkedValues) {
  const std::vector<std::uint8_t> pixels = {0,   255, 255, 255, 255, 255, 0,   0,   9,   0,
                                            255, 0,   1,   0,   0,   255, 0,   128, 128, 128,
                                            0,   10,  20,  30,  0,   200, 100, 50};
  std::vector<std::uint8_t> luma(7);
  LumaFromArgb({pixels.data(), 28, 7, 1}, luma.data());
  EXPECT_THAT(luma, ElementsAre(255, 76, 150, 29, 128, 18, 124));
}

TEST(MaskTest, OneAbove127) {
  const std::vector<std::uint8_t> pixels = {0,   255, 255, 255, 127, 255, 255, 255,
                                            128, 0,   0,   0,   255, 9,   9,   9};
  std::vector<std::uint8_t> mask(4);
  MaskFromArgb({pixels.data(), 16, 4, 1}, mask.data());
  EXPECT_THAT(mask, ElementsAre(0, 0, 1, 1));
}

// All three against plain loops: widths about a vector, padded rows, both directions, misaligned.
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
        const std::size_t size = width * kHeight;
        std::vector<float> color(3 * size + 1, -7);
        std::vector<std::uint8_t> luma(size + 1, 7), mask(size + 1, 7),
            color_bytes(3 * size + 1, 7);
        std::vector<std::uint8_t> both_luma(size + 1, 7), both_color(3 * size + 1, 7);
        LumaFromArgb(frame, luma.data());
        MaskFromArgb(frame, mask.data());
        ColorFromArgb(frame, color.data());
        ColorFromArgb(frame, color_bytes.data());
        ColorAndLumaFromArgb(frame, both_color.data(), both_luma.data());
        ASSERT_EQ(both_color, color_bytes);
        ASSERT_EQ(both_luma, luma);
        for (std::size_t i = 0; i < size; ++i) {
          const std::size_t y = i / width;
          const auto* p = &bytes[(bottom_up ? kHeight - 1 - y : y) * pitch + 4 * (i % width)];
          ASSERT_EQ(luma[i], (9798 * p[1] + 19235 * p[2] + 3735 * p[3] + 16384) / 32768);
          ASSERT_EQ(mask[i], p[0] > 127 ? 1 : 0);
          for (int c = 0; c < 3; ++c) {
            ASSERT_EQ(color[3 * i + c], p[1 + c]);
            ASSERT_EQ(color_bytes[3 * i + c], p[1 + c]);
          }
        }
        ASSERT_EQ(luma[size], 7);
        ASSERT_EQ(color[3 * size], -7);
        ASSERT_EQ(color_bytes[3 * size], 7);
        ASSERT_EQ(mask[size], 7);
      }
    }
  }
}

TEST(FramePreparationTest, TransparentPixelsKeepTheirColour) {
  const std::vector<std::uint8_t> pixels(4 * 40, 0);
  std::vector<std::uint8_t> colored = pixels;
  for (std::size_t i = 0; i < 40; ++i) colored[4 * i + 2] = 200;
  std::vector<float> color(120);
  std::vector<std::uint8_t> luma(40), mask(40, 1);
  const ArgbFrame frame{colored.data(), 40, 10, 4};
  LumaFromArgb(frame, luma.data());
  MaskFromArgb(frame, mask.data());
  ColorFromArgb(frame, color.data());
  EXPECT_THAT(luma, Each(117));
  EXPECT_THAT(mask, Each(0));
  EXPECT_EQ(color[1], 200.0f);
}

}  // namespace
}  // namespace marrow::tracking
