#include "tracking/gradient_sums.h"

#include <gmock/gmock.h>

#include <limits>
#include <random>
#include <vector>

#include "tracking/corner_score.h"

namespace marrow::tracking {
namespace {

TEST(GradientSumsTest, WindowSumsOfWholeNumbersAreExactAtEverySize) {
  constexpr float kNaN = std::numeric_limits<float>::quiet_NaN();
  std::mt19937 random(11);
  for (const auto& [hx, hy] : {std::pair{0, 0}, {1, 3}, {5, 2}, {15, 15}}) {
    for (const int columns : {1, 2, 7, 8, 9, 33}) {
      const int rows = 20;
      const int w = columns + 2 * hx + 2, h = rows + 2 * hy + 2, stride = w + 3;
      std::vector<float> image(stride * h, kNaN);
      for (int y = 0; y < h; ++y) {
        for (int x = 0; x < w; ++x) image[y * stride + x] = random() % 256;
      }
      GradientSums sums(hx, hy, w);
      const PixelRegion region{hx + 1u, hy + 1u, hx + 1u + columns, hy + 1u + rows};
      sums.Start([&](std::size_t y) { return image.data() + y * stride; }, region);
      for (int y = hy + 1; y < hy + 1 + rows; ++y) {
        gradient_sum_row row = sums.NextRow();
        for (int x = hx + 1, i = 0; i < columns; ++x, ++i) {
          double a = 0, b = 0, c = 0;
          for (int v = y - hy; v <= y + hy; ++v) {
            for (int u = x - hx; u <= x + hx; ++u) {
              const float* p = &image[v * stride + u];
              const float ix = p[1] - p[-1], iy = p[stride] - p[-stride];
              a += ix * ix, b += iy * iy, c += ix * iy;
            }
          }
          ASSERT_EQ(row.xx[i], static_cast<float>(a)) << x << ',' << y;
          ASSERT_EQ(row.yy[i], static_cast<float>(b));
          ASSERT_EQ(row.xy[i], static_cast<float>(c));
        }
      }
    }
  }
}

TEST(GradientSumsTest, StrongTextureLeavesNoTraceBehindIt) {
  constexpr int kSide = 200;
  std::mt19937 random(2);
  std::uniform_real_distribution<float> value(0.0f, 255.0f);
  std::vector<float> image(kSide * kSide, 12.3f);
  for (int y = 0; y < 60; ++y) {
    for (int x = 0; x < 60; ++x) image[y * kSide + x] = value(random);
  }
  GradientSums sums(15, 15, kSide);
  sums.Start([&](std::size_t y) { return image.data() + y * kSide; },
             {16, 16, kSide - 16, kSide - 16});
  for (int y = 16; y < kSide - 16; ++y) {
    gradient_sum_row row = sums.NextRow();
    for (int x = 16; x < kSide - 16; ++x) {
      if (x > 76 || y > 76) {
        ASSERT_NEAR(row.xx[x - 16] + row.yy[x - 16], 0.0f, 1e-6f) << x << "," << y;
      }
    }
  }
}

TEST(ScoreRowTest, EigenvaluesElongationAndRoundCorners) {
  // diag(100, 50); diag(100, 5); a straight edge; nothing; a round corner whose radicand rounds
  // below 0.
  std::vector<float> xx, yy, xy;
  for (int repeat = 0; repeat < 5; ++repeat) {  // vectors and tail
    for (const float v : {100.f, 100.f, 50.f, 0.f, 3.0000002f}) xx.push_back(v);
    for (const float v : {50.f, 5.f, 50.f, 0.f, 3.0f}) yy.push_back(v);
    for (const float v : {0.f, 0.f, 50.f, 0.f, 1e-4f}) xy.push_back(v);
  }
  const gradient_sum_row sums{xx.data(), yy.data(), xy.data()};
  std::vector<float> scores(25);
  ScoreRow(sums, 25, 15.0f, scores.data());
  for (int i = 0; i < 25; i += 5) {
    EXPECT_EQ(scores[i], 100.0f);    // twice the smaller eigenvalue
    EXPECT_EQ(scores[i + 1], 0.0f);  // ratio 20
    EXPECT_EQ(scores[i + 2], 0.0f);
    EXPECT_EQ(scores[i + 3], 0.0f);
    EXPECT_NEAR(scores[i + 4], 6.0f, 2e-3f);
  }
  ScoreRow(sums, 25, 20.1f, scores.data());
  EXPECT_EQ(scores[1], 10.0f);
}

TEST(FindMaximaTest, StrictOverAllEightNeighboursAndNotUnderTheLeast) {
  std::mt19937 random(9);
  for (std::size_t count = 1; count < 60; ++count) {
    std::vector<float> rows[3];
    for (auto& row : rows) {
      for (std::size_t x = 0; x < count; ++x) row.push_back(random() % 12);  // with many ties
    }
    std::vector<std::uint32_t> expected, found;
    const float least = count % 3 * 4;
    for (std::size_t x = 1; x + 1 < count; ++x) {
      int under = 0;
      for (const auto& row : rows) {
        for (int dx = -1; dx <= 1; ++dx) under += row[x + dx] < rows[1][x];
      }
      if (under == 8 && rows[1][x] >= least) expected.push_back(x);
    }
    FindMaxima(rows[0].data(), rows[1].data(), rows[2].data(), count, least, found);
    ASSERT_EQ(found, expected) << count;
  }
}

}  // namespace
}  // namespace marrow::tracking
