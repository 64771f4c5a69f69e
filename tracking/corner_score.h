#pragma once

#include <cstddef>
#include <cstdint>
#include <vector>

#include "tracking/gradient_sums.h"

namespace marrow::tracking {

// Twice the smaller eigenvalue of each gradient matrix (Shi and Tomasi, 1994): with a, b, c the
// sums of Ix Ix, Iy Iy, Ix Iy, t = a + b and d = sqrt(t t - 4 (a b - c c)), the score is t - d. It
// is 0 where the structure is too elongated, that is where t + d > score * eig_ratio_threshold.
// `count`, of values, is a multiple of RowFolding::kSegments.
void ScoreRow(const gradient_sum_row& sums, std::size_t count, float eig_ratio_threshold,
              float* scores);

struct score_maximum {
  std::uint32_t column;
  float score;
};

// Appends, in no order, the places strictly between columns `first` and `last` at which `row` is
// strictly above its 8 neighbours and not under `least`. Rows are folded with a halo of one
// position.
void FindMaxima(const float* above, const float* row, const float* below, const RowFolding& folding,
                std::size_t first, std::size_t last, float least,
                std::vector<score_maximum>& maxima);

}  // namespace marrow::tracking
