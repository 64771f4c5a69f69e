#pragma once

#include <cstddef>
#include <cstdint>
#include <vector>

#include "tracking/folded_rows.h"

namespace marrow::tracking {

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
