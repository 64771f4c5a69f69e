#include "stabilization/warp/grid_solver.h"

#include <algorithm>

namespace marrow::stabilization {
namespace {

constexpr double kSmoothness = 200.0;

}  // namespace

grid_solver::grid_solver(std::int32_t cols, std::int32_t rows)
    : cols_(cols),
      rows_(rows),
      matrix_(static_cast<std::size_t>(cols) * static_cast<std::size_t>(rows)),
      right_(2 * matrix_.size()),
      system_(matrix_.size(), static_cast<std::size_t>(std::min(cols, rows)) + 1) {}

std::size_t grid_solver::order(std::size_t vertex) const {
  return cols_ <= rows_ ? vertex : vertex % cols_ * rows_ + vertex / cols_;
}

bool grid_solver::solve(std::span<const Displacement> list, std::span<const double> shape,
                        double data_weight, std::span<double> solution) {
  std::fill(matrix_.begin(), matrix_.end(), vertex_row{});
  std::fill(right_.begin(), right_.end(), 0.0);
  add_data(list, data_weight);
  add_shape(shape);
  fill_system();
  if (!system_.solve()) return false;
  for (std::size_t v = 0; v < matrix_.size(); ++v) {
    solution[2 * v] = system_.solution_re(order(v));
    solution[2 * v + 1] = system_.solution_im(order(v));
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

void grid_solver::fill_system() {
  system_.clear();
  for (std::int32_t r = 0; r < rows_; ++r) {
    for (std::int32_t c = 0; c < cols_; ++c) {
      const std::size_t v = static_cast<std::size_t>(r) * cols_ + c;
      const vertex_row& m = matrix_[v];
      const std::size_t here = order(v);
      system_.set_right(here, right_[2 * v], right_[2 * v + 1]);
      system_.set(here, here, m.self, 0);
      const bool below = r + 1 < rows_;
      const bool inside[4] = {c + 1 < cols_, below && c > 0, below, below && c + 1 < cols_};
      const std::size_t other[4] = {v + 1, v + cols_ - 1, v + cols_, v + cols_ + 1};
      for (int k = 0; k < 4; ++k) {
        if (!inside[k]) continue;
        // The lower triangle holds the conjugate where the other vertex comes later.
        const std::size_t there = order(other[k]);
        if (there > here) {
          system_.set(there, here, m.re[k], -m.im[k]);
        } else {
          system_.set(here, there, m.re[k], m.im[k]);
        }
      }
    }
  }
}

}  // namespace marrow::stabilization
