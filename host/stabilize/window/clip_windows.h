#pragma once

#include <vector>

#include "host/stabilize/similarity.h"
#include "host/stabilize/window/window_path.h"

namespace calmframe::host {

// Warp of a frame: columns x rows vertices, row by row, as they land in the plane, about its
// middle.
struct WarpView {
  const Point* vertices = nullptr;
  int columns = 0, rows = 0;

  const Point& at(int column, int row) const { return vertices[row * columns + column]; }
};

// Whether a point lies where a warp of a frame may reasonably put one; no number is nowhere.
bool IsInReach(const Point& point);

// Four half-planes, one along each side of the warped frame, whose common part the frame covers
// but for `margin` pixels. Empty where the warp is folded or turned so far that they are none, and
// where it lies beyond all frames' sizes or is no number.
std::vector<HalfPlane> CoveredRegion(const WarpView& warp, double margin);

// The similarity that takes most points of `from` to those of `to` (equally many), which is that of
// the background where it holds the most of them: the best of a fixed series of pairs, refined by
// Tukey's bisquare (Hampel et al., Robust Statistics, 1986, ch. 2.6). `tolerance`: pixels. The
// identity, where there are fewer than three. All must be numbers.
Similarity FitMotion(const std::vector<Point>& from, const std::vector<Point>& to,
                     double tolerance);

}  // namespace calmframe::host
