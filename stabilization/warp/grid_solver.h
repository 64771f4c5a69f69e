#pragma once

#include <cstdint>
#include <span>
#include <vector>

#include "stabilization/displacements.h"
#include "stabilization/least_squares/hermitian_band_system.h"
#include "stabilization/models/matrix3.h"

namespace marrow::stabilization {

// The triangle (p0, p1, p2) stays similar to itself when v0 = v1 + r (v2 - v1) + s J (v2 - v1), J a
// quarter turn that takes (x, y) to (y, -x).
struct triangle_shape {
  double r;
  double s;
};
inline triangle_shape shape_of_triangle(point2 p0, point2 p1, point2 p2) {
  const point2 a = {p0.x - p1.x, p0.y - p1.y};
  const point2 b = {p2.x - p1.x, p2.y - p1.y};
  const double inverse_square = 1 / (b.x * b.x + b.y * b.y);
  return {(a.x * b.x + a.y * b.y) * inverse_square, (a.x * b.y - a.y * b.x) * inverse_square};
}

// Finds the vertices of a grid such that tracked points reach their targets while each triangle of
// the grid stays as similar as it can to its shape (Igarashi, Moscovich and Hughes, As-rigid-as-
// possible shape manipulation, 2005, its first step): a sparse linear least-squares problem in the
// vertices' positions. Minimises
//   sum over displacements of data_weight w / wmax |bilinear mix of the cell's corners - target|^2
//   + 200 sum over cells of the misfit of four triangles (TL BL BR), (BL BR TR), (BR TR TL), (TR TL
//   BL), each two equations.
//
// The normal matrix is kept as a band, vertices counted along the grid's shorter side, and factored
// by Cholesky: on grids of this size that takes a tenth of the time of a sparse factorization with
// a fill-reducing order (see the benchmark), and its structure never depends on which couplings are
// zero, which differs between a similarity, an affine map and a homography.
class grid_solver {
 public:
  // cols and rows at least 2.
  grid_solver(std::int32_t cols, std::int32_t rows);

  // shape: the grid whose triangles are to be kept; solution: the same layout, cols * rows pairs,
  // row-major. Uses cells, fractions, targets and weights of the list. False, with the solution
  // untouched, when the system is not positive definite, as with no weight at all.
  bool solve(std::span<const Displacement> list, std::span<const double> shape, double data_weight,
             std::span<double> solution);

 private:
  // Every equation comes in a pair, x and y, that is one equation between complex numbers: so the
  // normal matrix is Hermitian, one complex number for a pair of vertices. Kept for each vertex:
  // itself and its neighbours right, below left, below and below right. The entry of (i, j) is
  // conj(c_i) c_j.
  struct vertex_row {
    double self;
    double re[4];
    double im[4];
  };
  enum neighbour { kRight, kBelowLeft, kBelow, kBelowRight };

  void add_shape(std::span<const double> shape);
  void add_data(std::span<const Displacement> list, double data_weight);
  void fill_system();
  // A vertex's place in the unknowns' order.
  std::size_t order(std::size_t vertex) const;

  const std::int32_t cols_;
  const std::int32_t rows_;
  std::vector<vertex_row> matrix_;
  std::vector<double> right_;  // by vertex, x then y
  hermitian_band_system system_;
};

}  // namespace marrow::stabilization
