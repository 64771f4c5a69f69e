#pragma once

#include <array>
#include <boost/shared_ptr.hpp>
#include <cstdint>
#include <vector>

#include "stabilization/models/matrix3.h"

namespace marrow::stabilization {

// One frame's warp: for each vertex of the rest grid, where it lands in the stabilized output
// frame. Vertices are row-major, x then y: vertex (c, r) at (r * cols + c) * 2. Pixels of the
// analysed frame in the output frame's space, origin at the centre of the top-left pixel, before
// any crop, scale or pixel aspect. Immutable once stored.
struct VarVector {
  std::vector<double> values;
  std::int32_t cols = 0;
  std::int32_t rows = 0;

  VarVector() = default;
  VarVector(std::int32_t columns, std::int32_t row_count)  // all zero
      : values(2 * static_cast<std::size_t>(columns) * static_cast<std::size_t>(row_count)),
        cols(columns),
        rows(row_count) {}

  point2 vertex(std::int32_t c, std::int32_t r) const {
    const std::size_t i = 2 * (static_cast<std::size_t>(r) * static_cast<std::size_t>(cols) +
                               static_cast<std::size_t>(c));
    return {values[i], values[i + 1]};
  }
};

// A record as it is kept: four corners exactly, and for each vertex how far it lies from where the
// projective map of the unit square onto those corners puts it, in 1/256 pixel. The map is
// square_to_quad of the corners, vertex (c, r) at (c / (cols - 1), r / (rows - 1)).
struct quantised_warp {
  std::array<point2, 4> corners = {};  // (0, 0), (cols-1, 0), (0, rows-1), (cols-1, rows-1)
  std::vector<std::int32_t> offsets;   // x then y, cols * rows pairs, row-major
};

// Offsets are narrowed to 32-bit floats and rounded half away from zero; a coordinate that is not a
// number has offset 0. cols and rows are at least 2.
quantised_warp quantise(const VarVector& record);

// The corner vertices are the stored corners as they stand, so that quantising a rebuilt record and
// rebuilding it again gives the same bits. offsets must hold 2 * cols * rows entries.
VarVector rebuild(const quantised_warp& quantised, std::int32_t cols, std::int32_t rows);

// The same in some 2 KB in place of 37: the offsets of neighbouring vertices differ little.
struct packed_warp {
  std::array<point2, 4> corners = {};
  std::vector<std::uint8_t> offsets;  // by memory::PackGrid
};

// offsets of `quantised`: rows of cols pairs.
packed_warp pack(const quantised_warp& quantised, std::int32_t cols);
// Throws std::invalid_argument where the bytes are none that pack makes.
quantised_warp unpack(const packed_warp& packed, std::int32_t cols, std::int32_t rows);

// A box in output coordinates.
struct frame_bounds {
  double min_x;
  double min_y;
  double max_x;
  double max_y;
};

}  // namespace marrow::stabilization
