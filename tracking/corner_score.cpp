#include "tracking/corner_score.h"

#include <algorithm>
#include <bit>
#include <cmath>
#include <cstring>

#undef HWY_TARGET_INCLUDE
#define HWY_TARGET_INCLUDE "tracking/corner_score.cpp"
#include <hwy/foreach_target.h>
#include <hwy/highway.h>

HWY_BEFORE_NAMESPACE();
namespace marrow::tracking {
namespace HWY_NAMESPACE {
namespace hn = hwy::HWY_NAMESPACE;

// By rounding, the radicand of a round corner can come out below 0, and a NaN would drop the corner
// and its neighbours.
void ScoreRowKernel(const gradient_sum_row& sums, std::size_t count, float eig_ratio_threshold,
                    float* HWY_RESTRICT scores) {
  const hn::ScalableTag<float> d;
  const std::size_t N = hn::Lanes(d);
  const auto zero = hn::Zero(d);
  const auto four = hn::Set(d, 4.0f);
  const auto ratio = hn::Set(d, eig_ratio_threshold);
  std::size_t x = 0;
  for (; x + N <= count; x += N) {
    const auto a = hn::LoadU(d, sums.xx + x);
    const auto b = hn::LoadU(d, sums.yy + x);
    const auto c = hn::LoadU(d, sums.xy + x);
    const auto t = hn::Add(a, b);
    const auto determinant = hn::Sub(hn::Mul(a, b), hn::Mul(c, c));
    const auto radicand = hn::Sub(hn::Mul(t, t), hn::Mul(four, determinant));
    const auto root = hn::Sqrt(hn::Max(radicand, zero));
    const auto score = hn::Sub(t, root);
    const auto elongated = hn::Gt(hn::Add(t, root), hn::Mul(score, ratio));
    hn::StoreU(hn::IfThenZeroElse(elongated, score), d, scores + x);
  }
  for (; x < count; ++x) {
    const float a = sums.xx[x];
    const float b = sums.yy[x];
    const float c = sums.xy[x];
    const float t = a + b;
    const float root = std::sqrt(std::max(t * t - 4.0f * (a * b - c * c), 0.0f));
    const float score = t - root;
    scores[x] = t + root > score * eig_ratio_threshold ? 0.0f : score;
  }
}

void FindMaximaKernel(const float* above, const float* row, const float* below, std::size_t count,
                      float least, std::vector<std::uint32_t>& columns) {
  const hn::ScalableTag<float> d;
  const std::size_t N = hn::Lanes(d);
  const auto floor = hn::Set(d, least);
  std::size_t x = 1;
  for (; x + N < count; x += N) {
    const auto scores = hn::LoadU(d, row + x);
    const auto too_low = hn::Lt(scores, floor);
    if (hn::AllTrue(d, too_low)) continue;  // flat surfaces and straight edges
    const auto side = [&](const float* p) HWY_ATTR {
      return hn::Max(hn::LoadU(d, p + x - 1), hn::LoadU(d, p + x + 1));
    };
    const auto vertical = hn::Max(hn::LoadU(d, above + x), hn::LoadU(d, below + x));
    const auto sides = hn::Max(hn::Max(side(above), side(below)), side(row));
    const auto is_maximum = hn::AndNot(too_low, hn::Gt(scores, hn::Max(vertical, sides)));
    if (hn::AllFalse(d, is_maximum)) continue;
    std::uint8_t bits[8] = {};
    hn::StoreMaskBits(d, is_maximum, bits);
    std::uint64_t lanes = 0;
    std::memcpy(&lanes, bits, sizeof(bits));
    for (; lanes != 0; lanes &= lanes - 1) {
      columns.push_back(
          static_cast<std::uint32_t>(x + static_cast<std::size_t>(std::countr_zero(lanes))));
    }
  }
  for (; x + 1 < count; ++x) {
    const float best = std::max({above[x - 1], above[x], above[x + 1], row[x - 1], row[x + 1],
                                 below[x - 1], below[x], below[x + 1]});
    if (row[x] > best && !(row[x] < least)) columns.push_back(static_cast<std::uint32_t>(x));
  }
}

}  // namespace HWY_NAMESPACE
}  // namespace marrow::tracking
HWY_AFTER_NAMESPACE();

#if HWY_ONCE
namespace marrow::tracking {

HWY_EXPORT(ScoreRowKernel);
HWY_EXPORT(FindMaximaKernel);

void ScoreRow(const gradient_sum_row& sums, std::size_t count, float eig_ratio_threshold,
              float* scores) {
  HWY_DYNAMIC_DISPATCH(ScoreRowKernel)(sums, count, eig_ratio_threshold, scores);
}

void FindMaxima(const float* above, const float* row, const float* below, std::size_t count,
                float least, std::vector<std::uint32_t>& columns) {
  HWY_DYNAMIC_DISPATCH(FindMaximaKernel)(above, row, below, count, least, columns);
}

}  // namespace marrow::tracking
#endif  // HWY_ONCE
