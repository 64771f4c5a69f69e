#pragma once

#include <array>

namespace marrow::stabilization {

struct point2 {
  double x;
  double y;
};

// 3 x 3, row-major, acting on column vectors; the last entry is 1 in every motion of the system.
using matrix3 = std::array<double, 9>;

inline constexpr matrix3 identity3 = {1, 0, 0, 0, 1, 0, 0, 0, 1};

// The image of p, with the projective division.
inline point2 transform(const matrix3& m, point2 p) {
  const double w = m[6] * p.x + m[7] * p.y + m[8];
  return {(m[0] * p.x + m[1] * p.y + m[2]) / w, (m[3] * p.x + m[4] * p.y + m[5]) / w};
}

// a after b.
matrix3 multiply(const matrix3& a, const matrix3& b);

// The adjugate scaled so that the last entry is 1; entries are not finite where m is singular or
// maps the origin's preimage to infinity.
matrix3 inverse(const matrix3& m);

// The similarity (scale, angle in radians, tx, ty) as a matrix.
matrix3 similarity_matrix(double scale, double angle, double tx, double ty);

// The projective map from the unit square to a quadrilateral: (0,0), (1,0), (0,1), (1,1) go to p0,
// p1, p2, p3 (Heckbert, Fundamentals of Texture Mapping and Image Warping, 1989). Where the corners
// are a parallelogram to within 1e-5 in x or in y, either one sufficing, the affine map with
// columns p1 - p0, p3 - p1, p0.
matrix3 square_to_quad(point2 p0, point2 p1, point2 p2, point2 p3);

}  // namespace marrow::stabilization
