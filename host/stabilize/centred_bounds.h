#pragma once

#include <functional>
#include <vector>

#include "host/stabilize/solved_grid.h"

namespace calmframe::host {

// One coordinate of a frame's corner, set.
struct Pull {
  std::size_t frame, corner;
  double Point::*axis;
  double to;
};

// What puts the output frame into the middle of the bounds of all frames' outlines, in pixels of
// the output frame, square ones. Each bound that is too near goes out by a corner that nobody sees:
// its cell lies beside the output frame, so that the effect draws nothing of it. Where there is no
// such corner in any frame, that goes out which goes the least way. Nothing of bounds that are
// beyond all sense. grid_of(frame): as it lies in the output frame.
std::vector<Pull> FindPulls(const SolvedLayout& layout, const OutlineBounds& bounds,
                            const std::function<WarpGrid(std::size_t)>& grid_of);

}  // namespace calmframe::host
