#pragma once

#include <cstddef>
#include <vector>

namespace marrow::stabilization {

// A symmetric positive semidefinite band matrix and products with its pseudo-inverse. Where the
// matrix has full rank beyond doubt, that is a band Cholesky factor; else one symmetric
// eigendecomposition, with eigenvalues under machine precision times the largest taken for zero
// (the rank rule of LAPACK's dgelss with rcond < 0).
class band_normal_system {
 public:
  // n unknowns, entries up to half_bandwidth off the diagonal. All zero.
  void resize(std::size_t n, std::size_t half_bandwidth);
  std::size_t size() const { return n_; }
  std::size_t half_bandwidth() const { return kd_; }

  // The lower triangle by columns: entry (i, j), i >= j, stands at j * (half_bandwidth + 1) + i -
  // j.
  std::vector<double>& matrix() { return matrix_; }
  double& at(std::size_t i, std::size_t j) { return matrix_[j * (kd_ + 1) + i - j]; }

  // Decomposes what matrix() holds, which stays as it is. False where that is not finite or LAPACK
  // fails; solve may not be called then.
  bool factorize();
  // b becomes the minimum-norm least-squares solution x of A x = b. Any number of times.
  void solve(double* b);
  std::size_t rank() const { return rank_; }
  bool by_cholesky() const { return method_ == method::cholesky; }

  // The largest side for which the dense decomposition is made: about a second. Larger singular
  // systems are solved with a ridge of rounding size and steps of refinement, which gives the same
  // solution to fewer digits wherever b lies in the range of A, as it does in a least-squares
  // problem. Rank is then reported as one short of full.
  static constexpr std::size_t kLargestDense = 1200;

 private:
  enum class method { none, cholesky, eigen, ridge };

  bool cholesky(double ridge);
  bool clearly_full_rank();
  bool eigendecompose();
  void multiply_add(const double* x, double sign, double* y) const;  // y += sign A x
  void cholesky_solve(double* b) const;
  double infinity_norm();

  std::size_t n_ = 0;
  std::size_t kd_ = 0;
  std::size_t rank_ = 0;
  method method_ = method::none;
  std::vector<double> matrix_;
  std::vector<double> factor_;
  std::vector<char>
      empty_;  // rows and columns that hold only zeros: unknowns that nothing observes
  std::size_t empty_count_ = 0;
  std::vector<double> eigenvectors_;
  std::vector<double> eigenvalues_;
  std::vector<double> scratch_;
};

}  // namespace marrow::stabilization
