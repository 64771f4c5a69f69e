#include "stabilization/least_squares/hermitian_band_system.h"

#include <algorithm>
#include <cmath>

#undef HWY_TARGET_INCLUDE
#define HWY_TARGET_INCLUDE "stabilization/least_squares/hermitian_band_system.cpp"
#include <hwy/foreach_target.h>
// After foreach_target.
#include <hwy/highway.h>

HWY_BEFORE_NAMESPACE();
namespace marrow::stabilization::HWY_NAMESPACE {
namespace hn = hwy::HWY_NAMESPACE;

constexpr std::size_t kBlock = hermitian_band_system::kBlock;
using Rows = hn::CappedTag<double, kBlock>;
using Vector = hn::Vec<Rows>;

// Eight columns of the matrix from a multiple of eight on. Rows count from the first of them.
struct panel {
  double* re(std::size_t column) const { return first + column * 2 * height; }
  double* im(std::size_t column) const { return re(column) + height; }

  double* first;
  std::size_t height;
};

// a -= x conj(k)
HWY_INLINE void SubtractByConjugate(Vector& a_re, Vector& a_im, Vector x_re, Vector x_im,
                                    Vector k_re, Vector k_im) {
  a_re = hn::NegMulAdd(x_re, k_re, a_re);
  a_im = hn::NegMulAdd(x_im, k_re, a_im);
  a_re = hn::NegMulAdd(x_im, k_im, a_re);
  a_im = hn::MulAdd(x_re, k_im, a_im);
}

// The same in memory, with k the same for all rows.
HWY_INLINE void SubtractByConjugate(double* a_re, double* a_im, Vector x_re, Vector x_im,
                                    double k_re, double k_im) {
  const Rows d;
  auto re = hn::Load(d, a_re);
  auto im = hn::Load(d, a_im);
  SubtractByConjugate(re, im, x_re, x_im, hn::Set(d, k_re), hn::Set(d, k_im));
  hn::Store(re, d, a_re);
  hn::Store(im, d, a_im);
}

// Factors the triangle on the diagonal, and takes the right-hand side through it. What stands in it
// from the diagonal up becomes zero.
HWY_INLINE bool FactorTriangle(const panel& p, double* inverse, double* y_re, double* y_im) {
  const Rows d;
  for (std::size_t c = 0; c < kBlock; ++c) {
    const double pivot = p.re(c)[c];
    if (!(pivot > 0) || !std::isfinite(pivot)) return false;
    inverse[c] = 1 / std::sqrt(pivot);
    const double right_re = y_re[c] * inverse[c];
    const double right_im = y_im[c] * inverse[c];
    const auto scale = hn::Set(d, inverse[c]);
    for (std::size_t row = 0; row < kBlock; row += hn::Lanes(d)) {
      const auto below =
          hn::Gt(hn::Iota(d, static_cast<double>(row)), hn::Set(d, static_cast<double>(c)));
      const auto re = hn::IfThenElseZero(below, hn::Mul(hn::Load(d, p.re(c) + row), scale));
      const auto im = hn::IfThenElseZero(below, hn::Mul(hn::Load(d, p.im(c) + row), scale));
      hn::Store(re, d, p.re(c) + row);
      hn::Store(im, d, p.im(c) + row);
      SubtractByConjugate(y_re + row, y_im + row, re, im, right_re, -right_im);
    }
    y_re[c] = right_re;
    y_im[c] = right_im;
    for (std::size_t row = 0; row < kBlock; row += hn::Lanes(d)) {
      const auto re = hn::Load(d, p.re(c) + row);
      const auto im = hn::Load(d, p.im(c) + row);
      for (std::size_t k = c + 1; k < kBlock; ++k) {
        SubtractByConjugate(p.re(k) + row, p.im(k) + row, re, im, p.re(c)[k], p.im(c)[k]);
      }
    }
  }
  return true;
}

// The panel's rows from `row` on, a vector of them: through the triangle, their products with the
// right-hand side and with the rows above them taken from what lies behind the panel.
HWY_INLINE void EliminateRows(const panel& p, std::size_t row, std::size_t columns,
                              const double* inverse, double* y_re, double* y_im) {
  const Rows d;
  Vector re[kBlock], im[kBlock];
  for (std::size_t c = 0; c < kBlock; ++c) {
    re[c] = hn::Load(d, p.re(c) + row);
    im[c] = hn::Load(d, p.im(c) + row);
  }
  for (std::size_t c = 0; c < kBlock; ++c) {
    const auto scale = hn::Set(d, inverse[c]);
    re[c] = hn::Mul(re[c], scale);
    im[c] = hn::Mul(im[c], scale);
    hn::Store(re[c], d, p.re(c) + row);
    hn::Store(im[c], d, p.im(c) + row);
    for (std::size_t k = c + 1; k < kBlock; ++k) {
      SubtractByConjugate(re[k], im[k], re[c], im[c], hn::Set(d, p.re(c)[k]),
                          hn::Set(d, p.im(c)[k]));
    }
    SubtractByConjugate(y_re + row, y_im + row, re[c], im[c], y_re[c], -y_im[c]);
  }
  for (std::size_t k = kBlock; k < std::min(columns, row + hn::Lanes(d)); ++k) {
    double* const to_re = p.re(k) + row - k / kBlock * kBlock;
    double* const to_im = to_re + p.height;
    // Two sums, so that a product need not wait for the one before.
    auto a_re = hn::Load(d, to_re);
    auto a_im = hn::Load(d, to_im);
    auto b_re = hn::Zero(d);
    auto b_im = hn::Zero(d);
    for (std::size_t c = 0; c < kBlock; c += 2) {
      SubtractByConjugate(a_re, a_im, re[c], im[c], hn::Set(d, p.re(c)[k]), hn::Set(d, p.im(c)[k]));
      SubtractByConjugate(b_re, b_im, re[c + 1], im[c + 1], hn::Set(d, p.re(c + 1)[k]),
                          hn::Set(d, p.im(c + 1)[k]));
    }
    hn::Store(hn::Add(a_re, b_re), d, to_re);
    hn::Store(hn::Add(a_im, b_im), d, to_im);
  }
}

bool Factor(double* matrix, std::size_t height, std::size_t unknowns, std::size_t half_bandwidth,
            double* inverse, double* y_re, double* y_im) {
  for (std::size_t j = 0; j < unknowns; j += kBlock) {
    const panel p{matrix + j * 2 * height, height};
    if (!FactorTriangle(p, inverse + j, y_re + j, y_im + j)) return false;
    for (std::size_t row = kBlock; row < height; row += hn::Lanes(Rows())) {
      EliminateRows(p, row, kBlock + half_bandwidth, inverse + j, y_re + j, y_im + j);
    }
  }
  return true;
}

// x = L^-H x
void SubstituteBack(double* matrix, std::size_t height, std::size_t unknowns, const double* inverse,
                    double* x_re, double* x_im) {
  const Rows d;
  for (std::size_t j = (unknowns - 1) / kBlock * kBlock + kBlock; j > 0;) {
    j -= kBlock;
    const panel p{matrix + j * 2 * height, height};
    for (std::size_t c = kBlock; c-- > 0;) {
      auto re = hn::Zero(d);
      auto im = hn::Zero(d);
      for (std::size_t row = kBlock; row < height; row += hn::Lanes(d)) {
        SubtractByConjugate(re, im, hn::Load(d, x_re + j + row), hn::Load(d, x_im + j + row),
                            hn::Load(d, p.re(c) + row), hn::Load(d, p.im(c) + row));
      }
      double sum_re = x_re[j + c] + hn::GetLane(hn::SumOfLanes(d, re));
      double sum_im = x_im[j + c] + hn::GetLane(hn::SumOfLanes(d, im));
      for (std::size_t r = c + 1; r < kBlock; ++r) {
        sum_re -= p.re(c)[r] * x_re[j + r] + p.im(c)[r] * x_im[j + r];
        sum_im -= p.re(c)[r] * x_im[j + r] - p.im(c)[r] * x_re[j + r];
      }
      x_re[j + c] = sum_re * inverse[j + c];
      x_im[j + c] = sum_im * inverse[j + c];
    }
  }
}

}  // namespace marrow::stabilization::HWY_NAMESPACE
HWY_AFTER_NAMESPACE();

