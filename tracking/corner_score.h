#pragma once

#include <cstddef>
#include <cstdint>
#include <vector>

#include "tracking/gradient_sums.h"

namespace marrow::tracking {

// Twice the smaller eigenvalue of each gradient matrix (Shi and Tomasi, 1994): with a, b, c the
// sums of Ix Ix, Iy Iy, Ix Iy, t = a + b and d = sqrt(t t - 4 (a b - c c)), the score is t - d. It
// is 0 where the structure is too elongated, that is where t + d > score * eig_ratio_threshold.
void ScoreRow(const gradient_sum_row& sums, std::size_t count, float eig_ratio_threshold,
              float* scores);

// Appends to `columns`, ascending, the x from 1 to count - 2 at which `row` is strictly above its 8
// neighbours and not under `least`. Each row has `count` scores.
void FindMaxima(const float* above, const float* row, const float* below, std::size_t count,
                float least, std::vector<std::uint32_t>& columns);

}  // namespace marrow::tracking
