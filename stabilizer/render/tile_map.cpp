#include "stabilizer/render/tile_map.h"

#include <algorithm>

namespace marrow::render {

bool TileMap::empty() const {
  return std::all_of(tiles_.begin(), tiles_.end(), [](std::uint8_t t) { return t == 0; });
}

TileMap::range TileMap::reach(std::int64_t begin, std::int64_t end, int size) {
  begin = std::max<std::int64_t>(begin, 0);
  end = std::min<std::int64_t>(end, size);
  if (begin >= end) return {0, 0};
  return {static_cast<int>(begin / side), static_cast<int>((end - 1) / side) + 1};
}

bool TileMap::touches(std::int64_t x0, std::int64_t y0, std::int64_t x1, std::int64_t y1) const {
  const range columns = reach(x0, x1, width_), lines = reach(y0, y1, height_);
  for (int r = lines.begin; r < lines.end; ++r) {
    for (int c = columns.begin; c < columns.end; ++c) {
      if (tile(c, r)) return true;
    }
  }
  return false;
}

void TileMap::add(std::int64_t x0, std::int64_t y0, std::int64_t x1, std::int64_t y1) {
  const range columns = reach(x0, x1, width_), lines = reach(y0, y1, height_);
  for (int r = lines.begin; r < lines.end; ++r) {
    for (int c = columns.begin; c < columns.end; ++c) tile(c, r) = 1;
  }
}

void TileMap::intersect(const TileMap& other) {
  for (std::size_t i = 0; i < tiles_.size(); ++i) tiles_[i] &= other.tiles_[i];
}

pixel_rect TileMap::pixels(int c0, int c1, int r0, int r1) const {
  return {c0 * side, r0 * side, std::min(c1 * side, width_), std::min(r1 * side, height_)};
}

std::vector<pixel_rect> TileMap::rects() const {
  std::vector<pixel_rect> all;
  std::size_t above = 0;  // where the rectangles that end at this row of tiles begin
  for (int r = 0; r < rows_; ++r) {
    std::vector<pixel_rect> row;
    for (int c = 0; c < cols_;) {
      if (!tile(c, r)) {
        ++c;
        continue;
      }
      const int begin = c;
      while (c < cols_ && tile(c, r)) ++c;
      row.push_back(pixels(begin, c, r, r + 1));
    }
    // A row like the one above lengthens its rectangles.
    const bool same =
        row.size() == all.size() - above &&
        std::equal(row.begin(), row.end(), all.begin() + static_cast<std::ptrdiff_t>(above),
                   [](const pixel_rect& a, const pixel_rect& b) {
                     return a.left == b.left && a.right == b.right;
                   });
    if (same) {
      for (std::size_t i = 0; i < row.size(); ++i) all[above + i].bottom = row[i].bottom;
    } else {
      above = all.size();
      all.insert(all.end(), row.begin(), row.end());
    }
  }
  return all;
}

}  // namespace marrow::render
