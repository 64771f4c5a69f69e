#pragma once

#include <vector>

#include "stabilization/models/similarity.h"
#include "stabilization/progress.h"
#include "stabilization/solve_records.h"
#include "stabilization/solver_params.h"

// Frames that no factorization window covers: one plane similarity a frame, found so that the
// tracks stay smooth across the stretch and join up with what lies before it (transition), or tied
// to one fixed similarity (lockdown).
namespace marrow::stabilization {

// Solves [first, end) and appends its records, ascending in frame. Reads global.input,
// global.trajectories and, for the frames before `first`, global.output; writes global.output.
// width and height: the analysed frame in square pixels. translation_only leaves of each frame's
// motion what it does to the picture's middle, as a shift. With the new solver and a
// transition_bisquare_sigma other than kTrustAllTracks, weigh_down_wild_steps rules the tracks'
// weights; frames with fewer than 6 live tracks keep scale 1 and angle 0; and behind frames on
// which no track has a stabilized place the first frame keeps the identity, as those have it.
void transition_window(stabilizer_global& global, std::uint64_t first, std::uint64_t end,
                       const SolverParamsRecord& parameters, int width, int height,
                       bool translation_only, std::vector<transition_record>& records,
                       const progress_functor& progress);

// Ties every frame of [first, end) to `target`.
void lockdown_window(stabilizer_global& global, std::uint64_t first, std::uint64_t end,
                     const SolverParamsRecord& parameters, const similarity& target,
                     std::vector<transition_record>& records, const progress_functor& progress);

}  // namespace marrow::stabilization
