#pragma once

#include <vector>

#include "stabilization/progress.h"
#include "stabilization/solve_records.h"
#include "stabilization/solver_params.h"

namespace marrow::stabilization {

// The whole numerical solve of one clip: builds global.trajectories, factorizes window by window,
// writes the stabilized position of every live sample into global.output, covers the frames that no
// window covers with transitions, and lowers the rank where a linear solve fails. Both lists are
// empty on entry. width and height: the analysed frame in square pixels. Returns 0 when every rank
// has failed; throws std::runtime_error where LAPACK reports a failure, and whatever progress
// throws.
int stabilizer_main(stabilizer_global& global, const SolverParamsRecord& parameters,
                    std::vector<transition_record>& transitionWindows,
                    std::vector<factorization_window>& factorizationWindows, int width, int height,
                    const progress_functor& progress);

}  // namespace marrow::stabilization
