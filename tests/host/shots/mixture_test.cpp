#include "host/shots/mixture.h"

#include <gtest/gtest.h>

#include <cmath>

#include "tests/host/shots/drawn_digest.h"

namespace calmframe::host {
namespace {

FrameDetail Detail(const std::function<double(double x, double y)>& value) {
  return DetailOf(DrawDigest(value));
}
FrameDetail DetailOfWaves(int seed, double dx = 0, double dy = 0) {
  return Detail([=](double x, double y) { return Waves(seed, x - dx, y - dy); });
}

TEST(MixtureTest, AFrameIsLaidOverAnotherOfItsScene) {
  const FrameDetail still = DetailOfWaves(1);
  // What the motion from frame to frame tells may be off by some cells.
  const auto moved = Lay(still, DetailOfWaves(1, 7, -4), {4, -2});
  ASSERT_TRUE(moved);
  EXPECT_LT(moved->left, 0.03);
  // Both sides of the frame move apart.
  const auto turned = Lay(
      still, Detail([](double x, double y) { return Waves(1, x, y + (x < 32 ? 1.5 : -1.5)); }), {});
  ASSERT_TRUE(turned);
  EXPECT_LT(turned->left, 0.15);
  // A third of the contrast, a sky that brightens: it is the same.
  const auto lit =
      Lay(still, Detail([](double x, double y) { return 60 + y + 0.33 * Waves(1, x, y); }), {});
  ASSERT_TRUE(lit);
  EXPECT_LT(lit->left, 0.03);
  for (const int seed : {2, 3, 4}) {
    const auto other = Lay(still, DetailOfWaves(seed), {});
    ASSERT_TRUE(other);
    EXPECT_GT(other->left, 0.6) << seed;
  }
  EXPECT_FALSE(Lay(still, DetailOfWaves(1), {60, 0}));
}

TEST(MixtureTest, BothWeightsWhereverBothLie) {
  const FrameDetail a = DetailOfWaves(1), b = DetailOfWaves(2);
  // Where a fifth of it is left, the fainter one can't be placed.
  for (const double share : {0.35, 0.5, 0.65}) {
    // A has moved by (4, 2), B by (-2, 4), and the light has been raised.
    const FrameDetail frame = Detail([=](double x, double y) {
      return 10 + (1 - share) * Waves(1, x - 4, y - 2) + share * Waves(2, x + 2, y - 4);
    });
    const auto first = Lay(a, frame, {6, 0}), second = Lay(b, frame, {0, 4});
    ASSERT_TRUE(first && second);
    const auto mixture = MixtureOf(a, *first, frame, b, *second);
    ASSERT_TRUE(mixture);
    EXPECT_NEAR(mixture->first_weight, 1 - share, 0.08);
    EXPECT_NEAR(mixture->second_weight, share, 0.08);
    EXPECT_LT(mixture->left, 0.05);
    // Of pictures without anything in common, and of equal contrast.
    const double of_first = (1 - share) * (1 - share), of_second = share * share;
    EXPECT_NEAR(mixture->first_left, of_second / (of_first + of_second), 0.2);
    EXPECT_NEAR(mixture->second_left, of_first / (of_first + of_second), 0.2);
  }
}

TEST(MixtureTest, HalfOfTheFrameOfEachIsNoMixture) {
  const FrameDetail a = DetailOfWaves(1), b = DetailOfWaves(2);
  const FrameDetail wiped =
      Detail([](double x, double y) { return x < 32 ? Waves(1, x, y) : Waves(2, x, y); });
  const auto first = Lay(a, wiped, {}), second = Lay(b, wiped, {});
  ASSERT_TRUE(first && second);
  const auto mixture = MixtureOf(a, *first, wiped, b, *second);
  ASSERT_TRUE(mixture);
  EXPECT_GT(mixture->left, 0.3);
}

}  // namespace
}  // namespace calmframe::host
