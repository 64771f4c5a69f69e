#pragma once

#include <cstdint>
#include <span>

namespace marrow::stabilization {

// Lowers the scores, in place and in ascending order, until no two frames differ by more than their
// distance / ramp_frames. Scores are 1 to 4, so frames more than 3 * ramp_frames apart never bind.
void ramp_scores(std::span<double> scores, std::int32_t ramp_frames);

}  // namespace marrow::stabilization
