#include "tracking/image_pyramid.h"

#include <gtest/gtest.h>

#include <algorithm>
#include <limits>
#include <random>
#include <tuple>
#include <vector>

namespace marrow::tracking {
namespace {

constexpr float kUntouched = -7.0f;

std::vector<float> RandomImage(std::size_t size) {
  std::mt19937 random(7);
  std::uniform_real_distribution<float> value(0.0f, 255.0f);
  std::vector<float> image(size);
  for (float& v : image) v = value(random);
  return image;
}

// What a destination holds after a reduction, as one would write it down.
std::vector<float> PlainReduction(const std::vector<float>& s, int w, int h, int channels) {
  const int dw = (w + 1) / 2, dh = (h + 1) / 2;
  std::vector<float> out;
  for (int y = 0; y < dh; ++y) {
    for (int x = 0; x < dw; ++x) {
      for (int c = 0; c < channels; ++c) {
        const auto at = [&](int column) { return s[(2 * y * w + column) * channels + c]; };
        const bool reduced = w >= 3 && h >= 3;
        const bool frame = x == 0 || x == dw - 1 || y == 0 || y == dh - 1;
        if (reduced ? frame : y == 0) {
          out.push_back(0);
        } else if (reduced && channels != 2) {
          out.push_back((at(2 * x - 1) + 2.0f * at(2 * x) + at(2 * x + 1)) * 0.25f);
        } else {
          out.push_back(kUntouched);
        }
      }
    }
  }
  return out;
}

// NaN behind the image would show in any sample that reads it.
TEST(ReduceLevelTest, EqualsThePlainLoopsAtEverySizeAboutAVector) {
  for (const int channels : {1, 2, 3, 4}) {
    for (int w = 1; w < 75; ++w) {
      for (const int h : {1, 2, 3, 4, 5, 6, 8, 9, 12}) {
        std::vector<float> image = RandomImage(w * h * channels);
        std::vector<float> expected = PlainReduction(image, w, h, channels);
        expected.resize(expected.size() + 64, kUntouched);
        image.resize(image.size() + 64, std::numeric_limits<float>::quiet_NaN());
        std::vector<float> reduced(expected.size(), kUntouched);
        ReduceLevel(image.data(), w, h, channels, reduced.data());
        ASSERT_EQ(reduced, expected) << w << "x" << h << "x" << channels;
      }
    }
  }
}

// Level 0 takes a frame even if there are no levels.
TEST(BuildLevelsTest, EachLevelReducesTheOneBeforeWithoutGaps) {
  for (const auto& [w, h, levels] :
       {std::tuple{61, 50, 4}, {100, 3, 70}, {1, 1, 5}, {9, 9, 1}, {9, 9, 0}}) {
    ImagePyramid pyramid(w, h, 3, levels);
    std::vector<float> level = RandomImage(w * h * 3), expected = level;
    std::copy(level.begin(), level.end(), pyramid.LevelData(0));
    BuildLevels(pyramid);
    for (int l = 1; l < levels; ++l) {
      EXPECT_EQ(pyramid.LevelData(l) - pyramid.data.data(), expected.size());
      level = PlainReduction(level, pyramid.LevelWidth(l - 1), pyramid.LevelHeight(l - 1), 3);
      expected.insert(expected.end(), level.begin(), level.end());
    }
    EXPECT_EQ(pyramid.data, expected) << w << "x" << h << ", " << levels;
  }
}

}  // namespace
}  // namespace marrow::tracking
