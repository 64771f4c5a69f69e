#include "tracking/score_maxima.h"

#include <bit>
#include <cstring>

#undef HWY_TARGET_INCLUDE
#define HWY_TARGET_INCLUDE "tracking/score_maxima.cpp"
#include <hwy/foreach_target.h>
#include <hwy/highway.h>

HWY_BEFORE_NAMESPACE();
namespace marrow::tracking {
namespace HWY_NAMESPACE {
namespace hn = hwy::HWY_NAMESPACE;

constexpr std::size_t kSegments = RowFolding::kSegments;
using Floats = hn::CappedTag<float, kSegments>;

void FindMaximaKernel(const float* above, const float* row, const float* below,
                      const RowFolding& folding, std::size_t first, std::size_t last, float least,
                      std::vector<score_maximum>& maxima) {
  const Floats d;
  const std::size_t N = hn::Lanes(d);
  const auto floor = hn::Set(d, least);
  const std::size_t count = folding.positions() * kSegments;
  for (std::size_t lanes_from = 0; lanes_from < kSegments; lanes_from += N) {
    // Of a position: the larger of the scores above and below, and of all three.
    const auto outer = [&](std::ptrdiff_t i) HWY_ATTR {
      return hn::Max(hn::LoadU(d, above + i), hn::LoadU(d, below + i));
    };
    const auto start = static_cast<std::ptrdiff_t>(lanes_from);
    constexpr auto kStep = static_cast<std::ptrdiff_t>(kSegments);
    auto scores = hn::LoadU(d, row + lanes_from);
    auto outer_here = outer(start);
    auto left = hn::Max(outer(start - kStep), hn::LoadU(d, row + (start - kStep)));
    auto here = hn::Max(outer_here, scores);
    for (std::size_t i = lanes_from; i < count; i += kSegments) {
      const auto next_scores = hn::LoadU(d, row + i + kSegments);
      const auto outer_right = outer(static_cast<std::ptrdiff_t>(i) + kStep);
      const auto right = hn::Max(outer_right, next_scores);
      const auto neighbours = hn::Max(outer_here, hn::Max(left, right));
      const auto is_maximum = hn::AndNot(hn::Lt(scores, floor), hn::Gt(scores, neighbours));
      if (HWY_UNLIKELY(!hn::AllFalse(d, is_maximum))) {
        std::uint8_t bits[8] = {};
        hn::StoreMaskBits(d, is_maximum, bits);
        std::uint64_t lanes = 0;
        std::memcpy(&lanes, bits, sizeof(bits));
        for (; lanes != 0; lanes &= lanes - 1) {
          const std::size_t index = i + static_cast<std::size_t>(std::countr_zero(lanes));
          const std::size_t column = folding.ColumnAt(index);
          if (column <= first || column >= last) continue;
          maxima.push_back({static_cast<std::uint32_t>(column), row[index]});
        }
      }
      scores = next_scores;
      outer_here = outer_right;
      left = here;
      here = right;
    }
  }
}

}  // namespace HWY_NAMESPACE
}  // namespace marrow::tracking
HWY_AFTER_NAMESPACE();

#if HWY_ONCE
namespace marrow::tracking {

HWY_EXPORT(FindMaximaKernel);

void FindMaxima(const float* above, const float* row, const float* below, const RowFolding& folding,
                std::size_t first, std::size_t last, float least,
                std::vector<score_maximum>& maxima) {
  HWY_DYNAMIC_DISPATCH(FindMaximaKernel)
  (above, row, below, folding, first, last, least, maxima);
}

}  // namespace marrow::tracking
#endif  // HWY_ONCE
