#pragma once

#include <cstdint>
#include <span>

#include "stabilization/displacements.h"
#include "stabilization/progress.h"

namespace marrow::stabilization {

// The median residual, in pixels, of a list about its similarity. Marks entries farther off than
// three times the unit d = max(median, 0.5) as outliers and multiplies their weight by
// exp(-2 (r - 3)), r the distance in units, or by 0 from r = 4.75. Lists of fewer than 6 are left
// alone, with 0.
double medianDeviation(std::span<Displacement> list);

// Lets every outlier of frames [first, end) fade in and out along its track: k frames away, inside
// that range, the weight is at most k / ramp_frames more than the outlier's, for k up to
// ramp_frames.
void fade_about_outliers(
    displacement_lists& lists, std::int32_t first, std::int32_t end, std::int32_t ramp_frames,
    const progress_functor& progress = [] {});

}  // namespace marrow::stabilization
