#pragma once

#include <cmath>
#include <cstddef>
#include <limits>

namespace marrow::tracking {

// Cholesky factor of a symmetric positive definite matrix of at most 14 rows (six motion
// parameters, gain and bias of four channels), lower triangle packed by rows, diagonal inverted.
class packed_cholesky {
 public:
  static constexpr std::size_t kMaxRows = 14;

  // `matrix`: rows by rows, row-major, lower triangle read. False if a pivot is not above what the
  // single-precision sums behind the matrix can tell from 0.
  bool Factor(const double* matrix, std::size_t rows) {
    rows_ = rows;
    for (std::size_t i = 0; i < rows; ++i) {
      for (std::size_t j = 0; j <= i; ++j) {
        double sum = matrix[i * rows + j];
        for (std::size_t k = 0; k < j; ++k) sum -= At(i, k) * At(j, k);
        if (i != j) {
          At(i, j) = sum * At(j, j);
          continue;
        }
        const double floor =
            matrix[i * rows + i] * static_cast<double>(std::numeric_limits<float>::epsilon());
        if (!(sum > floor) || !std::isfinite(sum)) return false;
        At(i, i) = 1.0 / std::sqrt(sum);
      }
    }
    return true;
  }

  // Overwrites b by the solution.
  void Solve(double* b) const {
    for (std::size_t i = 0; i < rows_; ++i) {
      double sum = b[i];
      for (std::size_t k = 0; k < i; ++k) sum -= At(i, k) * b[k];
      b[i] = sum * At(i, i);
    }
    for (std::size_t i = rows_; i-- > 0;) {
      const double value = b[i] * At(i, i);
      b[i] = value;
      for (std::size_t k = 0; k < i; ++k) b[k] -= At(i, k) * value;
    }
  }

 private:
  double& At(std::size_t i, std::size_t j) { return lower_[i * (i + 1) / 2 + j]; }
  double At(std::size_t i, std::size_t j) const { return lower_[i * (i + 1) / 2 + j]; }

  std::size_t rows_ = 0;
  double lower_[kMaxRows * (kMaxRows + 1) / 2];
};

}  // namespace marrow::tracking
