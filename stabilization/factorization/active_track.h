#pragma once

#include <cstddef>
#include <cstdint>
#include <vector>

#include "stabilization/progress.h"
#include "stabilization/solve_records.h"
#include "stabilization/solver_params.h"

namespace marrow::stabilization {

// A trajectory that takes part in a window. Frames are relative to the window's first.
struct active_track {
  std::size_t first;
  std::size_t end;  // exclusive; the span within the window
  std::size_t trajectory;
  const double* coefficients;  // 2 x rank numbers, owned by the window
  const double* fade;          // the track's weight on frames [first, end), fade[0] on `first`
};

// The tracks of a window, in the order of the trajectories. Points into the window and into itself.
struct window_tracks {
  std::vector<active_track> tracks;
  std::vector<double> fades;

  window_tracks() = default;
  window_tracks(window_tracks&&) = default;
  window_tracks& operator=(window_tracks&&) = default;
  window_tracks(const window_tracks&) = delete;
};

// Frames of the trajectory within the window; first >= end where they don't meet.
struct frame_span {
  std::size_t first;
  std::size_t end;
};
frame_span span_in_window(const Trajectory& trajectory, const factorization_window& window);

// Loads the window's tracks with their fade weights. A progress call follows each trajectory.
window_tracks load_window(const stabilizer_global& global, const factorization_window& window,
                          const SolverParamsRecord& parameters, const progress_functor& progress);

}  // namespace marrow::stabilization
