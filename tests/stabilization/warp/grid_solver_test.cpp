#include "stabilization/warp/grid_solver.h"

#include <gtest/gtest.h>

#include <cmath>
#include <random>

#include "tests/stabilization/displacement_lists.h"

namespace marrow::stabilization {
namespace {

// The problem as it is stated: one equation after the other into dense normal equations.
class dense_problem {
 public:
  explicit dense_problem(int unknowns) : n_(unknowns), a_(n_ * n_), b_(n_) {}

  void equation(double weight, const std::vector<std::pair<int, double>>& terms, double right) {
    for (const auto& [i, ci] : terms) {
      for (const auto& [j, cj] : terms) a_[i * n_ + j] += weight * ci * cj;
      b_[i] += weight * ci * right;
    }
  }

  std::vector<double> solve() {
    for (int k = 0; k < n_; ++k) {
      for (int i = k + 1; i < n_; ++i) {
        const double factor = a_[i * n_ + k] / a_[k * n_ + k];
        for (int j = k; j < n_; ++j) a_[i * n_ + j] -= factor * a_[k * n_ + j];
        b_[i] -= factor * b_[k];
      }
    }
    for (int k = n_ - 1; k >= 0; --k) {
      for (int j = k + 1; j < n_; ++j) b_[k] -= a_[k * n_ + j] * b_[j];
      b_[k] /= a_[k * n_ + k];
    }
    return b_;
  }

 private:
  int n_;
  std::vector<double> a_, b_;
};

std::vector<double> reference(int cols, int rows, const std::vector<Displacement>& list,
                              const std::vector<double>& shape, double data_weight) {
  dense_problem problem(2 * cols * rows);
  double largest = 0;
  for (const Displacement& d : list) largest = std::max(largest, d.weight);
  for (const Displacement& d : list) {
    const int tl = d.cellY * cols + d.cellX;
    const int corner[4] = {tl, tl + 1, tl + cols, tl + cols + 1};
    const double b[4] = {(1 - d.fracX) * (1 - d.fracY), d.fracX * (1 - d.fracY),
                         (1 - d.fracX) * d.fracY, d.fracX * d.fracY};
    for (int axis = 0; axis < 2; ++axis) {
      std::vector<std::pair<int, double>> terms;
      for (int i = 0; i < 4; ++i) terms.push_back({2 * corner[i] + axis, b[i]});
      problem.equation(data_weight / largest * d.weight, terms, axis ? d.targetY : d.targetX);
    }
  }
  const auto at = [&](int v) { return point2{shape[2 * v], shape[2 * v + 1]}; };
  for (int r = 0; r + 1 < rows; ++r) {
    for (int c = 0; c + 1 < cols; ++c) {
      const int TL = r * cols + c, TR = TL + 1, BL = TL + cols, BR = BL + 1;
      const int triangles[4][3] = {{TL, BL, BR}, {BL, BR, TR}, {BR, TR, TL}, {TR, TL, BL}};
      for (const auto& t : triangles) {
        const auto [r1, s1] = shape_of_triangle(at(t[0]), at(t[1]), at(t[2]));
        const int x0 = 2 * t[0], x1 = 2 * t[1], x2 = 2 * t[2];
        problem.equation(200, {{x0, -1}, {x1, 1 - r1}, {x2, r1}, {x2 + 1, s1}, {x1 + 1, -s1}}, 0);
        problem.equation(200, {{x0 + 1, -1}, {x1 + 1, 1 - r1}, {x2 + 1, r1}, {x1, s1}, {x2, -s1}},
                         0);
      }
    }
  }
  return problem.solve();
}

// A grid of 30-pixel cells under m, and displacements all over it with targets off by up to 5.
struct Scene {
  Scene(int cols, int rows, const matrix3& m) : shape(2 * cols * rows) {
    for (int v = 0; v < cols * rows; ++v) {
      const point2 p = transform(m, {30.0 * (v % cols), 30.0 * (v / cols)});
      shape[2 * v] = p.x;
      shape[2 * v + 1] = p.y;
    }
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

TEST(GridSolverTest, TargetsThatTheShapeMeetsLeaveItAsItIs) {
  Scene scene(64, 36, {1.02, 0.03, 5, -0.01, 0.98, -7, 1e-5, -2e-5, 1});
  for (Displacement& d : scene.list) {
    const auto mix = [&](int axis) {
      const double* a = &scene.shape[2 * (d.cellY * 64 + d.cellX) + axis];
      return (1 - d.fracY) * ((1 - d.fracX) * a[0] + d.fracX * a[2]) +
             d.fracY * ((1 - d.fracX) * a[128] + d.fracX * a[130]);
    };
    d.targetX = mix(0);
    d.targetY = mix(1);
  }
  std::vector<double> solution(scene.shape.size());
  ASSERT_TRUE(grid_solver(64, 36).solve(scene.list, scene.shape, 1.0, solution));
  for (std::size_t i = 0; i < solution.size(); ++i) {
    ASSERT_NEAR(solution[i], scene.shape[i], 1e-6);
  }
}

TEST(GridSolverTest, WithoutWeightThereIsNoSolutionAndTheNextSolveStands) {
  Scene scene(6, 5, identity3);
  grid_solver solver(6, 5);
  std::vector<double> solution(60, 7.0);
  std::vector<Displacement> weightless = scene.list;
  for (Displacement& d : weightless) d.weight = 0;
  EXPECT_FALSE(solver.solve(weightless, scene.shape, 1.0, solution));
  EXPECT_EQ(solution, std::vector<double>(60, 7.0));
  const std::vector<double> collapsed(60, 1.0);
  EXPECT_FALSE(solver.solve(scene.list, collapsed, 1.0, solution));
  EXPECT_TRUE(solver.solve(scene.list, scene.shape, 1.0, solution));
}

}  // namespace
}  // namespace marrow::stabilization
