#include "stabilization/least_squares/band_normal_system.h"

#include <algorithm>
#include <cmath>
#include <limits>

#include "platform/lapack/lapack.h"

namespace marrow::stabilization {
namespace {

// LAPACK's relative machine precision, which dgelss multiplies with the largest singular value.
constexpr double kMachinePrecision = std::numeric_limits<double>::epsilon() / 2;

double length(const std::vector<double>& v, std::size_t n) {
  double sum = 0;
  for (std::size_t i = 0; i < n; ++i) sum += v[i] * v[i];
  return std::sqrt(sum);
}

}  // namespace

void band_normal_system::resize(std::size_t n, std::size_t half_bandwidth) {
  n_ = n;
  kd_ = n == 0 ? 0 : std::min(half_bandwidth, n - 1);
  matrix_.assign(n_ * (kd_ + 1), 0.0);
  factor_.resize(matrix_.size());
  empty_.resize(n_);
  scratch_.resize(2 * n_);
  method_ = method::none;
}

bool band_normal_system::factorize() {
  method_ = method::none;
  if (!std::all_of(matrix_.begin(), matrix_.end(), [](double v) { return std::isfinite(v); })) {
    return false;
  }
  empty_count_ = 0;
  for (std::size_t j = 0; j < n_; ++j) {
    bool empty = true;
    for (std::size_t d = 0; empty && d <= kd_; ++d) {
      empty =
          matrix_[j * (kd_ + 1) + d] == 0.0 && (d > j || matrix_[(j - d) * (kd_ + 1) + d] == 0.0);
    }
    empty_[j] = empty;
    empty_count_ += empty;
  }
  if (cholesky(0.0) && clearly_full_rank()) {
    method_ = method::cholesky;
    rank_ = n_ - empty_count_;
    return true;
  }
  if (n_ <= kLargestDense) return eigendecompose();
  // Factorizing adds up to about half_bandwidth roundings, hence a start well above one.
  double ridge = 64 * kMachinePrecision * infinity_norm();
  for (int attempt = 0; attempt < 12; ++attempt, ridge *= 10) {
    if (!cholesky(ridge)) continue;
    method_ = method::ridge;
    rank_ = n_ - std::max<std::size_t>(empty_count_, 1);
    return true;
  }
  return false;
}

bool band_normal_system::cholesky(double ridge) {
  factor_ = matrix_;
  for (std::size_t j = 0; j < n_; ++j) {
    double& diagonal = factor_[j * (kd_ + 1)];
    diagonal = empty_[j] ? 1.0 : diagonal + ridge;
  }
  const int n = static_cast<int>(n_);
  const int kd = static_cast<int>(kd_);
  const int ld = kd + 1;
  int info = 0;
  lapack::dpbtrf("L", &n, &kd, factor_.data(), &ld, &info);
  return info == 0;
}

// Whether the smallest eigenvalue, estimated by inverse iteration, lies a good way above the rank
// rule's limit. A few steps from a vector that favours no direction find it to a small factor;
// the margin covers that factor and the roundings of the factorization.
bool band_normal_system::clearly_full_rank() {
  constexpr double kMargin = 64;
  std::vector<double>& v = scratch_;
  unsigned state = 12345;
  for (std::size_t i = 0; i < n_; ++i) {
    state = state * 1664525u + 1013904223u;
    v[i] = empty_[i] ? 0.0 : 1.0 + static_cast<double>(state >> 8) / (1 << 24);
    if (state & 0x40000000u) v[i] = -v[i];
  }
  const double largest = infinity_norm();
  double inverse_norm = 0;
  for (int step = 0; step < 4; ++step) {
    const double before = length(v, n_);
    if (before == 0) break;  // every column is empty
    for (std::size_t i = 0; i < n_; ++i) v[i] /= before;
    cholesky_solve(v.data());
    inverse_norm = length(v, n_);
    if (!std::isfinite(inverse_norm)) return false;
  }
  return inverse_norm * largest * (kMargin * kMachinePrecision) < 1.0;
}

bool band_normal_system::eigendecompose() {
  eigenvectors_.assign(n_ * n_, 0.0);
  eigenvalues_.resize(n_);
  for (std::size_t j = 0; j < n_; ++j) {
    const std::size_t last = std::min(n_ - 1, j + kd_);
    for (std::size_t i = j; i <= last; ++i) eigenvectors_[j * n_ + i] = at(i, j);
  }
  const int n = static_cast<int>(n_);
  int info = 0;
  int lwork = -1;
  int liwork = -1;
  double work_size = 0;
  int iwork_size = 0;
  lapack::dsyevd("V", "L", &n, eigenvectors_.data(), &n, eigenvalues_.data(), &work_size, &lwork,
                 &iwork_size, &liwork, &info);
  if (info != 0) return false;
  lwork = static_cast<int>(work_size);
  liwork = iwork_size;
  std::vector<double> work(static_cast<std::size_t>(lwork));
  std::vector<int> iwork(static_cast<std::size_t>(liwork));
  lapack::dsyevd("V", "L", &n, eigenvectors_.data(), &n, eigenvalues_.data(), work.data(), &lwork,
                 iwork.data(), &liwork, &info);
  if (info != 0) return false;
  double largest = 0;
  for (const double w : eigenvalues_) largest = std::max(largest, std::fabs(w));
  rank_ = 0;
  for (double& w : eigenvalues_) {
    if (std::fabs(w) > kMachinePrecision * largest) {
      ++rank_;
    } else {
      w = 0;
    }
  }
  method_ = method::eigen;
  return true;
}

void band_normal_system::solve(double* b) {
  if (method_ == method::eigen) {
    std::fill(scratch_.begin(), scratch_.begin() + static_cast<std::ptrdiff_t>(n_), 0.0);
    for (std::size_t k = 0; k < n_; ++k) {
      if (eigenvalues_[k] == 0) continue;
      const double* v = &eigenvectors_[k * n_];
      double projection = 0;
      for (std::size_t i = 0; i < n_; ++i) projection += v[i] * b[i];
      projection /= eigenvalues_[k];
      for (std::size_t i = 0; i < n_; ++i) scratch_[i] += projection * v[i];
    }
    std::copy(scratch_.begin(), scratch_.begin() + static_cast<std::ptrdiff_t>(n_), b);
    return;
  }
  for (std::size_t i = 0; i < n_; ++i) {
    if (empty_[i]) b[i] = 0;
  }
  if (method_ == method::cholesky) {
    cholesky_solve(b);
    return;
  }
  double* const rhs = scratch_.data();
  double* const residual = rhs + n_;
  std::copy(b, b + n_, rhs);
  cholesky_solve(b);
  for (int step = 0; step < 2; ++step) {
    std::copy(rhs, rhs + n_, residual);
    multiply_add(b, -1.0, residual);
    cholesky_solve(residual);
    for (std::size_t i = 0; i < n_; ++i) b[i] += residual[i];
  }
}

void band_normal_system::cholesky_solve(double* b) const {
  const int n = static_cast<int>(n_);
  const int kd = static_cast<int>(kd_);
  const int ld = kd + 1;
  const int one = 1;
  int info = 0;
  lapack::dpbtrs("L", &n, &kd, &one, factor_.data(), &ld, b, &n, &info);
}

void band_normal_system::multiply_add(const double* x, double sign, double* y) const {
  for (std::size_t j = 0; j < n_; ++j) {
    const double* column = &matrix_[j * (kd_ + 1)];
    const std::size_t reach = std::min(kd_, n_ - 1 - j);
    double row = column[0] * x[j];
    for (std::size_t d = 1; d <= reach; ++d) {
      y[j + d] += sign * column[d] * x[j];
      row += column[d] * x[j + d];
    }
    y[j] += sign * row;
  }
}

double band_normal_system::infinity_norm() {
  double* const sums = scratch_.data() + n_;
  std::fill(sums, sums + n_, 0.0);
  for (std::size_t j = 0; j < n_; ++j) {
    const double* column = &matrix_[j * (kd_ + 1)];
    const std::size_t reach = std::min(kd_, n_ - 1 - j);
    sums[j] += std::fabs(column[0]);
    for (std::size_t d = 1; d <= reach; ++d) {
      sums[j] += std::fabs(column[d]);
      sums[j + d] += std::fabs(column[d]);
    }
  }
  return n_ == 0 ? 0.0 : *std::max_element(sums, sums + n_);
}

}  // namespace marrow::stabilization
