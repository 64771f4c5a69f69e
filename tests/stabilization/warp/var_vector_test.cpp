#include "stabilization/warp/var_vector.h"

#include <gtest/gtest.h>

#include <limits>

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
