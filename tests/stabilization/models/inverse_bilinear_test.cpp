#include "stabilization/models/inverse_bilinear.h"

#include <gtest/gtest.h>

#include "stabilization/warp/grid_solver.h"

namespace marrow::stabilization {
namespace {

TEST(InverseBilinearTest, WorkedCells) {
  const point2 general = inverse_bilinear({26, 38}, {10, 20}, {42, 21}, {9, 53}, {43, 55});
  EXPECT_NEAR(general.x, 0.5, 1e-12);
  EXPECT_NEAR(general.y, 35.0 / 67, 1e-12);
  const point2 square = inverse_bilinear({7.5, 22.5}, {0, 0}, {30, 0}, {0, 30}, {30, 30});
  EXPECT_EQ(square.x, 0.25);
  EXPECT_EQ(square.y, 0.75);
}

TEST(InverseBilinearTest, UndoesTheBilinearMixInSkewCells) {
  const point2 a = {3, 1}, b = {31, 6}, c = {-2, 29}, d = {37, 40};
  for (const double x : {0.0, 0.3, 1.0}) {
    for (const double y : {0.0, 0.6, 1.0}) {
      const auto mix = [&](double pa, double pb, double pc, double pd) {
        return (1 - x) * (1 - y) * pa + x * (1 - y) * pb + (1 - x) * y * pc + x * y * pd;
      };
      const point2 p = {mix(a.x, b.x, c.x, d.x), mix(a.y, b.y, c.y, d.y)};
      const point2 found = inverse_bilinear(p, a, b, c, d);
      EXPECT_NEAR(found.x, x, 1e-12);
      EXPECT_NEAR(found.y, y, 1e-12);
    }
  }
}

TEST(InverseBilinearTest, CollapsedCellHasFractionZero) {
  const point2 at_a_point = inverse_bilinear({5, 5}, {2, 2}, {2, 2}, {2, 2}, {2, 2});
  EXPECT_EQ(at_a_point.x, 0);
  EXPECT_EQ(at_a_point.y, 0);
}

TEST(TriangleShapeTest, WorkedCell) {
  const point2 TL = {0, 0}, TR = {30, 1}, BL = {-1, 31}, BR = {31, 33};
  const point2 triangles[4][3] = {{TL, BL, BR}, {BL, BR, TR}, {BR, TR, TL}, {TR, TL, BL}};
  const double expected[4][2] = {{-.029182879, .966926070},
                                 {.093658537, .997073171},
                                 {-.068812431, 1.064372919},
                                 {.001039501, .967775468}};
  for (int i = 0; i < 4; ++i) {
    const triangle_shape s = shape_of_triangle(triangles[i][0], triangles[i][1], triangles[i][2]);
    EXPECT_NEAR(s.r, expected[i][0], 1e-9);
    EXPECT_NEAR(s.s, expected[i][1], 1e-9);
  }
}

}  // namespace
}  // namespace marrow::stabilization
