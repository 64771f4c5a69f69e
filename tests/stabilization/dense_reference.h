#pragma once

#include <gtest/gtest.h>

#include <algorithm>
#include <cmath>
#include <cstddef>
#include <utility>
#include <vector>

#include "platform/lapack/lapack.h"

// The plain least squares that the fast solvers are held to.
namespace marrow::stabilization {

// The minimum-norm solution of a symmetric system, n x n, by singular values, and its rank.
inline std::vector<double> minimum_norm(std::vector<double> matrix, std::vector<double> right,
                                        std::size_t* rank = nullptr) {
  const int n = static_cast<int>(right.size()), one = 1;
  std::vector<double> singular(right.size()), work(50 * right.size() + 5000);
  const int work_size = static_cast<int>(work.size());
  const double machine_precision = -1;
  int found = 0, info = 0;
  lapack::dgelss(&n, &n, &one, matrix.data(), &n, right.data(), &n, singular.data(),
                 &machine_precision, &found, work.data(), &work_size, &info);
  EXPECT_EQ(info, 0);
  if (rank) *rank = static_cast<std::size_t>(found);
  return right;
}

// By their absolute values.
inline double largest_of(const std::vector<double>& values) {
  double largest = 0;
  for (const double v : values) largest = std::max(largest, std::fabs(v));
  return largest;
}

// A problem as it is stated: one weighted equation after the other, summed into normal equations.
class dense_reference {
 public:
  explicit dense_reference(std::size_t unknowns) : matrix(unknowns * unknowns), right(unknowns) {}

  // weight (sum of coefficient times unknown - target)^2
  void add(double weight, const std::vector<std::pair<std::size_t, double>>& terms, double target) {
    for (const auto& [i, ci] : terms) {
      for (const auto& [j, cj] : terms) matrix[i * right.size() + j] += weight * ci * cj;
      right[i] += weight * ci * target;
    }
  }
  std::vector<double> solve(std::size_t* rank = nullptr) const {
    return minimum_norm(matrix, right, rank);
  }

  std::vector<double> matrix;  // symmetric
  std::vector<double> right;
};

}  // namespace marrow::stabilization
