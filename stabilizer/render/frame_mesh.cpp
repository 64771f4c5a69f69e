#include "stabilizer/render/frame_mesh.h"

#include <algorithm>
#include <cmath>
#include <limits>
#include <utility>

namespace marrow::render {

using stabilization::point2;

namespace {

constexpr double max_coordinate = 1e30;  // products of two stay finite

std::int64_t whole(double v) {
  return static_cast<std::int64_t>(std::clamp(std::isnan(v) ? 0.0 : v, -1e15, 1e15));
}

}  // namespace

bool FrameMesh::usable(point2 p) {
  return std::fabs(p.x) < max_coordinate && std::fabs(p.y) < max_coordinate;
}

FrameMesh::FrameMesh(const Renderer& renderer, std::vector<double> vertices, int width, int height,
                     const crop_rect& cropRect, double zoom, bool crop)
    : renderer_(renderer),
      vertices_(std::move(vertices)),
      width_(width),
      height_(height),
      crop_(crop),
      zoom_(zoom) {
  const double cx = ((cropRect.right + renderer.boundsMinX) * zoom +
                     (cropRect.left + renderer.boundsMinX) * zoom) /
                    2;
  const double cy = ((cropRect.bottom + renderer.boundsMinY) * zoom +
                     (cropRect.top + renderer.boundsMinY) * zoom) /
                    2;
  const double hx = ((crop ? width : renderer.planeWidth) - 1) * 0.5;
  const double hy = ((crop ? height : renderer.planeHeight) - 1) * 0.5;
  to_destination_x_ = whole(hx) - whole(cx);
  to_destination_y_ = whole(hy) - whole(cy);
  offset_x_ = (cx - std::trunc(cx)) - (hx - std::trunc(hx));
  offset_y_ = (cy - std::trunc(cy)) - (hy - std::trunc(hy));
  limit_x_ = std::trunc(renderer.planeWidth * zoom);
  limit_y_ = std::trunc(renderer.planeHeight * zoom);
  for (std::int32_t r = 0; r < renderer.rows; ++r) {
    row_extent extent{std::numeric_limits<double>::infinity(),
                      -std::numeric_limits<double>::infinity()};
    for (std::int32_t c = 0; c < renderer.cols; ++c) {
      const point2 p = vertex(c, r);
      if (!usable(p)) continue;
      extent = {std::min(extent.min_y, p.y), std::max(extent.max_y, p.y)};
    }
    extents_.push_back(extent);
  }
}

bool FrameMesh::cellBounds(std::int32_t c, std::int32_t r, cell_bounds& bounds) const {
  const point2 p00 = vertex(c, r), p10 = vertex(c + 1, r);
  const point2 p01 = vertex(c, r + 1), p11 = vertex(c + 1, r + 1);
  if (!usable(p00) || !usable(p10) || !usable(p01) || !usable(p11)) return false;
  const double min_x = std::min({p00.x, p10.x, p01.x, p11.x});
  const double max_x = std::max({p00.x, p10.x, p01.x, p11.x});
  const double min_y = std::min({p00.y, p10.y, p01.y, p11.y});
  const double max_y = std::max({p00.y, p10.y, p01.y, p11.y});
  bounds.x0 = whole(std::floor(zoom_ * min_x - 1));
  bounds.x1 = whole(std::min(std::ceil(zoom_ * max_x + 1), limit_x_));
  bounds.y0 = whole(std::floor(zoom_ * min_y - 1));
  bounds.y1 = whole(std::min(std::ceil(zoom_ * max_y + 1), limit_y_));
  return true;
}

TileMap FrameMesh::tiles() const {
  TileMap tiles(width_, height_);
  if (!(zoom_ > 0)) return tiles;
  for (std::int32_t r = 0; r + 1 < renderer_.rows; ++r) {
    for (std::int32_t c = 0; c + 1 < renderer_.cols; ++c) {
      cell_bounds b;
      if (!cellBounds(c, r, b)) continue;
      tiles.add(b.x0 + to_destination_x_, b.y0 + to_destination_y_, b.x1 + to_destination_x_,
                b.y1 + to_destination_y_);
    }
  }
  return tiles;
}

}  // namespace marrow::render
