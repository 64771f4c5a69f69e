#include "tracking/gradient_sums.h"

#include <gtest/gtest.h>

#include <algorithm>
#include <cmath>
#include <random>
#include <utility>
#include <vector>

#include "tests/support/each_instruction_set.h"
#include "tests/tracking/folded_image.h"

namespace marrow::tracking {
namespace {

struct PlainSums {
  double xx = 0, yy = 0, xy = 0;
  double absolute_xy = 0;
};

// Of the window about (x, y), products in 32 bits.
PlainSums SumPlainly(const std::vector<float>& image, int width, int x, int y, int hx, int hy) {
  PlainSums s;
  for (int v = y - hy; v <= y + hy; ++v) {
    for (int u = x - hx; u <= x + hx; ++u) {
      const float* p = &image[v * width + u];
      const float ix = p[1] - p[-1], iy = p[width] - p[-width];
      s.xx += ix * ix, s.yy += iy * iy, s.xy += ix * iy, s.absolute_xy += std::abs(ix * iy);
    }
  }
  return s;
}

// take(x, y, xx, yy, xy) for each pixel whose window, with one pixel about it, lies in the image.
template <class Take>
void ForEachSum(const std::vector<float>& image, int width, int hx, int hy, Take take) {
  const int height = image.size() / width;
  FoldedImage folded(image, width);
  GradientSums sums(hx, hy, width);
  std::size_t lowest = 0;
  sums.Start(
      [&](std::size_t y) {
        lowest = std::max(lowest, y);
        EXPECT_LT(y, std::size_t(height));
        EXPECT_GT(y + sums.kept_rows(), lowest);
        return folded.Row(y);
      },
      width, hy + 1, height - 2 * (hy + 1));
  for (int y = hy + 1; y < height - hy - 1; ++y) {
    const gradient_sum_row row = sums.NextRow();
    for (int x = hx + 1; x < width - hx - 1; ++x) {
      const std::size_t i = folded.folding().IndexOf(x);
      take(x, y, row.xx[i], row.yy[i], row.xy[i]);
    }
  }
}

// Windows lower than a group of rows, of every remainder over whole groups, and wider than a
// segment is long.
constexpr std::pair<int, int> kHalfWindows[] = {{0, 0},  {1, 1},  {2, 2},   {0, 5},  {1, 3},
                                                {3, 4},  {6, 0},  {5, 2},   {4, 7},  {9, 9},
                                                {2, 11}, {15, 8}, {15, 15}, {20, 20}};

TEST(GradientSumsTest, WindowSumsOfWholeNumbersAreExactAtEverySize) {
  std::mt19937 random(11);
  for (const auto& [hx, hy] : kHalfWindows) {
    for (const int columns : {1, 2, 15, 16, 17, 33, 120}) {
      for (const int rows : {1, 2, 3, 4, 5, 21, 70}) {
        const int width = columns + 2 * hx + 2, height = rows + 2 * hy + 2;
        std::vector<float> image(width * height);
        for (float& v : image) v = random() % 64;  // 63 * 63 * 41 * 41 is under 2^24
        int seen = 0;
        ForEachSum(image, width, hx, hy,
                   [&, hx = hx, hy = hy](int x, int y, float a, float b, float c) {
                     const PlainSums plain = SumPlainly(image, width, x, y, hx, hy);
                     ASSERT_EQ(a, plain.xx)
                         << x << ',' << y << " half " << hx << ',' << hy << " of " << width;
                     ASSERT_EQ(b, plain.yy);
                     ASSERT_EQ(c, plain.xy);
                     ++seen;
                   });
        ASSERT_EQ(seen, columns * rows);
      }
    }
  }
}

// On its way into a sum a product takes part in fewer additions than the window has rows and
// columns, each of which is off by half a unit in the last place of a part of the sum.
TEST(GradientSumsTest, RoundingIsBoundedAndTheSameOnEveryInstructionSet) {
  std::mt19937 random(12);
  std::uniform_real_distribution<float> value(0.0f, 255.0f);
  for (const auto& [hx, hy] : kHalfWindows) {
    const int width = 97, height = 70;
    std::vector<float> image(width * height);
    for (float& v : image) v = value(random);
    std::vector<float> first;
    tests::OnEachInstructionSet([&, hx = hx, hy = hy] {
      std::vector<float> found;
      ForEachSum(image, width, hx, hy, [&](int x, int y, float a, float b, float c) {
        found.insert(found.end(), {a, b, c});
        if (!first.empty()) return;
        const PlainSums plain = SumPlainly(image, width, x, y, hx, hy);
        const double rounding = (2 * hx + 2 * hy + 2) * 0x1p-24;
        ASSERT_NEAR(a, plain.xx, rounding * plain.xx);
        ASSERT_NEAR(b, plain.yy, rounding * plain.yy);
        ASSERT_NEAR(c, plain.xy, rounding * plain.absolute_xy);
      });
      ASSERT_FALSE(found.empty());
      if (first.empty()) first = found;
      EXPECT_EQ(found, first);
    });
  }
}

TEST(GradientSumsTest, StrongTextureLeavesNoTraceAboutIt) {
  constexpr int kSide = 200;
  std::mt19937 random(2);
  std::uniform_real_distribution<float> value(0.0f, 255.0f);
  std::vector<float> image(kSide * kSide, 12.3f);
  for (int y = 60; y < 100; ++y) {
    for (int x = 60; x < 100; ++x) image[y * kSide + x] = value(random);
  }
  ForEachSum(image, kSide, 15, 15, [&](int x, int y, float a, float b, float c) {
    const bool touches = x >= 44 && x <= 115 && y >= 44 && y <= 115;
    ASSERT_TRUE(touches || (a == 0.0f && b == 0.0f && c == 0.0f)) << x << ',' << y;
  });
}

float PlainScore(float a, float b, float c, float ratio, int* below_zero) {
  const float t = a + b;
  const float radicand = t * t - 4.0f * (a * b - c * c);
  if (radicand < 0.0f) ++*below_zero;
  const float d = std::sqrt(std::max(radicand, 0.0f));
  return t + d > (t - d) * ratio ? 0.0f : t - d;
}

// Corners, straight edges, flat surfaces, and round blobs, at some of which the radicand rounds
// below 0.
TEST(GradientSumsTest, ScoresAreThoseOfTheSums) {
  constexpr int kWidth = 250, kHeight = 60, kHalf = 3;
  std::vector<float> image(kWidth * kHeight, 30.0f);
  for (int y = 0; y < kHeight; ++y) {
    for (int x = 0; x < kWidth; ++x) {
      float& v = image[y * kWidth + x];
      if (x < 30) v = (x > 8) * 100 + (x > 18 && y > 20) * 60;
      const int blob = x / 20, dx = x % 20 - 10, dy = y - 30;
      if (x >= 40) v += 200.0f * std::exp(-0.01f * blob * (dx * dx + dy * dy));
    }
  }
  for (const float ratio : {15.0f, 3.0f}) {
    FoldedImage folded(image, kWidth);
    GradientSums scorer(kHalf, kHalf, kWidth);
    scorer.Start([&](std::size_t y) { return folded.Row(y); }, kWidth, kHalf + 1,
                 kHeight - 2 * (kHalf + 1));
    std::vector<float> scores(folded.folding().positions() * RowFolding::kSegments);
    int row = 0, below_zero = 0, elongated = 0, corners = 0;
    ForEachSum(image, kWidth, kHalf, kHalf, [&](int x, int y, float a, float b, float c) {
      if (y != row) scorer.NextScores(ratio, scores.data());
      row = y;
      const float expected = PlainScore(a, b, c, ratio, &below_zero);
      ASSERT_EQ(scores[folded.folding().IndexOf(x)], expected) << x << ',' << y;
      (expected == 0.0f ? elongated : corners) += a + b > 0.0f;
    });
    EXPECT_GT(below_zero, 0);
    EXPECT_GT(elongated, 0);
    EXPECT_GT(corners, 0);
  }
}

}  // namespace
}  // namespace marrow::tracking
