#pragma once

#include <array>
#include <cstddef>
#include <limits>
#include <utility>
#include <vector>

#include "host/stabilize/similarity.h"
#include "host/stabilize/solved_payload.h"

namespace calmframe::host {

// One frame's warp as an instance stores it: rows of a grid of columns x rows vertices, at least 2
// each.
class WarpGrid {
 public:
  WarpGrid(std::size_t columns, std::size_t rows);
  explicit WarpGrid(const SolvedLayout& layout)
      : WarpGrid(static_cast<std::size_t>(layout.columns), static_cast<std::size_t>(layout.rows)) {}

  // Of as many vertices.
  void Take(const StoredWarp& warp);
  // Rounds all vertices but the corners to 1/256 pixel.
  StoredWarp Stored();
  // Every vertex where it stands in a frame of that size.
  void Rest(double width, double height);
  void Move(const Similarity& motion) {
    for (Point& vertex : vertices_) vertex = motion(vertex);
  }

  std::size_t columns() const { return columns_; }
  std::size_t rows() const { return rows_; }
  const std::vector<Point>& vertices() const { return vertices_; }
  std::vector<Point> TakeVertices() { return std::move(vertices_); }  // leaves none
  // Top left, top right, bottom left, bottom right, as they are stored.
  Point& corner(std::size_t i) { return vertices_[corners_[i]]; }
  const Point& corner(std::size_t i) const { return vertices_[corners_[i]]; }
  // The vertices of the cell that a corner belongs to.
  std::array<Point, 4> CellOf(std::size_t corner) const;

 private:
  // visit(vertex, where the corners' map puts it)
  template <class Visit>
  void ForEach(const std::array<Point, 4>& corners, const Visit& visit);

  std::vector<Point> vertices_;
  std::size_t columns_, rows_;
  std::array<std::size_t, 4> corners_;
};

// Of all frames' outlines, as the effect has them: their least and largest coordinates, the largest
// above 0 in any case; what is no number does not count.
struct OutlineBounds {
  Point least = {std::numeric_limits<float>::max(), std::numeric_limits<float>::max()};
  Point most = {std::numeric_limits<float>::min(), std::numeric_limits<float>::min()};

  // Vertices of one frame.
  void Add(const Point* vertices, std::size_t columns, std::size_t rows);
  void Add(const WarpGrid& grid) { Add(grid.vertices().data(), grid.columns(), grid.rows()); }
};

OutlineBounds BoundsOf(const SolvedClip& clip);

// A folded warp's bounds can lie anywhere; no picture is as large as this.
double Tame(double coordinate);

}  // namespace calmframe::host
