#pragma once

#include <vector>

#include "apps/report/page.h"
#include "apps/report/solve_figures.h"

namespace calmframe::report {

// What the page tells of camera path, tracks, models and crop. `scores`: a row each, see SolveLog.
void AddSolve(const SolveFigures& figures, const std::vector<double>& scores, Page& page);

// What the page tells of how much of each frame is left empty, in percent. The curve has `rows`
// values like the others, also where a frame has two fields.
void AddEmptyShares(const std::vector<double>& empty, std::size_t rows, Page& page);

}  // namespace calmframe::report
