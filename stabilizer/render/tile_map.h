#pragma once

#include <cstddef>
#include <cstdint>
#include <vector>

namespace marrow::render {

// A rectangle of pixels, half-open.
struct pixel_rect {
  int left;
  int top;
  int right;
  int bottom;
};

// A set of tiles of a frame buffer, which they cover from its top left on; those of the last column
// and row end with the buffer.
class TileMap {
 public:
  // Small, so that a frame's rim takes few pixels with it; a band of tiles is still as high as the
  // cells of a usual grid.
  static constexpr int side = 32;

  // Empty.
  TileMap(int width, int height)
      : width_(width),
        height_(height),
        cols_((width + side - 1) / side),
        rows_((height + side - 1) / side),
        tiles_(static_cast<std::size_t>(cols_) * static_cast<std::size_t>(rows_)) {}

  int width() const { return width_; }
  int height() const { return height_; }

  bool empty() const;
  // Whether a tile that the pixels [x0, x1) x [y0, y1) reach into is of the set. Pixels outside the
  // buffer reach into none.
  bool touches(std::int64_t x0, std::int64_t y0, std::int64_t x1, std::int64_t y1) const;
  // Adds the tiles that the pixels reach into.
  void add(std::int64_t x0, std::int64_t y0, std::int64_t x1, std::int64_t y1);
  // Leaves what is in both; of one size.
  void intersect(const TileMap& other);
  // Leaves the tiles for which keep(pixel_rect) is true.
  template <class Keep>
  void filter(const Keep& keep) {
    for (int r = 0; r < rows_; ++r) {
      for (int c = 0; c < cols_; ++c) {
        if (tile(c, r)) tile(c, r) = keep(pixels(c, c + 1, r, r + 1));
      }
    }
  }
  // Disjoint, few, and together just the set.
  std::vector<pixel_rect> rects() const;

 private:
  struct range {
    int begin;
    int end;
  };
  // Of the tiles that [begin, end) of `size` pixels reach into.
  static range reach(std::int64_t begin, std::int64_t end, int size);
  pixel_rect pixels(int c0, int c1, int r0, int r1) const;
  std::uint8_t& tile(int c, int r) {
    return tiles_[static_cast<std::size_t>(r) * static_cast<std::size_t>(cols_) +
                  static_cast<std::size_t>(c)];
  }
  bool tile(int c, int r) const { return const_cast<TileMap*>(this)->tile(c, r) != 0; }

  int width_;
  int height_;
  int cols_;
  int rows_;
  std::vector<std::uint8_t> tiles_;
};

}  // namespace marrow::render
