#include "tracking/gradient_sums.h"

#include <gmock/gmock.h>

#include <algorithm>
#include <cmath>
#include <limits>
#include <random>
#include <utility>
#include <vector>

#include "tests/support/each_instruction_set.h"
#include "tracking/corner_score.h"

namespace marrow::tracking {
namespace {

constexpr float kNaN = std::numeric_limits<float>::quiet_NaN();

// Rows folded with a halo of one position, NaN where the image has no pixels.
class FoldedImage {
 public:
  FoldedImage(std::size_t width, std::size_t height)
      : folding_{width},
        stride_((folding_.positions() + 2) * RowFolding::kSegments),
        values_(stride_ * height, kNaN) {}

  // From an image of rows one after the other.
  explicit FoldedImage(const std::vector<float>& image, std::size_t width)
      : FoldedImage(width, image.size() / width) {
    const int positions = folding_.positions();
    for (std::size_t y = 0; y < image.size() / width; ++y) {
      for (int p = -1; p <= positions; ++p) {
        for (int segment = 0; segment < int(RowFolding::kSegments); ++segment) {
          const int x = segment * positions + p;
          if (x < 0 || x >= int(width)) continue;
          Row(y)[p * int(RowFolding::kSegments) + segment] = image[y * width + x];
        }
      }
    }
  }

  const RowFolding& folding() const { return folding_; }
  float* Row(std::size_t y) { return values_.data() + y * stride_ + RowFolding::kSegments; }

 private:
  RowFolding folding_;
  std::size_t stride_;
  std::vector<float> values_;
};

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
// segment.
constexpr std::pair<int, int> kHalfWindows[] = {{0, 0}, {1, 1},  {2, 2},   {0, 5},
                                                {1, 3}, {3, 4},  {6, 0},   {5, 2},
                                                {9, 9}, {15, 8}, {15, 15}, {20, 20}};

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

TEST(ScoreRowTest, EigenvaluesElongationAndRoundCorners) {
  // diag(100, 50); diag(100, 5); a straight edge; nothing; a round corner whose radicand rounds
  // below 0.
  std::vector<float> xx, yy, xy;
  for (int repeat = 0; repeat < 16; ++repeat) {
    for (const float v : {100.f, 100.f, 50.f, 0.f, 3.0000002f}) xx.push_back(v);
    for (const float v : {50.f, 5.f, 50.f, 0.f, 3.0f}) yy.push_back(v);
    for (const float v : {0.f, 0.f, 50.f, 0.f, 1e-4f}) xy.push_back(v);
  }
  const gradient_sum_row sums{xx.data(), yy.data(), xy.data()};
  std::vector<float> scores(80);
  ScoreRow(sums, 80, 15.0f, scores.data());
  for (int i = 0; i < 80; i += 5) {
    EXPECT_EQ(scores[i], 100.0f);    // twice the smaller eigenvalue
    EXPECT_EQ(scores[i + 1], 0.0f);  // ratio 20
    EXPECT_EQ(scores[i + 2], 0.0f);
    EXPECT_EQ(scores[i + 3], 0.0f);
    EXPECT_NEAR(scores[i + 4], 6.0f, 2e-3f);
  }
  ScoreRow(sums, 80, 20.1f, scores.data());
  EXPECT_EQ(scores[1], 10.0f);
}

TEST(FindMaximaTest, StrictOverAllEightNeighboursAndNotUnderTheLeast) {
  std::mt19937 random(9);
  for (const std::size_t count : {3, 4, 15, 16, 17, 18, 31, 32, 33, 60, 200}) {
    std::vector<float> image(3 * count);
    for (float& v : image) v = random() % 12;  // with many ties
    const float least = count % 3 * 4;
    const std::size_t first = count % 2, last = count - 1 - first;
    std::vector<std::pair<std::size_t, float>> expected;
    for (std::size_t x = first + 1; x < last; ++x) {
      int under = 0;
      for (int y = 0; y < 3; ++y) {
        for (int dx = -1; dx <= 1; ++dx) under += image[y * count + x + dx] < image[count + x];
      }
      if (under == 8 && image[count + x] >= least) expected.push_back({x, image[count + x]});
    }
    tests::OnEachInstructionSet([&] {
      FoldedImage rows(image, count);
      std::vector<score_maximum> maxima;
      FindMaxima(rows.Row(0), rows.Row(1), rows.Row(2), rows.folding(), first, last, least, maxima);
      std::vector<std::pair<std::size_t, float>> found;
      for (const auto& m : maxima) found.push_back({m.column, m.score});
      EXPECT_THAT(found, testing::UnorderedElementsAreArray(expected)) << count;
    });
  }
}

}  // namespace
}  // namespace marrow::tracking
