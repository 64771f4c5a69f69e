#pragma once

#include <vector>

#include "stabilization/factorization/window_filters.h"
#include "stabilization/progress.h"
#include "stabilization/solve_records.h"
#include "stabilization/solver_params.h"

namespace marrow::stabilization {

// Makes and judges windows for run_factorization_queue.
class window_maker {
 public:
  virtual ~window_maker() = default;
  // The window from `first` over at most `limit` frames, filtered; window.end > first.
  virtual factorization_window make(std::uint64_t first, std::uint64_t limit) = 0;
  virtual quality_result check(const factorization_window& window) = 0;
};

// For each frame, the number of trajectories that are complete over the `duration` frames from it,
// or over what the clip has left of them.
std::vector<std::size_t> complete_trajectories(const stabilizer_global& global,
                                               std::int64_t duration);

// Covers the clip with windows, appended ascending in frame. The next window begins
// factorization_window_overlap frames before the end of the last. A window that fails its check on
// some frame is made again to end before that frame, or given up if it would be shorter than the
// overlap, and the work goes on where tracks hold again. Frames where no window can begin, for
// fewer than rank / 2 complete trajectories, stay uncovered.
void run_factorization_queue(stabilizer_global& global, const SolverParamsRecord& parameters,
                             const std::vector<std::size_t>& complete, window_maker& maker,
                             std::vector<factorization_window>& windows,
                             const progress_functor& progress);

// run_factorization_queue with the moving factorization, its filters and its quality check. Reads
// global.input and global.trajectories; sets all statuses of global.output to -1 and writes its
// error words. Throws std::runtime_error where LAPACK reports a failure.
void factorize_windows(stabilizer_global& global, const SolverParamsRecord& parameters,
                       std::vector<factorization_window>& windows,
                       const progress_functor& progress);

}  // namespace marrow::stabilization
