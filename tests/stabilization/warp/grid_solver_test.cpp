#include "stabilization/warp/grid_solver.h"

#include <gtest/gtest.h>

#include <complex>
#include <random>

#include "tests/stabilization/clips.h"
#include "tests/stabilization/dense_reference.h"

namespace marrow::stabilization {
namespace {

std::vector<double> reference(int cols, int rows, const std::vector<Displacement>& list,
                              const std::vector<double>& shape, double data_weight) {
  dense_reference problem(2 * cols * rows);
  double largest = 0;
  for (const Displacement& d : list) largest = std::max(largest, d.weight);
  for (const Displacement& d : list) {
    const std::size_t tl = d.cellY * cols + d.cellX;
    for (const std::size_t axis : {0, 1}) {
      problem.add(data_weight / largest * d.weight,
                  {{2 * tl + axis, (1 - d.fracX) * (1 - d.fracY)},
                   {2 * (tl + 1) + axis, d.fracX * (1 - d.fracY)},
                   {2 * (tl + cols) + axis, (1 - d.fracX) * d.fracY},
                   {2 * (tl + cols + 1) + axis, d.fracX * d.fracY}},
                  axis ? d.targetY : d.targetX);
    }
  }
  const auto at = [&](std::size_t v) { return std::complex(shape[2 * v], shape[2 * v + 1]); };
  for (std::size_t TL = 0; TL + cols + 1 < shape.size() / 2; ++TL) {
    if (TL % cols + 1 == static_cast<std::size_t>(cols)) continue;
    const std::size_t TR = TL + 1, BL = TL + cols, BR = BL + 1;
    const std::size_t triangles[4][3] = {{TL, BL, BR}, {BL, BR, TR}, {BR, TR, TL}, {TR, TL, BL}};
    for (const auto& [a, b, c] : triangles) {
      const std::complex z = (at(a) - at(b)) / (at(c) - at(b));
      const double r = z.real(), s = -z.imag();
      const std::size_t x0 = 2 * a, x1 = 2 * b, x2 = 2 * c;
      problem.add(200, {{x0, -1}, {x1, 1 - r}, {x2, r}, {x2 + 1, s}, {x1 + 1, -s}}, 0);
      problem.add(200, {{x0 + 1, -1}, {x1 + 1, 1 - r}, {x2 + 1, r}, {x1, s}, {x2, -s}}, 0);
    }
  }
  return problem.solve();
}

// A grid of 30-pixel cells under m, and displacements all over it with targets off by up to 5.
struct Scene {
  Scene(int cols, int rows, const matrix3& m)
      : shape(grid_over(30 * cols - 29, 30 * rows - 29, cols, rows, [&](point2 p) {
                return transform(m, p);
              }).values) {
    std::mt19937 random(5);
    std::uniform_real_distribution<double> unit(0, 1);
    for (int i = 0; i < 40; ++i) {
      Displacement d;
      d.cellX = static_cast<int>(unit(random) * (cols - 1));
      d.cellY = static_cast<int>(unit(random) * (rows - 1));
      d.fracX = unit(random);
      d.fracY = unit(random);
      d.targetX = 30 * (d.cellX + d.fracX) + 5 * unit(random);
      d.targetY = 30 * (d.cellY + d.fracY) - 5 * unit(random);
      d.weight = 0.1 + 2 * unit(random);
      list.push_back(d);
    }
  }
  std::vector<double> shape;
  std::vector<Displacement> list;
};

TEST(GridSolverTest, AgreesWithDenseNormalEquationsWhateverTheShape) {
  const matrix3 shapes[] = {
      identity3, similarity_matrix(1.1, .2, 3, 4), {1.05, .1, 2, -.08, .93, 5, 3e-4, -2e-4, 1}};
  for (const auto& [cols, rows] : {std::pair(6, 5), std::pair(3, 7), std::pair(5, 3)}) {
    grid_solver solver(cols, rows);
    // The homography last and first again: one structure must serve both.
    for (const int k : {0, 1, 2, 0}) {
      const Scene scene(cols, rows, shapes[k]);
      std::vector<double> solution(2 * cols * rows);
      ASSERT_TRUE(solver.solve(scene.list, scene.shape, 0.7, solution));
      const std::vector<double> expected = reference(cols, rows, scene.list, scene.shape, 0.7);
      for (std::size_t i = 0; i < solution.size(); ++i) {
        ASSERT_NEAR(solution[i], expected[i], 1e-8) << cols << "x" << rows << " shape " << k;
      }
    }
  }
}

TEST(GridSolverTest, WithoutWeightThereIsNoSolutionAndTheNextSolveStands) {
  Scene scene(6, 5, identity3);
  grid_solver solver(6, 5);
  std::vector<double> solution(60, 7.0);
  std::vector<Displacement> weightless = scene.list;
  for (Displacement& d : weightless) d.weight = 0;
  EXPECT_FALSE(solver.solve(weightless, scene.shape, 1.0, solution));
  EXPECT_FALSE(solver.solve(scene.list, std::vector<double>(60, 1.0), 1.0, solution));
  EXPECT_EQ(solution, std::vector<double>(60, 7.0));
  EXPECT_TRUE(solver.solve(scene.list, scene.shape, 1.0, solution));
}

}  // namespace
}  // namespace marrow::stabilization
