#include "tracking/gradient_sums.h"

#include <algorithm>
#include <utility>

#undef HWY_TARGET_INCLUDE
#define HWY_TARGET_INCLUDE "tracking/gradient_sums.cpp"
#include <hwy/foreach_target.h>
#include <hwy/highway.h>

HWY_BEFORE_NAMESPACE();
namespace marrow::tracking {
namespace HWY_NAMESPACE {
namespace hn = hwy::HWY_NAMESPACE;

// Lanes of the sums. The products' vectors have as many floats.
using Sums = hn::CappedTag<double, 8>;

template <class D>
struct Products {
  hn::Vec<D> xx, yy, xy;
};

// Of the pixels from column x: reads one pixel more to each side.
template <class D>
HWY_INLINE Products<D> ProductsAt(D d, const row_triple& rows, std::size_t x) {
  const float* row = rows.row + x;
  const auto ix = hn::Sub(hn::LoadU(d, row + 1), hn::LoadU(d, row - 1));
  const auto iy = hn::Sub(hn::LoadU(d, rows.below + x), hn::LoadU(d, rows.above + x));
  return {hn::Mul(ix, ix), hn::Mul(iy, iy), hn::Mul(ix, iy)};
}

// Adds an image row's products to the sums of their columns and, with kMove, takes another's away.
template <bool kMove, class D>
HWY_INLINE void UpdateColumns(D d, const row_triple& entering, const row_triple& leaving,
                              std::size_t x, std::size_t plane, double* column) {
  const hn::Rebind<float, D> df;
  const auto in = ProductsAt(df, entering, x);
  if constexpr (kMove) {
    const auto out = ProductsAt(df, leaving, x);
    const auto move = [&](auto from, auto to, double* sum) HWY_ATTR {
      const auto change = hn::Sub(hn::PromoteTo(d, from), hn::PromoteTo(d, to));
      hn::StoreU(hn::Add(hn::LoadU(d, sum), change), d, sum);
    };
    move(in.xx, out.xx, column);
    move(in.yy, out.yy, column + plane);
    move(in.xy, out.xy, column + 2 * plane);
  } else {
    const auto add = [&](auto from, double* sum) HWY_ATTR {
      hn::StoreU(hn::Add(hn::LoadU(d, sum), hn::PromoteTo(d, from)), d, sum);
    };
    add(in.xx, column);
    add(in.yy, column + plane);
    add(in.xy, column + 2 * plane);
  }
}

// v with lane j moved to lane j + kShift, and 0 in the first ones.
template <std::size_t kShift, class D, class V>
HWY_INLINE V MoveUp(D d, V v) {
  const hn::RebindToSigned<D> di;
  const auto lane = hn::Iota(di, 0);
  const auto shift = hn::Set(di, static_cast<std::int64_t>(kShift));
  const auto from = hn::Max(hn::Sub(lane, shift), hn::Zero(di));
  const auto moved = hn::TableLookupLanes(v, hn::IndicesFromVec(d, from));
  return hn::IfThenElseZero(hn::RebindMask(d, hn::Gt(hn::Iota(di, 1), shift)), moved);
}

template <class D, class V>
HWY_INLINE V LastLane(D d, V v) {
  const hn::RebindToSigned<D> di;
  const auto last = hn::Set(di, static_cast<std::int64_t>(hn::Lanes(d)) - 1);
  return hn::TableLookupLanes(v, hn::IndicesFromVec(d, last));
}

// Runs along a row with the sum over the window's columns, a vector of places at a time: their
// differences from the place before are added up within the vector, then to the sum so far. With
// kMove the columns' sums are first moved down by one image row.
template <bool kMove>
HWY_INLINE void SumRow(const gradient_sum_planes& planes, const row_triple& entering,
                       const row_triple& leaving, double* column_sums, float* sums) {
  const Sums d;
  const hn::Rebind<float, Sums> df;
  constexpr std::size_t N = hn::MaxLanes(Sums());
  double* columns = column_sums + planes.window;
  hn::Vec<Sums> running[3] = {hn::Zero(d), hn::Zero(d), hn::Zero(d)};
  const auto sum_window = [&](std::size_t x) HWY_ATTR {
    for (std::size_t p = 0; p < 3; ++p) {
      const double* column = columns + p * planes.column_stride + x;
      auto change = hn::Sub(hn::LoadU(d, column), hn::LoadU(d, column - planes.window));
      if constexpr (N > 1) change = hn::Add(change, MoveUp<1>(d, change));
      if constexpr (N > 2) change = hn::Add(change, MoveUp<2>(d, change));
      if constexpr (N > 4) change = hn::Add(change, MoveUp<4>(d, change));
      const auto sum = hn::Add(running[p], change);
      hn::StoreU(hn::DemoteTo(df, sum), df, sums + p * planes.sum_stride + x);
      running[p] = LastLane(d, sum);
    }
  };
  std::size_t x = 0;
  for (; x + N <= planes.columns; x += N) {
    if constexpr (kMove) {
      UpdateColumns<true>(d, entering, leaving, x, planes.column_stride, columns + x);
    }
    sum_window(x);
  }
  if (x == planes.columns) return;
  if constexpr (kMove) {
    for (std::size_t i = x; i < planes.columns; ++i) {
      UpdateColumns<true>(hn::CappedTag<double, 1>(), entering, leaving, i, planes.column_stride,
                          columns + i);
    }
  }
  sum_window(x);
}

void AddToColumns(const gradient_sum_planes& planes, const row_triple& entering,
                  double* column_sums) {
  const Sums d;
  const std::size_t N = hn::Lanes(d);
  double* columns = column_sums + planes.window;
  std::size_t x = 0;
  for (; x + N <= planes.columns; x += N) {
    UpdateColumns<false>(d, entering, {}, x, planes.column_stride, columns + x);
  }
  for (; x < planes.columns; ++x) {
    UpdateColumns<false>(hn::CappedTag<double, 1>(), entering, {}, x, planes.column_stride,
                         columns + x);
  }
}

void SumFirstRow(const gradient_sum_planes& planes, double* column_sums, float* sums) {
  SumRow<false>(planes, {}, {}, column_sums, sums);
}

void SumNextRow(const gradient_sum_planes& planes, const row_triple& entering,
                const row_triple& leaving, double* column_sums, float* sums) {
  SumRow<true>(planes, entering, leaving, column_sums, sums);
}

}  // namespace HWY_NAMESPACE
}  // namespace marrow::tracking
HWY_AFTER_NAMESPACE();

