#include "stabilization/grid_solver.h"

#include <algorithm>
#include <cmath>

#include "platform/lapack/lapack.h"

namespace marrow::stabilization {
namespace {

constexpr double kSmoothness = 200.0;

}  // namespace

triangle_shape shape_of_triangle(point2 p0, point2 p1, point2 p2) {
  const point2 a = {p0.x - p1.x, p0.y - p1.y};
  const point2 b = {p2.x - p1.x, p2.y - p1.y};
  const double square = b.x * b.x + b.y * b.y;
  return {(a.x * b.x + a.y * b.y) / square, (a.x * b.y - a.y * b.x) / square};
}

grid_solver::grid_solver(std::int32_t cols, std::int32_t rows)
    : cols_(cols),
      rows_(rows),
      half_bandwidth_(2 * std::min(cols, rows) + 3),
      matrix_(static_cast<std::size_t>(cols) * static_cast<std::size_t>(rows)),
      right_(2 * matrix_.size()),
      band_(right_.size() * static_cast<std::size_t>(half_bandwidth_ + 1)),
      solution_(right_.size()) {}

std::size_t grid_solver::order(std::size_t vertex) const {
  return cols_ <= rows_ ? vertex : vertex % cols_ * rows_ + vertex / cols_;
}

bool grid_solver::solve(std::span<const Displacement> list, std::span<const double> shape,
                        double data_weight, std::span<double> solution) {
  std::fill(matrix_.begin(), matrix_.end(), vertex_row{});
  std::fill(right_.begin(), right_.end(), 0.0);
  add_data(list, data_weight);
  add_shape(shape);
  fill_band();
  for (std::size_t v = 0; v < matrix_.size(); ++v) {
    solution_[2 * order(v)] = right_[2 * v];
    solution_[2 * order(v) + 1] = right_[2 * v + 1];
  }

  const int n = static_cast<int>(right_.size()), leading = half_bandwidth_ + 1, one = 1;
  int info = 0;
  lapack::dpbtrf("L", &n, &half_bandwidth_, band_.data(), &leading, &info);
  if (info != 0) return false;
  for (int j = 0; j < n; ++j) {  // the factorization's own test lets NaN through
    const double pivot = band_[static_cast<std::size_t>(j) * leading];
    if (!(pivot > 0) || !std::isfinite(pivot)) return false;
  }
  lapack::dpbtrs("L", &n, &half_bandwidth_, &one, band_.data(), &leading, solution_.data(), &n,
                 &info);
  if (info != 0) return false;
  for (std::size_t v = 0; v < matrix_.size(); ++v) {
    solution[2 * v] = solution_[2 * order(v)];
    solution[2 * v + 1] = solution_[2 * order(v) + 1];
  }
  return true;
}

void grid_solver::add_data(std::span<const Displacement> list, double data_weight) {
  double largest = 0;
  for (const Displacement& d : list) largest = std::max(largest, d.weight);
  const double scale = data_weight / largest;
  for (const Displacement& d : list) {
    const double w = scale * d.weight;
    const double b[4] = {(1 - d.fracX) * (1 - d.fracY), d.fracX * (1 - d.fracY),
                         (1 - d.fracX) * d.fracY, d.fracX * d.fracY};
    const std::size_t tl = static_cast<std::size_t>(d.cellY) * cols_ + d.cellX;
    const std::size_t bl = tl + cols_;
    const std::size_t corner[4] = {tl, tl + 1, bl, bl + 1};
    for (int i = 0; i < 4; ++i) {
      matrix_[corner[i]].self += w * b[i] * b[i];
      right_[2 * corner[i]] += w * b[i] * d.targetX;
      right_[2 * corner[i] + 1] += w * b[i] * d.targetY;
    }
    matrix_[tl].re[kRight] += w * b[0] * b[1];
    matrix_[tl].re[kBelow] += w * b[0] * b[2];
    matrix_[tl].re[kBelowRight] += w * b[0] * b[3];
    matrix_[tl + 1].re[kBelowLeft] += w * b[1] * b[2];
    matrix_[tl + 1].re[kBelow] += w * b[1] * b[3];
    matrix_[bl].re[kRight] += w * b[2] * b[3];
  }
}

void grid_solver::add_shape(std::span<const double> shape) {
  // Corners of a cell in index order: TL 0, TR 1, BL 2, BR 3.
  enum { TL, TR, BL, BR };
  constexpr int kTriangles[4][3] = {{TL, BL, BR}, {BL, BR, TR}, {BR, TR, TL}, {TR, TL, BL}};
  for (std::int32_t r = 0; r + 1 < rows_; ++r) {
    for (std::int32_t c = 0; c + 1 < cols_; ++c) {
      const std::size_t tl = static_cast<std::size_t>(r) * cols_ + c;
      const std::size_t corner[4] = {tl, tl + 1, tl + cols_, tl + cols_ + 1};
      point2 p[4];
      for (int i = 0; i < 4; ++i) p[i] = {shape[2 * corner[i]], shape[2 * corner[i] + 1]};

      double self[4] = {};
      double re[4][4] = {}, im[4][4] = {};  // [i][j], i < j
      for (const auto& t : kTriangles) {
        const triangle_shape k = shape_of_triangle(p[t[0]], p[t[1]], p[t[2]]);
        // -v0 + (1 - z) v1 + z v2 = 0 with z = r - i s.
        const double cr[3] = {-1, 1 - k.r, k.r};
        const double ci[3] = {0, k.s, -k.s};
        for (int a = 0; a < 3; ++a) {
          self[t[a]] += cr[a] * cr[a] + ci[a] * ci[a];
          for (int b = a + 1; b < 3; ++b) {
            const double real = cr[a] * cr[b] + ci[a] * ci[b];
            const double imaginary = cr[a] * ci[b] - ci[a] * cr[b];
            if (t[a] < t[b]) {
              re[t[a]][t[b]] += real;
              im[t[a]][t[b]] += imaginary;
            } else {
              re[t[b]][t[a]] += real;
              im[t[b]][t[a]] -= imaginary;
            }
          }
        }
      }
      for (int i = 0; i < 4; ++i) matrix_[corner[i]].self += kSmoothness * self[i];
      const auto add = [&](int i, int j, neighbour at) {
        matrix_[corner[i]].re[at] += kSmoothness * re[i][j];
        matrix_[corner[i]].im[at] += kSmoothness * im[i][j];
      };
      add(TL, TR, kRight);
      add(TL, BL, kBelow);
      add(TL, BR, kBelowRight);
      add(TR, BL, kBelowLeft);
      add(TR, BR, kBelow);
      add(BL, BR, kRight);
    }
  }
}

void grid_solver::fill_band() {
  std::fill(band_.begin(), band_.end(), 0.0);
  const std::size_t leading = static_cast<std::size_t>(half_bandwidth_) + 1;
  const auto entry = [&](std::size_t i, std::size_t j) -> double& {
    return band_[leading * j + i - j];
  };
  for (std::int32_t r = 0; r < rows_; ++r) {
    for (std::int32_t c = 0; c < cols_; ++c) {
      const std::size_t v = static_cast<std::size_t>(r) * cols_ + c;
      const vertex_row& m = matrix_[v];
      const std::size_t here = 2 * order(v);
      entry(here, here) = m.self;
      entry(here + 1, here + 1) = m.self;
      const bool below = r + 1 < rows_;
      const bool inside[4] = {c + 1 < cols_, below && c > 0, below, below && c + 1 < cols_};
      const std::size_t other[4] = {v + 1, v + cols_ - 1, v + cols_, v + cols_ + 1};
      for (int k = 0; k < 4; ++k) {
        if (!inside[k]) continue;
        const std::size_t there = 2 * order(other[k]);
        // The lower triangle holds the block transposed where `there` comes later.
        const std::size_t i = std::max(here, there), j = std::min(here, there);
        const double im = there > here ? m.im[k] : -m.im[k];
        entry(i, j) = entry(i + 1, j + 1) = m.re[k];
        entry(i, j + 1) = im;
        entry(i + 1, j) = -im;
      }
    }
  }
}

}  // namespace marrow::stabilization
