#pragma once

#include <array>
#include <limits>
#include <vector>

#include "host/stabilize/similarity.h"

namespace calmframe::host {

// (x, y) -> (h0 x + h1 y + h2, h3 x + h4 y + h5) / (h6 x + h7 y + 1)
using Homography = std::array<double, 8>;

// The same in pixels of any origin, row by row, of columns x, y, 1.
using Matrix = std::array<double, 9>;

// `first`, then `then`.
Matrix Product(const Matrix& then, const Matrix& first);

Point Apply(const Homography& h, Point p);
Point Apply(const Matrix& m, Point p);

// That which takes points of `from` to those of `to` (equally many) with the least sum of squared
// algebraic errors (the direct linear transform: Hartley and Zisserman, Multiple View Geometry, 2nd
// ed., ch. 4). Points that it leaves `farthest` or more away don't count, nearer ones the more, by
// Tukey's bisquare, in rounds that begin with `start`; that it is where too few are left. For
// coordinates about 1 in size. What the points leave open of a tilt is none.
Homography FitHomography(const std::vector<Point>& from, const std::vector<Point>& to,
                         const Homography& start,
                         double farthest = std::numeric_limits<double>::infinity());

}  // namespace calmframe::host
