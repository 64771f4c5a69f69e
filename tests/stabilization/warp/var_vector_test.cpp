#include "stabilization/warp/var_vector.h"

#include <gtest/gtest.h>

#include <limits>
#include <random>

#include "tests/stabilization/clips.h"

namespace marrow::stabilization {
namespace {

// The unit grid of cols x rows over width x height under m.
VarVector grid_under(const matrix3& m, int cols = 64, int rows = 36, int width = 1920,
                     int height = 1080) {
  return grid_over(width, height, cols, rows, [&](point2 p) { return transform(m, p); });
}

VarVector stored(const VarVector& grid) {
  return rebuild(quantise(grid), grid.cols, grid.rows);
}

TEST(QuantiseTest, OffsetsRoundHalfAwayFromZero) {
  const double offsets[] = {.5 / 256, -.5 / 256, .0019, .3, 1.0 / 3, -1.0 / 3};
  const int steps[] = {1, -1, 0, 77, 85, -85};
  for (int i = 0; i < 6; ++i) {
    VarVector grid = grid_under(identity3, 3, 3, 3, 3);
    grid.values[2 * 4] += offsets[i];      // the inner vertex, x
    grid.values[2 * 5 + 1] += offsets[i];  // the right edge's middle, y
    const quantised_warp q = quantise(grid);
    EXPECT_EQ(q.offsets[8], steps[i]);
    EXPECT_EQ(q.offsets[11], steps[i]);
    EXPECT_EQ(stored(grid).values[8], 1 + steps[i] / 256.0);
  }
}

TEST(QuantiseTest, AHomographyHasNoOffsets) {
  const matrix3 m = {1.02, 0.03, 5, -0.01, 0.98, -7, 1e-5, -2e-5, 1};
  const VarVector grid = grid_under(m);
  const quantised_warp quantised = quantise(grid);
  for (const std::int32_t q : quantised.offsets) ASSERT_EQ(q, 0);
  const VarVector rebuilt = rebuild(quantised, 64, 36);
  for (std::size_t i = 0; i < grid.values.size(); ++i) {
    ASSERT_NEAR(rebuilt.values[i], grid.values[i], 1e-9);
  }
}

TEST(QuantiseTest, StoringTwiceChangesNoBit) {
  std::mt19937 random(3);
  std::uniform_real_distribution<double> unit(-1, 1);
  for (int trial = 0; trial < 60; ++trial) {
    const matrix3 m = {1 + .05 * unit(random), .05 * unit(random),     20 * unit(random),
                       .05 * unit(random),     1 + .05 * unit(random), 20 * unit(random),
                       1e-5 * unit(random),    1e-5 * unit(random),    1};
    VarVector grid = grid_under(m);
    if (trial % 2) {
      for (double& v : grid.values) v += 3 * unit(random);
    }
    const VarVector once = stored(grid);
    ASSERT_EQ(quantise(once).offsets, quantise(grid).offsets);
    ASSERT_EQ(stored(once).values, once.values);
    ASSERT_EQ(once.vertex(63, 35).x, grid.vertex(63, 35).x);
    for (std::size_t i = 0; i < grid.values.size(); ++i) {
      ASSERT_NEAR(once.values[i], grid.values[i], .5 / 256 + 1e-6);
    }
  }
}

TEST(QuantiseTest, HopelessRecordsDoNotTrap) {
  VarVector grid = grid_under(identity3, 3, 3, 3, 3);
  grid.values[8] = 1e30;
  grid.values[9] = std::numeric_limits<double>::quiet_NaN();
  const quantised_warp q = quantise(grid);
  EXPECT_GT(q.offsets[8], 2'000'000'000);
  EXPECT_EQ(q.offsets[9], 0);
  const VarVector nothing(3, 3);
  EXPECT_EQ(stored(nothing).values, nothing.values);
}

}  // namespace
}  // namespace marrow::stabilization
