#pragma once

#include <vector>

#include "stabilization/progress.h"
#include "stabilization/solve_records.h"
#include "stabilization/solver_params.h"

namespace marrow::stabilization {

// Solves the stabilized positions of the whole clip into global.output: each factorization window
// as one sparse system, stitched to the one before it, and every stretch between, before and after
// them as a transition (parameters.no_motion: a lockdown). lambdas: smoothing weight of each frame
// of the clip. Windows with fewer than 6 tracks on one of the frames from which a transition behind
// them would go on are removed from factorizationWindows, and theirs bridged too. Fills the
// windows' overlap rows and appends to transitionWindows, both ascending in frame. Returns false
// where a window's linear solve failed; everything written is void then.
bool smooth_windows(stabilizer_global& global, std::vector<transition_record>& transitionWindows,
                    std::vector<factorization_window>& factorizationWindows,
                    const std::vector<double>& lambdas, const SolverParamsRecord& parameters,
                    int width, int height, const progress_functor& progress);

}  // namespace marrow::stabilization
