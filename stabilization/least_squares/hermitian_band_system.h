#pragma once

#include <array>
#include <cstddef>
#include <vector>

namespace marrow::stabilization {

// A x = b for a Hermitian positive definite band matrix, by a Cholesky factorization in blocks of
// eight columns (Golub and Van Loan, Matrix Computations, 4.3.5), eight rows to a vector. Real and
// imaginary parts lie apart, and a column begins at a multiple of eight rows, so that a vector of
// rows stands at one place of every column that has it. LAPACK's band routine works through the
// same matrix of a grid's width in three times the time.
class hermitian_band_system {
 public:
  // Columns that are eliminated together, and the step at which columns begin.
  static constexpr std::size_t kBlock = 8;

  // Entries stand at most half_bandwidth off the diagonal.
  hermitian_band_system(std::size_t unknowns, std::size_t half_bandwidth);

  // All of the matrix and of the right-hand side becomes zero.
  void clear();
  // Entry (i, j) of the lower triangle, j <= i <= j + half_bandwidth.
  void set(std::size_t i, std::size_t j, double re, double im) {
    double* at = column(j) + (i - j / kBlock * kBlock);
    at[0] = re;
    at[height_] = im;
  }
  void set_right(std::size_t i, double re, double im) {
    right_re()[i] = re;
    right_im()[i] = im;
  }

  // Overwrites matrix and right-hand side. False where the matrix is not positive definite or not
  // finite; there is no solution then.
  bool solve();
  double solution_re(std::size_t i) const { return right_[i / kBlock].row[i % kBlock]; }
  double solution_im(std::size_t i) const {
    return right_[rows_ / kBlock + i / kBlock].row[i % kBlock];
  }

 private:
  struct alignas(64) row_block {
    std::array<double, kBlock> row;
  };

  double* column(std::size_t j) { return matrix_.data()->row.data() + j * 2 * height_; }
  double* right_re() { return right_.data()->row.data(); }
  double* right_im() { return right_re() + rows_; }

  const std::size_t unknowns_;
  const std::size_t half_bandwidth_;
  const std::size_t height_;  // rows of a column, a multiple of kBlock
  const std::size_t rows_;    // with those that fill the last blocks
  std::vector<row_block> matrix_;
  std::vector<row_block> right_;
  std::vector<double> inverse_;  // of the factor's diagonal
};

}  // namespace marrow::stabilization
