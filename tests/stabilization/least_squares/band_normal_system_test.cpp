#include "stabilization/least_squares/band_normal_system.h"

#include <gtest/gtest.h>

#include <cmath>
#include <limits>
#include <random>

#include "tests/stabilization/dense_reference.h"

namespace marrow::stabilization {
namespace {

using vector = std::vector<double>;

// J'J of random rows that see `width` consecutive unknowns each; those in `unseen` are left out.
struct gram {
  std::size_t n, width;
  dense_reference dense;

  gram(std::size_t size, std::size_t reach, int rows_per_start,
       const std::vector<std::size_t>& unseen = {})
      : n(size), width(reach), dense(size) {
    std::mt19937 random(7);
    std::normal_distribution<double> normal;
    for (std::size_t start = 0; start + width <= n; ++start) {
      for (int r = 0; r < rows_per_start; ++r) {
        std::vector<std::pair<std::size_t, double>> row;
        for (std::size_t k = start; k < start + width; ++k) {
          row.push_back({k, normal(random) * !std::count(unseen.begin(), unseen.end(), k)});
        }
        dense.add(1, row, normal(random));
      }
    }
  }

  double& at(std::size_t i, std::size_t j) { return dense.matrix[i * n + j]; }

  band_normal_system system() {
    band_normal_system s;
    s.resize(n, width - 1);
    for (std::size_t j = 0; j < n; ++j) {
      for (std::size_t i = j; i < std::min(n, j + width); ++i) s.at(i, j) = at(i, j);
    }
    return s;
  }
};

// Solution and rank are those of the dense matrix, whichever way they are found.
void expect_dense_solution(gram& g, bool by_cholesky, std::size_t rank, double tolerance) {
  band_normal_system system = g.system();
  ASSERT_TRUE(system.factorize());
  EXPECT_EQ(system.by_cholesky(), by_cholesky);
  EXPECT_EQ(system.rank(), rank);
  std::size_t dense_rank = 0;
  const vector expected = minimum_norm(g.dense.matrix, g.dense.right, &dense_rank);
  EXPECT_EQ(dense_rank, rank);
  for (int turn = 0; turn < 2; ++turn) {
    vector x = g.dense.right;
    system.solve(x.data());
    for (std::size_t i = 0; i < g.n; ++i) EXPECT_NEAR(x[i], expected[i], tolerance) << i;
  }
}

TEST(BandNormalSystem, AgreesWithTheDenseMinimumNormSolution) {
  gram unseen(40, 12, 3, {0, 1, 2, 3, 17, 39});
  unseen.dense.right[2] = 5;  // outside the range: dropped, as by the pseudo-inverse
  expect_dense_solution(unseen, true, 34, 1e-9);

  gram scaled(20, 4, 4);  // badly, but short of the rank limit
  for (std::size_t i = 0; i < 400; ++i) {
    scaled.dense.matrix[i] *= (i / 20 % 4 ? 1 : 1e5) * (i % 4 ? 1.0 : 1e5);
  }
  expect_dense_solution(scaled, true, 20, 1e-4);

  // Two unknowns that only ever appear as their sum, with exactly representable numbers.
  gram sum(8, 4, 0);
  for (std::size_t i = 0; i < 8; ++i) sum.at(i, i) = i == 3 || i == 4 ? 2 : 4;
  sum.at(3, 4) = sum.at(4, 3) = 2;
  sum.dense.right = {4, 8, 4, 6, 2, 4, 4, 4};
  expect_dense_solution(sum, false, 7, 1e-12);
}

TEST(BandNormalSystem, LargeSingularSystemIsSolvedInItsRange) {
  const std::size_t n = band_normal_system::kLargestDense + 100;
  band_normal_system system;
  system.resize(n, 1);
  // A free chain: differences alone are seen, so a common shift is not.
  vector b(n);
  const auto step = [](std::size_t i) { return std::sin(0.1 * static_cast<double>(i)); };
  for (std::size_t i = 0; i + 1 < n; ++i) {
    system.at(i, i) += 1;
    system.at(i + 1, i + 1) += 1;
    system.at(i + 1, i) -= 1;
    b[i] -= step(i);
    b[i + 1] += step(i);
  }
  ASSERT_TRUE(system.factorize());
  EXPECT_EQ(system.rank(), n - 1);
  system.solve(b.data());
  for (std::size_t i = 0; i + 1 < n; ++i) EXPECT_NEAR(b[i + 1] - b[i], step(i), 1e-6) << i;
}

TEST(BandNormalSystem, NonFiniteEntriesAreAFailure) {
  for (const double bad : {std::nan(""), std::numeric_limits<double>::infinity()}) {
    band_normal_system system = gram(12, 4, 2).system();
    system.at(5, 4) = bad;
    EXPECT_FALSE(system.factorize());
  }
}

}  // namespace
}  // namespace marrow::stabilization
