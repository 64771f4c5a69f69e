#include "host/stabilize/homography.h"

#include <cmath>
#include <cstddef>
#include <optional>

namespace calmframe::host {
namespace {

// Solves A x = b of the upper triangle, A positive definite (Cholesky); none where it isn't.
std::optional<Homography> Solve(std::array<std::array<double, 8>, 8> a, Homography b) {
  for (std::size_t i = 0; i < 8; ++i) {
    for (std::size_t j = i; j < 8; ++j) {
      double sum = a[i][j];
      for (std::size_t k = 0; k < i; ++k) sum -= a[k][i] * a[k][j];
      if (i == j) {
        if (!(sum > 1e-12)) return {};
        a[i][i] = std::sqrt(sum);
      } else {
        a[i][j] = sum / a[i][i];
      }
    }
  }
  for (std::size_t i = 0; i < 8; ++i) {
    for (std::size_t k = 0; k < i; ++k) b[i] -= a[k][i] * b[k];
    b[i] /= a[i][i];
  }
  for (std::size_t i = 8; i-- > 0;) {
    for (std::size_t k = i + 1; k < 8; ++k) b[i] -= a[i][k] * b[k];
    b[i] /= a[i][i];
  }
  return b;
}

}  // namespace

Matrix Product(const Matrix& then, const Matrix& first) {
  Matrix product{};
  for (std::size_t i = 0; i < 9; ++i) {
    const std::size_t row = i / 3 * 3, column = i % 3;
    for (std::size_t k = 0; k < 3; ++k) product[i] += then[row + k] * first[3 * k + column];
  }
  return product;
}

Point Apply(const Homography& h, Point p) {
  const double w = h[6] * p.x + h[7] * p.y + 1;
  return {(h[0] * p.x + h[1] * p.y + h[2]) / w, (h[3] * p.x + h[4] * p.y + h[5]) / w};
}

Point Apply(const Matrix& m, Point p) {
  const double w = m[6] * p.x + m[7] * p.y + m[8];
  return {(m[0] * p.x + m[1] * p.y + m[2]) / w, (m[3] * p.x + m[4] * p.y + m[5]) / w};
}

Homography FitHomography(const std::vector<Point>& from, const std::vector<Point>& to,
                         const Homography& start, double farthest) {
  Homography h = start;
  const int rounds = std::isinf(farthest) ? 1 : 4;
  for (int round = 0; round < rounds; ++round) {
    std::array<std::array<double, 8>, 8> a{};
    Homography b{};
    for (std::size_t i = 0; i < from.size(); ++i) {
      const Point &p = from[i], &q = to[i];
      const Point reached = Apply(h, p);
      const double miss = std::hypot(reached.x - q.x, reached.y - q.y) / farthest;
      if (!(miss < 1)) continue;
      const double weight = (1 - miss * miss) * (1 - miss * miss);
      const double rows[2][8] = {{p.x, p.y, 1, 0, 0, 0, -p.x * q.x, -p.y * q.x},
                                 {0, 0, 0, p.x, p.y, 1, -p.x * q.y, -p.y * q.y}};
      const double right[2] = {q.x, q.y};
      for (int r = 0; r < 2; ++r) {
        for (std::size_t j = 0; j < 8; ++j) {
          if (rows[r][j] == 0) continue;
          b[j] += weight * rows[r][j] * right[r];
          for (std::size_t k = j; k < 8; ++k) a[j][k] += weight * rows[r][j] * rows[r][k];
        }
      }
    }
    // What the points leave open stays as the start has it: no tilt.
    a[6][6] += 1e-3, a[7][7] += 1e-3;
    const std::optional<Homography> solved = Solve(a, b);
    if (!solved) return h;
    h = *solved;
  }
  return h;
}

}  // namespace calmframe::host
