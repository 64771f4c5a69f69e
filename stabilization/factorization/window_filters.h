#pragma once

#include <cstdint>

#include "stabilization/progress.h"
#include "stabilization/solve_records.h"
#include "stabilization/solver_params.h"

// What a fresh factorization window is put through before it counts.
namespace marrow::stabilization {

// Writes the distance in pixels of each input sample of the window's trajectories from where the
// factorization puts it into the error word of global.output.
void reprojection_errors(stabilizer_global& global, const factorization_window& window,
                         double center_x, double center_y);

// Drops the trajectories that meet the window on fewer frames than short_trajectory_duration, or
// than the window has.
void drop_short_tracks(const stabilizer_global& global, factorization_window& window,
                       std::int64_t short_trajectory_duration);

// Drops the trajectories with an error above `threshold` on any frame of the window.
void drop_outliers(const stabilizer_global& global, factorization_window& window, double threshold);

struct quality_result {
  bool passes = true;
  std::uint64_t bad_frame = 0;  // the window holds up to here, exclusive
  std::uint64_t next_good_frame = 0;
};

// Whether every frame between the window's first and last is held by tracks whose fade weights sum
// to `threshold`. A window shorter than half the overlap of windows is bad from its first frame to
// its end.
quality_result quality_check(const stabilizer_global& global, const factorization_window& window,
                             const SolverParamsRecord& parameters, double threshold,
                             const progress_functor& progress);

}  // namespace marrow::stabilization
