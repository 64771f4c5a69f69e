#include "stabilization/crop/filled_mask_rect.h"

#include <algorithm>
#include <cmath>

namespace marrow::stabilization {

void fill_cells(outline_mask& mask, const VarVector& warp, point2 origin) {
  const auto cross = [](point2 a, point2 b, double x, double y) {
    return (b.x - a.x) * (y - a.y) - (b.y - a.y) * (x - a.x);
  };
  for (std::int32_t r = 0; r + 1 < warp.rows; ++r) {
    for (std::int32_t c = 0; c + 1 < warp.cols; ++c) {
      point2 p[4] = {warp.vertex(c, r), warp.vertex(c + 1, r), warp.vertex(c + 1, r + 1),
                     warp.vertex(c, r + 1)};
      bool finite = true;
      for (point2& q : p) {
        q = {q.x - origin.x, q.y - origin.y};
        finite = finite && std::isfinite(q.x) && std::isfinite(q.y);
      }
      if (!finite) continue;
      const auto [min_x, max_x] = std::minmax({p[0].x, p[1].x, p[2].x, p[3].x});
      const auto [min_y, max_y] = std::minmax({p[0].y, p[1].y, p[2].y, p[3].y});
      const double w = static_cast<double>(mask.width());
      const double h = static_cast<double>(mask.height());
      const auto x0 = static_cast<std::int64_t>(std::clamp(std::floor(min_x), 0.0, w));
      const auto x1 = static_cast<std::int64_t>(std::clamp(std::ceil(max_x) + 1, 0.0, w));
      const auto y0 = static_cast<std::int64_t>(std::clamp(std::floor(min_y), 0.0, h));
      const auto y1 = static_cast<std::int64_t>(std::clamp(std::ceil(max_y) + 1, 0.0, h));
      for (std::int64_t y = y0; y < y1; ++y) {
        for (std::int64_t x = x0; x < x1; ++x) {
          const auto fx = static_cast<double>(x);
          const auto fy = static_cast<double>(y);
          if (cross(p[0], p[1], fx, fy) >= 0 && cross(p[1], p[2], fx, fy) >= 0 &&
              cross(p[2], p[3], fx, fy) >= 0 && cross(p[3], p[0], fx, fy) >= 0) {
            mask.set(x, y);
          }
        }
      }
    }
  }
}

mask_rect largest_set_rect(const outline_mask& mask) {
  const std::int64_t w = mask.width();
  const std::int64_t h = mask.height();
  // Ends of the runs that a pixel lies in; meaningless where the pixel is clear.
  std::vector<std::int32_t> run_right(static_cast<std::size_t>(w * h));
  std::vector<std::int32_t> run_bottom(static_cast<std::size_t>(w * h));
  for (std::int64_t y = h - 1; y >= 0; --y) {
    for (std::int64_t x = w - 1; x >= 0; --x) {
      const auto i = static_cast<std::size_t>(y * w + x);
      run_right[i] = mask.at(x + 1, y) ? run_right[i + 1] : static_cast<std::int32_t>(x);
      run_bottom[i] = mask.at(x, y + 1) ? run_bottom[i + static_cast<std::size_t>(w)]
                                        : static_cast<std::int32_t>(y);
    }
  }
  mask_rect best{0, -1, 0, -1};
  std::int64_t best_area = 0;
  for (std::int64_t y = 0; y < h; ++y) {
    for (std::int64_t x = 0; x < w; ++x) {
      if (!mask.at(x, y)) continue;
      const auto i = static_cast<std::size_t>(y * w + x);
      const std::int64_t lowest = run_bottom[i];
      std::int64_t right = run_right[i];
      for (std::int64_t bottom = y; bottom <= lowest; ++bottom) {
        right = std::min<std::int64_t>(right, run_right[static_cast<std::size_t>(bottom * w + x)]);
        if ((right - x + 1) * (lowest - y + 1) <= best_area) break;
        const std::int64_t area = (right - x + 1) * (bottom - y + 1);
        if (area > best_area) {
          best_area = area;
          best = {x, right, y, bottom};
        }
      }
    }
  }
  return best;
}

}  // namespace marrow::stabilization
