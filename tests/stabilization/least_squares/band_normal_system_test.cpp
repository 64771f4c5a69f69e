#include "stabilization/least_squares/band_normal_system.h"

#include <gtest/gtest.h>

#include <cmath>
#include <limits>
#include <random>

#include "platform/lapack/lapack.h"

namespace marrow::stabilization {
namespace {

// J'J of random rows that see `width` consecutive unknowns each; unknowns in `unseen` are left out.
struct gram {
  int n;
  int width;
  std::vector<double> dense;  // n x n

  gram(int size, int reach, int rows_per_start, const std::vector<int>& unseen = {})
      : n(size), width(reach), dense(size * size) {
    std::mt19937 random(7);
    std::normal_distribution<double> normal;
    for (int start = 0; start + width <= n; ++start) {
      for (int r = 0; r < rows_per_start; ++r) {
        std::vector<double> row(n);
        for (int k = 0; k < width; ++k) row[start + k] = normal(random);
        for (const int j : unseen) row[j] = 0;
        for (int i = 0; i < n; ++i)
          for (int j = 0; j < n; ++j) dense[i * n + j] += row[i] * row[j];
      }
    }
  }

  band_normal_system system() const {
    band_normal_system s;
    s.resize(n, width - 1);
    for (int j = 0; j < n; ++j)
      for (int i = j; i < std::min(n, j + width); ++i) s.at(i, j) = dense[i * n + j];
    return s;
  }

  // Minimum-norm solution and rank, by singular values.
  std::vector<double> reference(std::vector<double> b, int* rank) const {
    std::vector<double> a = dense;
    std::vector<double> s(n);
    std::vector<double> work(50 * n + 1000);
    const int one = 1, lwork = static_cast<int>(work.size());
    const double rcond = -1.0;
    int info = 0;
    lapack::dgelss(&n, &n, &one, a.data(), &n, b.data(), &n, s.data(), &rcond, rank, work.data(),
                   &lwork, &info);
    EXPECT_EQ(info, 0);
    return b;
  }

  // A right-hand side in the range.
  std::vector<double> rhs() const {
    std::vector<double> b(n);
    for (int i = 0; i < n; ++i)
      for (int j = 0; j < n; ++j) b[i] += dense[i * n + j] * std::sin(1.0 + j);
    return b;
  }
};

void expect_close(const std::vector<double>& a, const std::vector<double>& b, double tolerance) {
  ASSERT_EQ(a.size(), b.size());
  for (std::size_t i = 0; i < a.size(); ++i) EXPECT_NEAR(a[i], b[i], tolerance) << i;
}

TEST(BandNormalSystem, FullRankGoesByCholeskyAndAgreesWithTheDenseSolution) {
  const gram g(60, 12, 3);
  band_normal_system system = g.system();
  ASSERT_TRUE(system.factorize());
  EXPECT_TRUE(system.by_cholesky());
  EXPECT_EQ(system.rank(), 60u);
  int rank = 0;
  std::vector<double> x = g.rhs();
  system.solve(x.data());
  expect_close(x, g.reference(g.rhs(), &rank), 1e-9);
  EXPECT_EQ(rank, 60);
}

TEST(BandNormalSystem, UnseenUnknownsAreZeroAndLowerTheRank) {
  const gram g(40, 12, 3, {0, 1, 2, 3, 17, 39});
  band_normal_system system = g.system();
  ASSERT_TRUE(system.factorize());
  EXPECT_TRUE(system.by_cholesky());
  int rank = 0;
  std::vector<double> b = g.rhs();
  b[2] = 5;  // outside the range: dropped, as by the pseudo-inverse
  std::vector<double> x = b;
  system.solve(x.data());
  expect_close(x, g.reference(b, &rank), 1e-9);
  EXPECT_EQ(system.rank(), 34u);
  EXPECT_EQ(rank, 34);
  EXPECT_EQ(x[17], 0.0);
}

TEST(BandNormalSystem, SingularSystemGetsTheMinimumNormSolution) {
  // Two unknowns that only ever appear as their sum, with exactly representable numbers.
  gram g(8, 4, 3);
  for (int i = 0; i < 8; ++i) {
    for (int j = 0; j < 8; ++j) g.dense[i * 8 + j] = i == j ? 4.0 : 0.0;
  }
  for (const int i : {3, 4})
    for (const int j : {3, 4}) g.dense[i * 8 + j] = 2.0;
  band_normal_system system = g.system();
  ASSERT_TRUE(system.factorize());
  EXPECT_FALSE(system.by_cholesky());
  EXPECT_EQ(system.rank(), 7u);
  std::vector<double> x = {4, 8, 4, 6, 2, 4, 4, 4};
  int rank = 0;
  const std::vector<double> expected = g.reference(x, &rank);
  system.solve(x.data());
  expect_close(x, expected, 1e-12);
  EXPECT_NEAR(x[3], 1.0, 1e-12);
  EXPECT_NEAR(x[4], 1.0, 1e-12);
  EXPECT_EQ(rank, 7);
}

TEST(BandNormalSystem, BadScalingShortOfTheRankLimitStaysFullRank) {
  gram g(20, 4, 4);
  for (int i = 0; i < 20; ++i)
    for (int j = 0; j < 20; ++j) g.dense[i * 20 + j] *= (i % 4 ? 1 : 1e5) * (j % 4 ? 1.0 : 1e5);
  band_normal_system system = g.system();
  ASSERT_TRUE(system.factorize());
  EXPECT_TRUE(system.by_cholesky());
  EXPECT_EQ(system.rank(), 20u);
}

TEST(BandNormalSystem, LargeSingularSystemIsSolvedInItsRange) {
  const int n = static_cast<int>(band_normal_system::kLargestDense) + 100;
  band_normal_system system;
  system.resize(n, 1);
  // A free chain: differences alone are seen, so a common shift is not.
  for (int i = 0; i + 1 < n; ++i) {
    if (i == n / 2) continue;
    system.at(i, i) += 1;
    system.at(i + 1, i + 1) += 1;
    system.at(i + 1, i) -= 1;
  }
  ASSERT_TRUE(system.factorize());
  EXPECT_LT(system.rank(), static_cast<std::size_t>(n));
  std::vector<double> truth(n);
  for (int i = 0; i < n; ++i) truth[i] = std::sin(0.1 * i);
  std::vector<double> b(n);
  for (int i = 0; i + 1 < n; ++i) {
    if (i == n / 2) continue;
    b[i] += truth[i] - truth[i + 1];
    b[i + 1] += truth[i + 1] - truth[i];
  }
  system.solve(b.data());
  for (int i = 0; i + 1 < n; ++i) {
    if (i == n / 2) continue;
    EXPECT_NEAR(b[i + 1] - b[i], truth[i + 1] - truth[i], 1e-6) << i;
  }
}

TEST(BandNormalSystem, NonFiniteEntriesAreAFailure) {
  for (const double bad :
       {std::numeric_limits<double>::quiet_NaN(), std::numeric_limits<double>::infinity()}) {
    band_normal_system system = gram(12, 4, 2).system();
    system.at(5, 4) = bad;
    EXPECT_FALSE(system.factorize());
  }
}

}  // namespace
}  // namespace marrow::stabilization
