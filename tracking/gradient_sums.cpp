#include "tracking/gradient_sums.h"

#include <algorithm>
#include <type_traits>
#include <utility>

#undef HWY_TARGET_INCLUDE
#define HWY_TARGET_INCLUDE "tracking/gradient_sums.cpp"
#include <hwy/foreach_target.h>
#include <hwy/highway.h>

#include "tracking/corner_score-inl.h"
#include "tracking/multiplier_add-inl.h"

HWY_BEFORE_NAMESPACE();
namespace marrow::tracking {
namespace HWY_NAMESPACE {
namespace hn = hwy::HWY_NAMESPACE;

constexpr std::size_t kSegments = RowFolding::kSegments;
using Floats = hn::CappedTag<float, kSegments>;
using Vec = hn::Vec<Floats>;

struct Matrix {
  Vec xx, yy, xy;
};

HWY_INLINE Matrix Add(const Matrix& a, const Matrix& b) {
  return {hn::Add(a.xx, b.xx), hn::Add(a.yy, b.yy), hn::Add(a.xy, b.xy)};
}

HWY_INLINE Matrix AddByMultiplier(const Matrix& a, const Matrix& b) {
  const Floats d;
  return {AddByMultiplier(d, a.xx, b.xx), AddByMultiplier(d, a.yy, b.yy),
          AddByMultiplier(d, a.xy, b.xy)};
}

HWY_INLINE Matrix Zeroes() {
  const Floats d;
  return {hn::Zero(d), hn::Zero(d), hn::Zero(d)};
}

HWY_INLINE Matrix LoadMatrix(const float* planes, std::size_t stride) {
  const Floats d;
  return {hn::LoadU(d, planes), hn::LoadU(d, planes + stride), hn::LoadU(d, planes + 2 * stride)};
}

HWY_INLINE void StoreMatrix(const Matrix& m, float* planes, std::size_t stride) {
  const Floats d;
  hn::StoreU(m.xx, d, planes);
  hn::StoreU(m.yy, d, planes + stride);
  hn::StoreU(m.xy, d, planes + 2 * stride);
}

// Of a pixel's differences along x and y; `row` lies between the other two.
HWY_INLINE Matrix Products(Vec above, const float* row, Vec below) {
  const Floats d;
  const auto ix = hn::Sub(hn::LoadU(d, row + kSegments), hn::LoadU(d, row - kSegments));
  const auto iy = hn::Sub(below, above);
  return {hn::Mul(ix, ix), hn::Mul(iy, iy), hn::Mul(ix, iy)};
}

// Runs over kRows rows, rows[0] above the first of them, with the sum of `first`, if there is one,
// and the products so far: downwards, or with kUp from the lowest row upwards. take(row, sum).
template <std::size_t kRows, bool kUp, class Take>
HWY_INLINE void SumProducts(const float* const* rows, std::size_t i, const Matrix* first,
                            Take take) {
  const Floats d;
  const auto at = [=](std::size_t j) HWY_ATTR { return rows[kUp ? kRows + 1 - j : j] + i; };
  Matrix sum;
  auto behind = hn::LoadU(d, at(0));
  auto middle = hn::LoadU(d, at(1));
  for (std::size_t j = 0; j < kRows; ++j) {
    const auto ahead = hn::LoadU(d, at(j + 2));
    const Matrix m = kUp ? Products(ahead, at(j + 1), behind) : Products(behind, at(j + 1), ahead);
    sum = j > 0 ? Add(sum, m) : first ? Add(*first, m) : m;
    take(kUp ? kRows - 1 - j : j, sum);
    behind = middle;
    middle = ahead;
  }
}

// Windows one below the other, kGroup of them. kRest: how many rows of the first one lie below its
// last whole group.
template <std::size_t kGroup, std::size_t kRest>
HWY_INLINE void SumColumnWindows(const column_window& w) {
  // The last window's, and a group at least, which the windows to come hold as a whole.
  constexpr std::size_t kEntering = std::max(kGroup, kRest + kGroup - 1);
  for (std::size_t i = 0; i < w.count; i += hn::Lanes(Floats())) {
    // Zeroes that compilers ask for: each is set before it is read.
    Matrix windows[kGroup], group = Zeroes(), start = Zeroes(), whole = Zeroes();
    if (w.ends) {
      whole = LoadMatrix(w.ends + i, w.group_stride);
      if (w.block_start) {
        start = LoadMatrix(w.block_start + i, w.group_stride);
        whole = Add(whole, start);
      }
    }
    SumProducts<kGroup, true>(w.leaving, i, w.ends ? &whole : nullptr,
                              [&](std::size_t row, const Matrix& sum)
                                  HWY_ATTR { windows[row] = sum; });
    const auto enter = [&](std::size_t row, const Matrix& sum) HWY_ATTR {
      const std::size_t rows = row + 1;
      if (rows == kGroup) group = sum;
      if (kRest == 0 || rows < kRest || rows - kRest >= kGroup) return;
      Matrix& window = windows[rows - kRest];
      window = AddByMultiplier(window, sum);
    };
    SumProducts<kEntering, false>(w.entering, i, nullptr, enter);
    for (std::size_t j = 0; j < kGroup; ++j) {
      StoreMatrix(windows[j], w.sums + 3 * j * w.sum_stride + i, w.sum_stride);
    }
    if (w.ends) {
      StoreMatrix(group, w.group + i, w.group_stride);
      StoreMatrix(w.block_start ? Add(start, group) : group, w.next_block_start + i,
                  w.group_stride);
    }
  }
}

template <std::size_t kValue>
using Constant = std::integral_constant<std::size_t, kValue>;

// call(group, rest), as constants. See GroupFor.
template <class Call>
HWY_INLINE void WithGroup(std::size_t group, std::size_t rest, Call call) {
  if (group == 6) {
    call(Constant<6>(), Constant<1>());
  } else if (group == 1) {
    call(Constant<1>(), Constant<0>());
  } else if (rest == 1) {
    call(Constant<4>(), Constant<1>());
  } else {
    call(Constant<4>(), Constant<3>());
  }
}

void SumColumns(const column_window& w, std::size_t group, std::size_t rest) {
  WithGroup(group, rest, [&w](auto g, auto r) HWY_ATTR { SumColumnWindows<g(), r()>(w); });
}

void SumGroup(const float* const* rows, std::size_t group_rows, std::size_t count, float* group,
              std::size_t stride) {
  WithGroup(group_rows, 1, [=](auto g, auto) HWY_ATTR {
    for (std::size_t i = 0; i < count; i += hn::Lanes(Floats())) {
      Matrix sum;
      SumProducts<g(), false>(rows, i, nullptr,
                              [&](std::size_t, const Matrix& so_far) HWY_ATTR { sum = so_far; });
      StoreMatrix(sum, group + i, stride);
    }
  });
}

// Turns the sums of a block's groups into sums from each group to the end of the block.
void SumToEnds(std::size_t groups, std::size_t count, float* planes, std::size_t stride) {
  const Floats d;
  for (std::size_t p = 0; p < 3; ++p) {
    for (std::size_t i = 0; i < count; i += hn::Lanes(d)) {
      float* at = planes + (3 * (groups - 1) + p) * stride + i;
      auto sum = hn::LoadU(d, at);
      for (std::size_t g = groups - 1; g > 0; --g) {
        at -= 3 * stride;
        sum = hn::Add(hn::LoadU(d, at), sum);
        hn::StoreU(sum, d, at);
      }
    }
  }
}

// Windows along x, and their scores. `columns` begins half a window before the first position;
// `ends` has room for a window.
void ScoreRow(const float* HWY_RESTRICT columns, std::size_t column_stride, std::size_t window,
              std::size_t positions, float* HWY_RESTRICT ends, float most_ratio,
              float* HWY_RESTRICT scores) {
  const Floats d;
  const auto ratio = hn::Set(d, most_ratio);
  const auto score = [=](std::size_t i, const Matrix& m) HWY_ATTR {
    hn::StoreU(CornerScore(d, m.xx, m.yy, m.xy, ratio), d, scores + i);
  };
  const std::size_t ends_stride = window * kSegments;
  for (std::size_t first = 0; first < positions; first += window) {
    const std::size_t here = std::min(window, positions - first);
    for (std::size_t i = 0; i < kSegments; i += hn::Lanes(d)) {
      const float* block = columns + first * kSegments + i;
      Matrix sum = LoadMatrix(block + (window - 1) * kSegments, column_stride);
      StoreMatrix(sum, ends + (window - 1) * kSegments + i, ends_stride);
      for (std::size_t p = window - 1; p > 0; --p) {
        sum = Add(LoadMatrix(block + (p - 1) * kSegments, column_stride), sum);
        StoreMatrix(sum, ends + (p - 1) * kSegments + i, ends_stride);
      }
      score(first * kSegments + i, sum);
      const float* next = block + window * kSegments;
      Matrix start;
      for (std::size_t p = 1; p < here; ++p) {
        const Matrix m = LoadMatrix(next + (p - 1) * kSegments, column_stride);
        start = p == 1 ? m : Add(start, m);
        score((first + p) * kSegments + i,
              AddByMultiplier(LoadMatrix(ends + p * kSegments + i, ends_stride), start));
      }
    }
  }
}

}  // namespace HWY_NAMESPACE
}  // namespace marrow::tracking
HWY_AFTER_NAMESPACE();

