#include "tracking/gradient_sums.h"

#include <algorithm>

#undef HWY_TARGET_INCLUDE
#define HWY_TARGET_INCLUDE "tracking/gradient_sums.cpp"
#include <hwy/foreach_target.h>
#include <hwy/highway.h>

HWY_BEFORE_NAMESPACE();
namespace marrow::tracking {
namespace HWY_NAMESPACE {
namespace hn = hwy::HWY_NAMESPACE;

// Products of `count` pixels of `row`, interleaved with a fourth 0. Reads one pixel to each side.
void GradientProducts(const float* row, std::size_t stride, std::size_t count,
                      float* HWY_RESTRICT products) {
  const hn::ScalableTag<float> d;
  const std::size_t N = hn::Lanes(d);
  const float* above = row - stride;
  const float* below = row + stride;
  std::size_t x = 0;
  for (; x + N <= count; x += N) {
    const auto ix = hn::Sub(hn::LoadU(d, row + x + 1), hn::LoadU(d, row + x - 1));
    const auto iy = hn::Sub(hn::LoadU(d, below + x), hn::LoadU(d, above + x));
    hn::StoreInterleaved4(hn::Mul(ix, ix), hn::Mul(iy, iy), hn::Mul(ix, iy), hn::Zero(d), d,
                          products + 4 * x);
  }
  for (; x < count; ++x) {
    const float ix = row[x + 1] - row[x - 1];
    const float iy = below[x] - above[x];
    products[4 * x] = ix * ix;
    products[4 * x + 1] = iy * iy;
    products[4 * x + 2] = ix * iy;
    products[4 * x + 3] = 0.0f;
  }
}

void AddToColumns(const float* HWY_RESTRICT entering, std::size_t columns,
                  double* HWY_RESTRICT column_sums) {
  const hn::CappedTag<double, 4> d;
  const hn::Rebind<float, decltype(d)> df;
  const std::size_t N = hn::Lanes(d);
  for (std::size_t i = 0; i < 4 * columns; i += N) {
    const auto sum =
        hn::Add(hn::LoadU(d, column_sums + i), hn::PromoteTo(d, hn::LoadU(df, entering + i)));
    hn::StoreU(sum, d, column_sums + i);
  }
}

// Runs along a row with the sum over `window` columns; with kMove, each column's sum is first moved
// down by one image row. A pixel's sums stand together in one vector (or two, or four), so that one
// serial chain of additions carries them all.
template <bool kMove>
HWY_INLINE void SumRow(const float* HWY_RESTRICT entering, const float* HWY_RESTRICT leaving,
                       std::size_t columns, std::size_t window, double* HWY_RESTRICT column_sums,
                       float* HWY_RESTRICT sums) {
  const hn::CappedTag<double, 4> d;
  const hn::Rebind<float, decltype(d)> df;
  constexpr std::size_t N = hn::MaxLanes(decltype(d)());
  constexpr std::size_t kParts = 4 / N;
  hn::Vec<decltype(d)> running[kParts];
  for (std::size_t p = 0; p < kParts; ++p) running[p] = hn::Zero(d);

  const auto column = [&](std::size_t i) HWY_ATTR {
    auto sum = hn::LoadU(d, column_sums + i);
    if constexpr (kMove) {
      sum = hn::Add(sum, hn::Sub(hn::PromoteTo(d, hn::LoadU(df, entering + i)),
                                 hn::PromoteTo(d, hn::LoadU(df, leaving + i))));
      hn::StoreU(sum, d, column_sums + i);
    }
    return sum;
  };
  for (std::size_t x = 0; x < window; ++x) {
    for (std::size_t p = 0; p < kParts; ++p) {
      running[p] = hn::Add(running[p], column(4 * x + p * N));
    }
  }
  for (std::size_t p = 0; p < kParts; ++p) {
    hn::StoreU(hn::DemoteTo(df, running[p]), df, sums + p * N);
  }
  for (std::size_t x = window; x < columns; ++x) {
    for (std::size_t p = 0; p < kParts; ++p) {
      const std::size_t i = 4 * x + p * N;
      const auto change = hn::Sub(column(i), hn::LoadU(d, column_sums + i - 4 * window));
      running[p] = hn::Add(running[p], change);
      hn::StoreU(hn::DemoteTo(df, running[p]), df, sums + i - 4 * (window - 1));
    }
  }
}

void SumFirstRow(std::size_t columns, std::size_t window, double* column_sums, float* sums) {
  SumRow<false>(nullptr, nullptr, columns, window, column_sums, sums);
}

void SumNextRow(const float* entering, const float* leaving, std::size_t columns,
                std::size_t window, double* column_sums, float* sums) {
  SumRow<true>(entering, leaving, columns, window, column_sums, sums);
}

}  // namespace HWY_NAMESPACE
}  // namespace marrow::tracking
HWY_AFTER_NAMESPACE();

#if HWY_ONCE
namespace marrow::tracking {
namespace {

HWY_EXPORT(GradientProducts);
HWY_EXPORT(AddToColumns);
HWY_EXPORT(SumFirstRow);
HWY_EXPORT(SumNextRow);

}  // namespace

GradientSums::GradientSums(std::size_t half_win_x, std::size_t half_win_y, std::size_t max_width)
    : half_win_x_(half_win_x),
      half_win_y_(half_win_y),
      entering_(4 * max_width),
      leaving_(4 * max_width),
      sums_(4 * max_width),
      column_sums_(4 * max_width) {}

void GradientSums::Start(const float* image, std::size_t stride, const PixelRegion& region) {
  image_ = image;
  stride_ = stride;
  first_column_ = region.x0 - half_win_x_;
  columns_ = region.x1 - region.x0 + 2 * half_win_x_;
  y_ = region.y0;
  started_ = false;
  std::fill(column_sums_.begin(), column_sums_.end(), 0.0);
}

void GradientSums::FormProducts(std::size_t y, float* products) const {
  HWY_DYNAMIC_DISPATCH(GradientProducts)
  (image_ + y * stride_ + first_column_, stride_, columns_, products);
}

const float* GradientSums::NextRow() {
  const std::size_t window = 2 * half_win_x_ + 1;
  if (!started_) {
    for (std::size_t y = y_ - half_win_y_; y <= y_ + half_win_y_; ++y) {
      FormProducts(y, entering_.data());
      HWY_DYNAMIC_DISPATCH(AddToColumns)(entering_.data(), columns_, column_sums_.data());
    }
    HWY_DYNAMIC_DISPATCH(SumFirstRow)(columns_, window, column_sums_.data(), sums_.data());
    started_ = true;
  } else {
    FormProducts(y_ + half_win_y_, entering_.data());
    FormProducts(y_ - half_win_y_ - 1, leaving_.data());
    HWY_DYNAMIC_DISPATCH(SumNextRow)
    (entering_.data(), leaving_.data(), columns_, window, column_sums_.data(), sums_.data());
  }
  ++y_;
  return sums_.data();
}

}  // namespace marrow::tracking
#endif  // HWY_ONCE
