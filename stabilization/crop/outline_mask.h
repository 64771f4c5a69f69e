#pragma once

#include <cstdint>
#include <vector>

#include "stabilization/warp/var_vector.h"

namespace marrow::stabilization {

// A bit for each pixel of a width x height plane, all clear at first. Pixels outside read as clear
// and are never set.
class outline_mask {
 public:
  outline_mask(std::int64_t width, std::int64_t height);

  std::int64_t width() const { return width_; }
  std::int64_t height() const { return height_; }

  bool at(std::int64_t x, std::int64_t y) const {
    if (x < 0 || y < 0 || x >= width_ || y >= height_) return false;
    return (bits_[static_cast<std::size_t>(y * words_ + x / 64)] >> (x % 64)) & 1u;
  }
  void set(std::int64_t x, std::int64_t y) {
    if (x < 0 || y < 0 || x >= width_ || y >= height_) return;
    bits_[static_cast<std::size_t>(y * words_ + x / 64)] |= std::uint64_t{1} << (x % 64);
  }

  // Both ends included: one pixel for each step along the longer axis (x where they are equal), the
  // other coordinate interpolated in f32 and truncated.
  void draw_line(std::int64_t x0, std::int64_t y0, std::int64_t x1, std::int64_t y1);

 private:
  std::int64_t width_;
  std::int64_t height_;
  std::int64_t words_;
  std::vector<std::uint64_t> bits_;
};

// All sides inclusive.
struct mask_rect {
  std::int64_t left;
  std::int64_t right;
  std::int64_t top;
  std::int64_t bottom;
};

// Draws the grid's outer ring, vertices taken relative to `origin` and truncated, the bottom edge
// half a pixel lower and the right edge half a pixel further right. An edge with a vertex that is
// not finite, or further out than any mask, is left out.
void draw_outline(outline_mask& mask, const VarVector& warp, point2 origin);

// The rectangle spanned by a cross of three pixels' width that grows from the seed until it meets a
// set pixel or the mask's border.
mask_rect grow_cross(const outline_mask& mask, std::int64_t seed_x, std::int64_t seed_y);

// Moves the sides towards the seed, in turns, until none crosses a set pixel. A side that was found
// clear is not looked at again; none moves past the seed.
void shrink_to_clear(const outline_mask& mask, std::int64_t seed_x, std::int64_t seed_y,
                     mask_rect& rect);

}  // namespace marrow::stabilization
