#include "stabilization/warp/var_vector.h"

#include <gtest/gtest.h>

#include <limits>
#include <random>

#include "tests/stabilization/clips.h"

namespace marrow::stabilization {
namespace {

// A vertex on each of 3 x 3 pixels.
VarVector pixel_grid() {
  return grid_over(3, 3, 3, 3, [](point2 p) { return p; });
}

VarVector stored(const VarVector& grid) {
  return rebuild(quantise(grid), grid.cols, grid.rows);
}

TEST(QuantiseTest, OffsetsRoundHalfAwayFromZero) {
  const double offsets[] = {.5 / 256, -.5 / 256, .0019, .3, 1.0 / 3, -1.0 / 3};
  const int steps[] = {1, -1, 0, 77, 85, -85};
  for (int i = 0; i < 6; ++i) {
    VarVector grid = pixel_grid();
    grid.values[2 * 4] += offsets[i];      // the inner vertex, x
    grid.values[2 * 5 + 1] += offsets[i];  // the right edge's middle, y
    const quantised_warp q = quantise(grid);
    EXPECT_EQ(q.offsets[8], steps[i]);
    EXPECT_EQ(q.offsets[11], steps[i]);
    EXPECT_EQ(stored(grid).values[8], 1 + steps[i] / 256.0);
  }
}

TEST(QuantiseTest, StoringTwiceChangesNoBit) {
  std::mt19937 random(3);
  std::uniform_real_distribution<double> unit(-1, 1);
  for (int trial = 0; trial < 20; ++trial) {
    const matrix3 m = {1 + .05 * unit(random), .05 * unit(random),     20 * unit(random),
                       .05 * unit(random),     1 + .05 * unit(random), 20 * unit(random),
                       1e-5 * unit(random),    1e-5 * unit(random),    1};
    VarVector grid = grid_over(1920, 1080, 64, 36, [&](point2 p) { return transform(m, p); });
    for (double& v : grid.values) v += 3 * unit(random) * (trial % 2);
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
  VarVector grid = pixel_grid();
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