#if HWY_ONCE
namespace marrow::tracking {
namespace {

HWY_EXPORT(AddToColumns);
HWY_EXPORT(SumFirstRow);
HWY_EXPORT(SumNextRow);

constexpr std::size_t kMostLanes = 8;

}  // namespace

GradientSums::GradientSums(std::size_t half_win_x, std::size_t half_win_y, std::size_t max_width)
    : half_win_x_(half_win_x),
      half_win_y_(half_win_y),
      planes_{0, 2 * half_win_x + 1, 2 * half_win_x + 1 + max_width + kMostLanes,
              max_width + kMostLanes},
      column_sums_(3 * planes_.column_stride),
      sums_(3 * planes_.sum_stride) {}

void GradientSums::Start(ImageRows rows, const PixelRegion& region) {
  rows_ = std::move(rows);
  planes_.columns = region.x1 - region.x0 + 2 * half_win_x_;
  left_ = region.x0 - half_win_x_;
  window_top_ = region.y0 - half_win_y_;
  started_ = false;
  std::fill(column_sums_.begin(), column_sums_.end(), 0.0);
}

// The lowest one first: what it pushes out is not read again.
row_triple GradientSums::RowsAbout(std::size_t y) const {
  const float* below = rows_(y + 1) + left_;
  return {rows_(y - 1) + left_, rows_(y) + left_, below};
}

gradient_sum_row GradientSums::NextRow() {
  const std::size_t window_rows = 2 * half_win_y_ + 1;
  if (!started_) {
    for (std::size_t v = 0; v < window_rows; ++v) {
      HWY_DYNAMIC_DISPATCH(AddToColumns)
      (planes_, RowsAbout(window_top_ + v), column_sums_.data());
    }
    HWY_DYNAMIC_DISPATCH(SumFirstRow)(planes_, column_sums_.data(), sums_.data());
    started_ = true;
  } else {
    const row_triple entering = RowsAbout(window_top_ + window_rows);
    HWY_DYNAMIC_DISPATCH(SumNextRow)
    (planes_, entering, RowsAbout(window_top_), column_sums_.data(), sums_.data());
    ++window_top_;
  }
  const float* first = sums_.data() + 2 * half_win_x_;
  return {first, first + planes_.sum_stride, first + 2 * planes_.sum_stride};
}

}  // namespace marrow::tracking
#endif  // HWY_ONCE