#if HWY_ONCE
namespace marrow::stabilization {
namespace {

HWY_EXPORT(Factor);
HWY_EXPORT(SubstituteBack);

constexpr std::size_t RoundUp(std::size_t n, std::size_t step) {
  return (n + step - 1) / step * step;
}

}  // namespace

// Columns and rows behind the last unknown's block are all zero: the products of the last panels
// fall there.
hermitian_band_system::hermitian_band_system(std::size_t unknowns, std::size_t half_bandwidth)
    : unknowns_(unknowns),
      half_bandwidth_(half_bandwidth),
      height_(RoundUp(half_bandwidth + kBlock, kBlock)),
      rows_(RoundUp(unknowns, kBlock) + height_),
      matrix_(rows_ * 2 * height_ / kBlock),
      right_(2 * rows_ / kBlock),
      inverse_(rows_) {
  clear();
}

void hermitian_band_system::clear() {
  std::fill(matrix_.begin(), matrix_.end(), row_block{});
  std::fill(right_.begin(), right_.end(), row_block{});
  for (std::size_t j = unknowns_; j < RoundUp(unknowns_, kBlock); ++j) set(j, j, 1, 0);
}

bool hermitian_band_system::solve() {
  double* const matrix = column(0);
  if (!HWY_DYNAMIC_DISPATCH(Factor)(matrix, height_, unknowns_, half_bandwidth_, inverse_.data(),
                                    right_re(), right_im())) {
    return false;
  }
  HWY_DYNAMIC_DISPATCH(SubstituteBack)
  (matrix, height_, unknowns_, inverse_.data(), right_re(), right_im());
  return true;
}

}  // namespace marrow::stabilization
#endif  // HWY_ONCE
