#include "stabilization/crop/outline_mask.h"

#include <algorithm>
#include <cmath>
#include <cstdlib>
#include <stdexcept>

namespace marrow::stabilization {

namespace {

// 1 GiB of bits: some hundred times the largest frame there is.
constexpr std::int64_t max_mask_pixels = std::int64_t{1} << 33;

// Vertices beyond this are images of points near a homography's line at infinity.
constexpr double max_coordinate = 1 << 24;

}  // namespace

outline_mask::outline_mask(std::int64_t width, std::int64_t height)
    : width_(width), height_(height), words_((width + 63) / 64) {
  if (width < 0 || height < 0 ||
      (height > 0 && words_ > 0 && words_ > max_mask_pixels / 64 / height)) {
    throw std::length_error("crop mask of " + std::to_string(width) + " x " +
                            std::to_string(height) + " pixels");
  }
  bits_.assign(static_cast<std::size_t>(words_ * height_), 0);
}

void outline_mask::draw_line(std::int64_t x0, std::int64_t y0, std::int64_t x1, std::int64_t y1) {
  const std::int64_t dx = x1 - x0;
  const std::int64_t dy = y1 - y0;
  const bool along_x = std::llabs(dx) >= std::llabs(dy);
  const std::int64_t n = along_x ? std::llabs(dx) : std::llabs(dy);
  if (n == 0) {
    set(x0, y0);
    return;
  }
  const std::int64_t major = along_x ? x0 : y0;
  const std::int64_t step = (along_x ? dx : dy) < 0 ? -1 : 1;
  const float minor = static_cast<float>(along_x ? y0 : x0);
  const float delta = static_cast<float>(along_x ? dy : dx);
  for (std::int64_t i = 0; i <= n; ++i) {
    const std::int64_t a = major + step * i;
    const auto b =
        static_cast<std::int64_t>(minor + delta * static_cast<float>(i) / static_cast<float>(n));
    if (along_x) {
      set(a, b);
    } else {
      set(b, a);
    }
  }
}

void draw_outline(outline_mask& mask, const VarVector& warp, point2 origin) {
  const auto edge = [&](std::int32_t c0, std::int32_t r0, std::int32_t c1, std::int32_t r1,
                        double add_x, double add_y) {
    const point2 p = warp.vertex(c0, r0);
    const point2 q = warp.vertex(c1, r1);
    const double ends[4] = {p.x - origin.x + add_x, p.y - origin.y + add_y, q.x - origin.x + add_x,
                            q.y - origin.y + add_y};
    for (const double end : ends) {
      if (!(std::fabs(end) < max_coordinate)) return;
    }
    mask.draw_line(static_cast<std::int64_t>(ends[0]), static_cast<std::int64_t>(ends[1]),
                   static_cast<std::int64_t>(ends[2]), static_cast<std::int64_t>(ends[3]));
  };
  for (std::int32_t c = 0; c + 1 < warp.cols; ++c) {
    edge(c, 0, c + 1, 0, 0, 0);
    edge(c, warp.rows - 1, c + 1, warp.rows - 1, 0, 0.5);
  }
  for (std::int32_t r = 0; r + 1 < warp.rows; ++r) {
    edge(0, r, 0, r + 1, 0, 0);
    edge(warp.cols - 1, r, warp.cols - 1, r + 1, 0.5, 0);
  }
}

mask_rect grow_cross(const outline_mask& mask, std::int64_t x, std::int64_t y) {
  const auto column_clear = [&](std::int64_t c) {
    return !mask.at(c, y - 1) && !mask.at(c, y) && !mask.at(c, y + 1);
  };
  const auto row_clear = [&](std::int64_t r) {
    return !mask.at(x - 1, r) && !mask.at(x, r) && !mask.at(x + 1, r);
  };
  mask_rect rect{x, x, y, y};
  while (rect.left > 0 && column_clear(rect.left - 1)) --rect.left;
  while (rect.right < mask.width() - 1 && column_clear(rect.right + 1)) ++rect.right;
  while (rect.top > 0 && row_clear(rect.top - 1)) --rect.top;
  while (rect.bottom < mask.height() - 1 && row_clear(rect.bottom + 1)) ++rect.bottom;
  return rect;
}

void shrink_to_clear(const outline_mask& mask, std::int64_t seed_x, std::int64_t seed_y,
                     mask_rect& rect) {
  const auto column_set = [&](std::int64_t x) {
    for (std::int64_t y = rect.top; y <= rect.bottom; ++y) {
      if (mask.at(x, y)) return true;
    }
    return false;
  };
  const auto row_set = [&](std::int64_t y) {
    for (std::int64_t x = rect.left; x <= rect.right; ++x) {
      if (mask.at(x, y)) return true;
    }
    return false;
  };
  bool left = true;
  bool right = true;
  bool top = true;
  bool bottom = true;
  while ((left || right || top || bottom) && rect.left < rect.right && rect.top < rect.bottom) {
    left = left && rect.left < seed_x && column_set(rect.left);
    if (left) ++rect.left;
    right = right && rect.right > seed_x && column_set(rect.right);
    if (right) --rect.right;
    top = top && rect.top < seed_y && row_set(rect.top);
    if (top) ++rect.top;
    bottom = bottom && rect.bottom > seed_y && row_set(rect.bottom);
    if (bottom) --rect.bottom;
  }
}

}  // namespace marrow::stabilization
