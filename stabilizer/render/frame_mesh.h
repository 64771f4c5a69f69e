#pragma once

#include <cstdint>
#include <vector>

#include "stabilization/crop/cropper.h"
#include "stabilization/models/matrix3.h"
#include "stabilizer/render/render_geometry.h"
#include "stabilizer/render/tile_map.h"

namespace marrow::render {

// One frame's mesh as it lies in a destination of width x height pixels: the warped grid in the
// zoomed output plane, and the plane's place.
class FrameMesh {
 public:
  // vertices: cols x rows pairs, scaled and shifted; crop_rect: scaled, relative to the renderer's
  // bounds. The renderer must outlive this.
  FrameMesh(const Renderer& renderer, std::vector<double> vertices, int width, int height,
            const crop_rect& cropRect, double zoom, bool crop);

  // Every tile of the destination that a cell may draw a pixel of.
  TileMap tiles() const;

 protected:
  struct row_extent {
    double min_y;
    double max_y;
  };
  // The pixels of the zoomed plane that a cell may cover, half-open.
  struct cell_bounds {
    std::int64_t x0;
    std::int64_t y0;
    std::int64_t x1;
    std::int64_t y1;
  };

  static bool usable(stabilization::point2 p);
  stabilization::point2 vertex(std::int32_t c, std::int32_t r) const {
    const std::size_t i =
        2 * (static_cast<std::size_t>(r) * static_cast<std::size_t>(renderer_.cols) +
             static_cast<std::size_t>(c));
    return {vertices_[i], vertices_[i + 1]};
  }
  // False where the cell has no inside that could be drawn.
  bool cellBounds(std::int32_t c, std::int32_t r, cell_bounds& bounds) const;

  const Renderer& renderer_;
  std::vector<double> vertices_;
  int width_;
  int height_;
  bool crop_;
  double zoom_;
  std::int64_t to_destination_x_;  // destination = zoomed plane + this
  std::int64_t to_destination_y_;
  double offset_x_;  // sub-pixel part of the same
  double offset_y_;
  double limit_x_;  // of the zoomed plane
  double limit_y_;
  std::vector<row_extent> extents_;  // of each grid row's finite vertices
};

}  // namespace marrow::render
