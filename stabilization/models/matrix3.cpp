#include "stabilization/models/matrix3.h"

#include <cmath>

namespace marrow::stabilization {

matrix3 multiply(const matrix3& a, const matrix3& b) {
  matrix3 product;
  for (int r = 0; r < 3; ++r) {
    for (int c = 0; c < 3; ++c) {
      product[3 * r + c] = a[3 * r] * b[c] + a[3 * r + 1] * b[3 + c] + a[3 * r + 2] * b[6 + c];
    }
  }
  return product;
}

matrix3 inverse(const matrix3& m) {
  matrix3 adjugate = {
      m[4] * m[8] - m[5] * m[7], m[2] * m[7] - m[1] * m[8], m[1] * m[5] - m[2] * m[4],
      m[5] * m[6] - m[3] * m[8], m[0] * m[8] - m[2] * m[6], m[2] * m[3] - m[0] * m[5],
      m[3] * m[7] - m[4] * m[6], m[1] * m[6] - m[0] * m[7], m[0] * m[4] - m[1] * m[3]};
  const double scale = 1.0 / adjugate[8];
  for (double& entry : adjugate) entry *= scale;
  return adjugate;
}

matrix3 similarity_matrix(double scale, double angle, double tx, double ty) {
  const double c = scale * std::cos(angle);
  const double s = scale * std::sin(angle);
  return {c, -s, tx, s, c, ty, 0, 0, 1};
}

matrix3 square_to_quad(point2 p0, point2 p1, point2 p2, point2 p3) {
  const double sx = p0.x - p1.x + p3.x - p2.x;
  const double sy = p0.y - p1.y + p3.y - p2.y;
  if (std::fabs(sx) < 1e-5 || std::fabs(sy) < 1e-5) {
    return {p1.x - p0.x, p3.x - p1.x, p0.x, p1.y - p0.y, p3.y - p1.y, p0.y, 0, 0, 1};
  }
  const double dx1 = p1.x - p3.x;
  const double dy1 = p1.y - p3.y;
  const double dx2 = p2.x - p3.x;
  const double dy2 = p2.y - p3.y;
  const double determinant = dx1 * dy2 - dx2 * dy1;
  const double g = (sx * dy2 - dx2 * sy) / determinant;
  const double h = (dx1 * sy - sx * dy1) / determinant;
  return {p1.x - p0.x + g * p1.x,
          p2.x - p0.x + h * p2.x,
          p0.x,
          p1.y - p0.y + g * p1.y,
          p2.y - p0.y + h * p2.y,
          p0.y,
          g,
          h,
          1};
}

}  // namespace marrow::stabilization
