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

// Share of a rectangle of width x height about the middle that lies outside of the frame's outline,
// 0 to 1: what shows nothing where the warp leads into the output (Sutherland and Hodgman,
// Communications of the ACM 17, 1974). 1 of one out of reach.
double UncoveredShare(const WarpView& warp, double width, double height);

// Of the picture's width: how far a track may well be from where its motion takes it in a frame.
constexpr double kTrackTolerance = 0.003;

// The similarity that takes most points of `from` to those of `to` (equally many), which is that of
// the background where it holds the most of them: the best of a fixed series of pairs, refined by
// Tukey's bisquare (Hampel et al., Robust Statistics, 1986, ch. 2.6). `tolerance`: pixels. The
// identity, where there are fewer than three. All must be numbers.
Similarity FitMotion(const std::vector<Point>& from, const std::vector<Point>& to,
                     double tolerance);
// Its last steps: `motion` bettered by Tukey's bisquare, each point with its share, at least 0. A
// point that is 1.5 `tolerance` from where the motion takes it doesn't count.
Similarity RefitMotion(Similarity motion, const std::vector<Point>& from,
                       const std::vector<Point>& to, const std::vector<double>& shares,
                       double tolerance);

}  // namespace calmframe::host
