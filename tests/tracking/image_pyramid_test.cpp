#include "tracking/image_pyramid.h"

#include <gmock/gmock.h>

#include <cmath>
#include <limits>
#include <random>
#include <vector>

namespace marrow::tracking {
namespace {

using ::testing::Each;
using ::testing::ElementsAre;

constexpr float kUntouched = -7.0f;

std::vector<float> RandomImage(std::size_t size) {
  std::mt19937 random(7);
  std::uniform_real_distribution<float> value(0.0f, 255.0f);
  std::vector<float> image(size);
  for (float& v : image) v = value(random);
  return image;
}

// Filters all rows along x into an image of their own, takes every other one, puts the frame
// around.
std::vector<float> PlainReduction(const std::vector<float>& s, int w, int h, int channels) {
  const int dw = (w + 1) / 2, dh = (h + 1) / 2;
  std::vector<float> out(dw * dh * channels, 0.0f);
  for (int y = 1; y <= dh - 2; ++y) {
    for (int x = 1; x <= dw - 2; ++x) {
      for (int c = 0; c < channels; ++c) {
        const auto at = [&](int column) { return s[(2 * y * w + column) * channels + c]; };
        out[(y * dw + x) * channels + c] =
            (at(2 * x - 1) + 2.0f * at(2 * x) + at(2 * x + 1)) * 0.25f;
      }
    }
  }
  return out;
}

TEST(ImagePyramidTest, LevelsAreCeilingsOfTheFirstOneWithoutGaps) {
  ImagePyramid pyramid(1921, 7, 3, 5);
  const std::vector<std::size_t> widths = {1921, 961, 481, 241, 121};
  const std::vector<std::size_t> heights = {7, 4, 2, 1, 1};
  std::size_t start = 0;
  for (std::size_t l = 0; l < 5; ++l) {
    EXPECT_EQ(pyramid.LevelWidth(l), widths[l]);
    EXPECT_EQ(pyramid.LevelHeight(l), heights[l]);
    EXPECT_EQ(pyramid.LevelData(l) - pyramid.data.data(), start);
    start += 3 * widths[l] * heights[l];
  }
  EXPECT_EQ(pyramid.data.size(), start);
  EXPECT_EQ(ImagePyramid(4, 3, 3, 0).data.size(), 36u);  // level 0 takes a frame all the same
  EXPECT_EQ(pyramid.LevelWidth(70), 1u);
}

TEST(ReduceLevelTest, SmoothsAlongXOnlyInsideABlackFrame) {
  std::vector<float> image;
  for (int y = 0; y < 5; ++y) {
    for (int x = 0; x < 7; ++x) image.push_back(10.0f * y + x * x);
  }
  std::vector<float> reduced(12, kUntouched);
  ReduceLevel(image.data(), 7, 5, 1, reduced.data());
  EXPECT_THAT(reduced, ElementsAre(0, 0, 0, 0, 0, 24.5f, 36.5f, 0, 0, 0, 0, 0));
}

TEST(ReduceLevelTest, EqualsThePlainLoopsAtEverySizeAboutAVector) {
  for (const int channels : {1, 3, 4}) {
    for (int w = 3; w < 75; ++w) {
      for (const int h : {3, 4, 5, 6, 9, 12}) {
        // NaN behind the image would show in any sample that reads it.
        std::vector<float> image = RandomImage(w * h * channels);
        const std::vector<float> expected = PlainReduction(image, w, h, channels);
        image.resize(image.size() + 64, std::numeric_limits<float>::quiet_NaN());
        std::vector<float> reduced(expected.size() + 64, kUntouched);
        ReduceLevel(image.data(), w, h, channels, reduced.data());
        const std::vector<float> behind(reduced.begin() + expected.size(), reduced.end());
        reduced.resize(expected.size());
        ASSERT_EQ(reduced, expected) << w << "x" << h << "x" << channels;
        ASSERT_THAT(behind, Each(kUntouched));
      }
    }
  }
}

TEST(ReduceLevelTest, WhatIsLeftUnreducedIsCleared) {
  const std::vector<float> image(2 * 8, 5.0f);
  std::vector<float> reduced(8, kUntouched);
  ReduceLevel(image.data(), 2, 8, 1, reduced.data());
  EXPECT_THAT(reduced, ElementsAre(0, kUntouched, kUntouched, kUntouched, kUntouched, kUntouched,
                                   kUntouched, kUntouched));
  reduced.assign(8, kUntouched);
  ReduceLevel(image.data(), 8, 2, 1, reduced.data());
  EXPECT_THAT(reduced, ElementsAre(0, 0, 0, 0, kUntouched, kUntouched, kUntouched, kUntouched));
  // Of two channels there is the frame only.
  std::vector<float> framed(3 * 3 * 2, kUntouched), expected(18, 0.0f);
  ReduceLevel(std::vector<float>(6 * 6 * 2, 5.0f).data(), 6, 6, 2, framed.data());
  expected[8] = expected[9] = kUntouched;
  EXPECT_EQ(framed, expected);
}

TEST(BuildLevelsTest, EachLevelReducesTheOneBefore) {
  ImagePyramid pyramid(61, 50, 3, 4);
  std::vector<float> level = RandomImage(61 * 50 * 3);
  std::copy(level.begin(), level.end(), pyramid.LevelData(0));
  BuildLevels(pyramid);
  for (std::size_t l = 1; l < 4; ++l) {
    level = PlainReduction(level, pyramid.LevelWidth(l - 1), pyramid.LevelHeight(l - 1), 3);
    EXPECT_EQ(std::vector<float>(pyramid.LevelData(l), pyramid.LevelData(l) + level.size()), level);
  }
  for (const std::size_t levels : {0, 1}) {  // nothing to build
    ImagePyramid flat(9, 9, 3, levels);
    std::fill(flat.data.begin(), flat.data.end(), 3.0f);
    BuildLevels(flat);
    EXPECT_THAT(flat.data, Each(3.0f));
  }
  ImagePyramid pixel(1, 1, 3, 5);
  std::fill_n(pixel.data.begin(), 3, 3.0f);
  BuildLevels(pixel);
  EXPECT_EQ(pixel.data.size(), 15u);
  EXPECT_EQ(pixel.data[2], 3.0f);
  EXPECT_EQ(pixel.data[3], 0.0f);
}

}  // namespace
}  // namespace marrow::tracking
