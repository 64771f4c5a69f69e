#pragma once

#include <cstdint>
#include <memory>
#include <vector>

#include "stabilizer/render/frame_mesh.h"
#include "stabilizer/render/sampling.h"
#include "stabilizer/render/world.h"

namespace marrow::render {

// Draws one frame's mesh: each cell of the warped grid is a quadrilateral of the zoomed output
// plane whose pixels look up the source through the inverse of the cell's projective map.
//
// The frame is drawn in bands of destination rows. A band draws every grid row that reaches into
// it, in ascending order, so a pixel that several cells cover holds the last one's sample whatever
// the number of threads, and no two bands write one pixel.
template <class Pixel>
class StripRenderer : FrameMesh {
 public:
  // mesh: for a destination of that size. With `only`, tiles of the destination, their pixels are
  // drawn as ever, and of the others some or none. With `clears`, what of a band no cell covers is
  // made transparent black. All referents must outlive this.
  StripRenderer(const FrameMesh& mesh, const WorldX<Pixel>& source, WorldX<Pixel>& destination,
                const TileMap* only = nullptr, bool clears = false);

  // How many bands the destination has; a band may be drawn on any thread.
  std::size_t bands() const;
  void operator()(std::size_t band) const;

 private:
  struct cell;
  struct band_runs;

  void drawGridRow(std::int32_t r, std::int64_t first_row, std::int64_t end_row,
                   band_runs& runs) const;
  void clearRest(int first, int end, band_runs& runs) const;
  bool setUpCell(std::int32_t c, std::int32_t r, std::int64_t first_row, std::int64_t end_row,
                 cell& q) const;
  void drawRow(const cell& q, std::int64_t y, band_runs& runs) const;
  void drawSpan(const cell& q, std::int64_t x0, std::int64_t x1, std::int64_t y,
                band_runs& runs) const;
  void sample(std::int64_t y, band_runs& runs) const;
  double planeY(std::int64_t y) const { return (static_cast<double>(y) + offset_y_) / zoom_; }

  WorldX<Pixel>& destination_;
  const TileMap* only_;
  bool clears_;
  std::unique_ptr<WorldX<Pixel>> widened_;  // a source of one column or row, that twice
  source_plane source_;
  std::int64_t band_height_;
  double tolerance2_;
  // Of each destination column, in the plane: where edges are tested and where it is looked up.
  std::vector<double> test_x_, plane_x_;
};

extern template class StripRenderer<HX_Pixel8>;
extern template class StripRenderer<HX_Pixel16>;
extern template class StripRenderer<HX_PixelFloat>;

}  // namespace marrow::render