#if HWY_ONCE
namespace marrow::tracking {
namespace {

HWY_EXPORT(SumColumns);
HWY_EXPORT(SumGroup);
HWY_EXPORT(SumToEnds);
HWY_EXPORT(ScoreRow);

constexpr std::size_t kMostGroup = 6;

// Rows in a group. Of a window of whole groups and one row, as many rows enter as leave; with three
// rows over, two of those that enter are formed a second time for the next group.
std::size_t GroupFor(std::size_t window) {
  if (window < 5) return 1;
  return window % 6 == 1 ? 6 : 4;
}

}  // namespace

GradientSums::GradientSums(std::size_t half_win_x, std::size_t half_win_y, std::size_t max_width)
    : window_x_(2 * half_win_x + 1),
      window_y_(2 * half_win_y + 1),
      group_(GroupFor(window_y_)),
      rest_(group_ == 1 ? 0 : window_y_ % group_),
      whole_(window_y_ / group_ - 1) {
  const std::size_t positions = RowFolding{max_width}.positions();
  group_stride_ = FoldedStride(positions);
  column_stride_ = FoldedStride(positions + window_x_ - 1);
  groups_.resize(whole_ * 3 * group_stride_);
  block_start_.resize(3 * group_stride_);
  column_sums_.resize(group_ * 3 * column_stride_);
  ends_.resize(3 * window_x_ * RowFolding::kSegments);
}

void GradientSums::Start(ImageRows image, std::size_t columns, std::size_t first_row,
                         std::size_t rows) {
  image_ = std::move(image);
  positions_ = RowFolding{columns}.positions();
  window_top_ = first_row - window_y_ / 2;
  last_row_ = first_row + rows + window_y_ / 2;
  next_ = 0;
}

const float* GradientSums::NextColumnSums() {
  if (next_ % group_ == 0) SumNextColumns();
  return column_sums_.data() + next_++ % group_ * 3 * column_stride_;
}

void GradientSums::NextScores(float eig_ratio_threshold, float* scores) {
  HWY_DYNAMIC_DISPATCH(ScoreRow)
  (NextColumnSums(), column_stride_, window_x_, positions_, ends_.data(), eig_ratio_threshold,
   scores);
}

// Past the last row that windows depend on, it repeats: for rows of a group that nobody asks for.
void GradientSums::FindRows(std::size_t first, std::size_t count, const float** rows) const {
  for (std::size_t j = 0; j < count; ++j) rows[j] = image_(std::min(first + j, last_row_));
}

void GradientSums::SumNextColumns() {
  const std::size_t group_index = next_ / group_;
  const std::size_t count = positions_ * RowFolding::kSegments;
  if (group_index == 0) SumFirstGroups();

  // The lowest row first: what it pushes out is not read again.
  const float* rows[2 * kMostGroup + 6];
  const std::size_t leaving = group_ + 2;
  const std::size_t entering = std::max(group_, group_ + rest_ - 1) + 2;
  FindRows(window_top_ + (whole_ + 1) * group_ - 1, entering, rows + leaving);
  FindRows(window_top_ - 1, leaving, rows);

  column_window w{};
  w.count = count;
  w.leaving = rows;
  w.entering = rows + leaving;
  if (whole_ > 0) {
    const std::size_t in_block = group_index % whole_;
    w.ends = w.group = GroupSums(in_block);
    w.block_start = in_block > 0 ? block_start_.data() : nullptr;
    w.next_block_start = block_start_.data();
  }
  w.group_stride = group_stride_;
  w.sums = column_sums_.data() + (window_x_ / 2) * RowFolding::kSegments;
  w.sum_stride = column_stride_;
  HWY_DYNAMIC_DISPATCH(SumColumns)(w, group_, rest_);
  if (whole_ > 0 && group_index % whole_ == whole_ - 1) {
    HWY_DYNAMIC_DISPATCH(SumToEnds)(whole_, count, groups_.data(), group_stride_);
  }
  for (std::size_t plane = 0; plane < 3 * group_; ++plane) {
    FillHalo(w.sums + plane * column_stride_, positions_, window_x_ / 2, 0.0f, 0.0f);
  }
  window_top_ += group_;
}

// Those that lie wholly inside the windows of the first group of rows.
void GradientSums::SumFirstGroups() {
  if (whole_ == 0) return;
  const std::size_t count = positions_ * RowFolding::kSegments;
  const float* rows[kMostGroup + 2];
  for (std::size_t g = 0; g < whole_; ++g) {
    FindRows(window_top_ + (g + 1) * group_ - 1, group_ + 2, rows);
    HWY_DYNAMIC_DISPATCH(SumGroup)(rows, group_, count, GroupSums(g), group_stride_);
  }
  HWY_DYNAMIC_DISPATCH(SumToEnds)(whole_, count, groups_.data(), group_stride_);
}

}  // namespace marrow::tracking
#endif  // HWY_ONCE
