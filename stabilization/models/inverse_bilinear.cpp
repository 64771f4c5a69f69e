#include "stabilization/models/inverse_bilinear.h"

#include <cmath>

namespace marrow::stabilization {

point2 inverse_bilinear(point2 p, point2 a, point2 b, point2 c, point2 d) {
  constexpr double kDegenerate = 1e-8;
  const point2 e = {b.x - a.x, b.y - a.y};
  const point2 f = {c.x - a.x, c.y - a.y};
  const point2 g = {a.x - b.x + d.x - c.x, a.y - b.y + d.y - c.y};
  const point2 h = {p.x - a.x, p.y - a.y};
  const double k2 = f.y * g.x - g.y * f.x;
  const double k1 = g.y * h.x - e.y * f.x - h.y * g.x + f.y * e.x;
  const double k0 = e.y * h.x - h.y * e.x;
  double v = 0;
  if (std::fabs(k2) > kDegenerate) {
    const double root = std::sqrt(k1 * k1 - 4 * k2 * k0);
    v = (root - k1) / (2 * k2);
    if (!(v >= 0 && v <= 1)) {
      const double other = (-k1 - root) / (2 * k2);
      if (!(std::fabs(other - 0.5) > std::fabs(v - 0.5))) v = other;
    }
  } else if (std::fabs(k1) > kDegenerate) {
    v = -k0 / k1;
  }
  const double q = v * g.x + e.x;
  return {std::fabs(q) > kDegenerate ? (h.x - v * f.x) / q : 0.0, v};
}

}  // namespace marrow::stabilization
