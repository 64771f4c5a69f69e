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

TEST(PackedWarpTest, ComesBackAsItWasAndIsSmall) {
  quantised_warp q;
  q.corners[2] = {0.1, -1e300};
  const std::int32_t cols = 7, rows = 5;
  for (std::int32_t i = 0; i < cols * rows; ++i) {
    q.offsets.push_back(i % cols * 1000 + i / cols);  // a plane
    q.offsets.push_back(i % 2 ? std::numeric_limits<std::int32_t>::max()
                              : std::numeric_limits<std::int32_t>::min());
  }
  const quantised_warp back = unpack(pack(q, cols), cols, rows);
  EXPECT_EQ(back.offsets, q.offsets);
  EXPECT_EQ(back.corners[2].y, -1e300);
  // Of planes nothing is left but their first row and column: 3 groups of 16 and less.
  for (std::size_t i = 1; i < q.offsets.size(); i += 2) q.offsets[i] = 5;
  packed_warp packed = pack(q, cols);
  EXPECT_LT(packed.offsets.size(), 70u);
  packed.offsets.pop_back();
  EXPECT_THROW(unpack(packed, cols, rows), std::invalid_argument);
  packed.offsets.resize(packed.offsets.size() + 2);
  EXPECT_THROW(unpack(packed, cols, rows), std::invalid_argument);
}

}  // namespace
}  // namespace marrow::stabilization
