#pragma once

#include <vector>

#include "apps/report/page.h"
#include "apps/report/solve_figures.h"

namespace calmframe::report {

// What the page tells of the camera path, by the motions before and after.
void AddCameraPath(const SolveFigures& figures, Page& page);

// What it tells of tracks, models and crop. `scores`: a row each, see SolveLog.
void AddSolve(const SolveFigures& figures, const std::vector<double>& scores, Page& page);

// How much steadier it is by the camera path.
void AddShake(const SolveFigures& figures, Page& page);

// A note where little of the shake went, and why that may be. `seen`: what has less is a still
// camera; all three in one unit.
void NoteWhatIsLeft(double shake, double left, double seen, const SolveFigures& figures,
                    Page& page);

// What the page tells of how much of each frame is left empty, in percent. The curve has `rows`
// values like the others, also where a frame has two fields.
void AddEmptyShares(const std::vector<double>& empty, std::size_t rows, Page& page);

}  // namespace calmframe::report
