#include "tracking/gaussian_smoothing.h"

#include <gmock/gmock.h>

#include <algorithm>
#include <cmath>
#include <random>
#include <vector>

#include "tests/support/each_instruction_set.h"
#include "tests/tracking/plain_smoothing.h"

namespace marrow::tracking {
namespace {

TEST(IntegratedGaussianTest, WorkedTaps) {
  const struct {
    int window;  // sigma is a tenth of it, the tenth in 32 bits
    std::size_t radius;
    std::vector<double> taps;  // from the middle outwards
  } cases[] = {
      {15, 5, {0.261181504, 0.210837901, 0.110892154, 0.03798436, 0.00846751221, 0.00122733344}},
      {31,
       11,
       {0.128161848, 0.121718906, 0.10426911, 0.0805658549, 0.0561491325, 0.035296388, 0.0200129393,
        0.0102348765, 0.00472109579, 0.00196421263, 0.000737082795, 0.000249472389}},
      {41, 14, {0.0971017033}},
      {11, 4, {0.350578785}},
  };
  for (const auto& c : cases) {
    const std::vector<float> kernel = IntegratedGaussian(c.window * static_cast<double>(0.1f));
    ASSERT_EQ(kernel.size(), 2 * c.radius + 1);
    for (std::size_t k = 0; k < c.taps.size(); ++k) {
      EXPECT_NEAR(kernel[c.radius + k] / c.taps[k], 1.0, 1e-7) << c.window << ' ' << k;
      EXPECT_EQ(kernel[c.radius + k], kernel[c.radius - k]);
    }
  }
  EXPECT_THAT(IntegratedGaussian(0.011), ::testing::ElementsAre(1.0f)) << "under a pixel";
}

// Also narrower than a segment of a folded row is long, where halos reach over several.
TEST(SeparableSmootherTest, EqualsThePlainLoopsBitForBitInsideItsRegionOnly) {
  std::mt19937 random(5);
  for (const double sigma : {0.1, 0.7, 2.1}) {
    const std::vector<float> kernel = IntegratedGaussian(sigma);
    for (const std::size_t width : {1u, 2u, 15u, 16u, 17u, 63u, 64u, 65u, 130u}) {
      for (const std::size_t height : {1u, 3u, 30u}) {
        const std::size_t stride = width + 5;
        const PixelRegion region{2, 1, 2 + width, 1 + height};
        std::vector<std::uint8_t> image(stride * (height + 2));
        for (auto& v : image) v = random() % 256;
        const std::vector<float> expected =
            testing::PlainSmoothing({image.begin(), image.end()}, stride, region, kernel);
        tests::OnEachInstructionSet([&] {
          for (const std::size_t kept : {1u, 4u, 7u}) {
            SeparableSmoother smoother(kernel, width, kept);
            smoother.Start(image.data(), stride, region);
            for (std::size_t y = 0; y < height; ++y) {
              smoother.Row(y);
              for (std::size_t back = 0; back < std::min(kept, y + 1); ++back) {
                const float* row = smoother.Row(y - back);
                for (std::size_t x = 0; x < width; ++x) {
                  ASSERT_EQ(row[smoother.folding().IndexOf(x)],
                            expected[(1 + y - back) * stride + 2 + x])
                      << width << "x" << height << " at " << x << ',' << y << " kept " << kept;
                }
              }
            }
          }
        });
      }
    }
  }
}

}  // namespace
}  // namespace marrow::tracking
