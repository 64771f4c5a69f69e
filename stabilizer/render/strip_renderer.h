#pragma once

#include <cstdint>
#include <memory>
#include <vector>

#include "stabilization/cropper.h"
#include "stabilization/matrix3.h"
#include "stabilizer/render/renderer.h"
#include "stabilizer/render/sampling.h"
#include "stabilizer/render/world.h"

// Draws one frame's mesh: each cell of the warped grid is a quadrilateral of the zoomed output
// plane whose pixels look up the source through the inverse of the cell's projective map.
//
// The frame is drawn in bands of destination rows. A band draws every grid row that reaches into
// it, in ascending order, so a pixel that several cells cover holds the last one's sample whatever
// the number of threads, and no two bands write one pixel.
template <class Pixel>
class StripRenderer {
 public:
  // vertices: cols x rows pairs, scaled and shifted; crop: scaled, relative to the renderer's
  // bounds. All referents must outlive this.
  StripRenderer(const Renderer& renderer, const std::vector<double>& vertices,
                const WorldX<Pixel>& source, WorldX<Pixel>& destination, const crop_rect& cropRect,
                double zoom, bool crop);

  // How many bands the destination has; a band may be drawn on any thread.
  std::size_t bands() const;
  void operator()(std::size_t band) const;

 private:
  struct cell;
  struct row_runs;
  struct row_extent {
    double min_y;
    double max_y;
  };

  void drawGridRow(std::int32_t r, std::int64_t first_row, std::int64_t end_row) const;
  bool setUpCell(std::int32_t c, std::int32_t r, std::int64_t first_row, std::int64_t end_row,
                 cell& q) const;
  void drawRow(const cell& q, std::int64_t y, row_runs& runs) const;
  void drawSpan(const cell& q, std::int64_t x0, std::int64_t x1, double py, Pixel* row,
                row_runs& runs) const;
  marrow::stabilization::point2 vertex(std::int32_t c, std::int32_t r) const {
    const std::size_t i =
        2 * (static_cast<std::size_t>(r) * static_cast<std::size_t>(renderer_.cols) +
             static_cast<std::size_t>(c));
    return {vertices_[i], vertices_[i + 1]};
  }

  const Renderer& renderer_;
  const std::vector<double>& vertices_;
  WorldX<Pixel>& destination_;
  std::unique_ptr<WorldX<Pixel>> widened_;  // a source of one column or row, that twice
  source_plane source_;
  bool crop_;
  double zoom_;
  std::int64_t to_destination_x_;  // destination = zoomed plane + this
  std::int64_t to_destination_y_;
  double offset_x_;  // sub-pixel part of the same
  double offset_y_;
  double limit_x_;  // of the zoomed plane
  double limit_y_;
  double tolerance2_;
  std::vector<double> test_x_;       // of each destination column, in the plane
  std::vector<row_extent> extents_;  // of each grid row's finite vertices
};

extern template class StripRenderer<HX_Pixel8>;
extern template class StripRenderer<HX_Pixel16>;
extern template class StripRenderer<HX_PixelFloat>;
