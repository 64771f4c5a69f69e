#pragma once

#include <cmath>
#include <vector>

#include "stabilization/models/matrix3.h"

namespace marrow::stabilization {

// A plane similarity: (x, y) goes to (scale (cos angle x - sin angle y) + tx, scale (cos angle y +
// sin angle x) + ty).
struct similarity {
  double scale = 1.0;
  double angle = 0.0;  // radians
  double tx = 0.0;
  double ty = 0.0;
};

inline point2 transform(const similarity& motion, point2 p) {
  const double c = motion.scale * std::cos(motion.angle);
  const double s = motion.scale * std::sin(motion.angle);
  return {c * p.x - s * p.y + motion.tx, c * p.y + s * p.x + motion.ty};
}

// How far the motion moves p: what is left of it as a shift where p matters most.
inline point2 displacement_of(const similarity& motion, point2 p) {
  const double c = motion.scale * std::cos(motion.angle);
  const double s = motion.scale * std::sin(motion.angle);
  return {(c - 1) * p.x - s * p.y + motion.tx, (c - 1) * p.y + s * p.x + motion.ty};
}

// The middle of a picture in pixels, the top-left pixel's centre being (0, 0).
inline point2 middle_of(int width, int height) {
  return {(width - 1) / 2.0, (height - 1) / 2.0};
}

// The similarity that takes `source` to `target`, equally long, with the least sum of squared
// distances, in closed form from sums over the pairs (Umeyama, Least-squares estimation of
// transformation parameters between two point patterns, 1991; the plane case). The identity under
// two pairs, and where all sources coincide.
similarity fit_similarity_pairs(const std::vector<point2>& source,
                                const std::vector<point2>& target);

}  // namespace marrow::stabilization
