#include "stabilization/models/similarity.h"

#include <cmath>

namespace marrow::stabilization {

similarity fit_similarity_pairs(const std::vector<point2>& source,
                                const std::vector<point2>& target) {
  const std::size_t count = source.size();
  if (count < 2 || target.size() != count) return {};
  double sx = 0, sy = 0, tx = 0, ty = 0, xx = 0, yy = 0, xy = 0, yx = 0, squares = 0;
  for (std::size_t i = 0; i < count; ++i) {
    sx += source[i].x;
    sy += source[i].y;
    tx += target[i].x;
    ty += target[i].y;
    xx += source[i].x * target[i].x;
    yy += source[i].y * target[i].y;
    xy += source[i].x * target[i].y;
    yx += source[i].y * target[i].x;
    squares += source[i].x * source[i].x + source[i].y * source[i].y;
  }
  const double n = static_cast<double>(count);
  const double spread = squares - (sx * sx + sy * sy) / n;
  // Below this the spread is the sums' own rounding.
  if (!(spread > 1e-12 * squares)) return {};
  const double a = (xx + yy - (sx * tx + sy * ty) / n) / spread;  // scale cos
  const double b = (xy - yx - (sx * ty - sy * tx) / n) / spread;  // scale sin
  return {std::hypot(a, b), std::atan2(b, a), (tx - a * sx + b * sy) / n,
          (ty - a * sy - b * sx) / n};
}

}  // namespace marrow::stabilization
