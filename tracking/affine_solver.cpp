#include "tracking/affine_solver.h"

#include <cmath>

#include "tracking/window_products.h"
#include "tracking/window_residuals.h"
#include "tracking/window_sampling.h"

namespace marrow::tracking {
namespace {

bool SampleWarped(const level_image& image, const window_shape& shape, const AffineState& state,
                  float* window) {
  const double x = static_cast<double>(state.x) + static_cast<double>(state.dx);
  const double y = static_cast<double>(state.y) + static_cast<double>(state.dy);
  // The centre lies between the corners; this makes the conversion to whole pixels safe.
  if (!(x > 0.0 && x < static_cast<double>(image.width) && y > 0.0 &&
        y < static_cast<double>(image.height))) {
    return false;
  }
  const double ix = std::floor(x);
  const double iy = std::floor(y);
  const affine_sampling warp = {static_cast<std::ptrdiff_t>(ix),
                                static_cast<std::ptrdiff_t>(iy),
                                static_cast<float>(x - ix),
                                static_cast<float>(y - iy),
                                1.0f + state.a,
                                state.b,
                                state.c,
                                1.0f + state.d};
  if (!kernels::AffineWindowInside(warp, shape, image.width, image.height)) return false;
  image.WithSamples([&](const auto* samples) {
    kernels::SampleAffine(samples, image.width, image.height, warp, shape, window);
  });
  return true;
}

}  // namespace

bool PrepareAffine(const float* t, const window_shape& shape, bool with_color,
                   packed_cholesky& normal) {
  template_products products;
  kernels::TemplateProducts(t, shape, products);
  const std::size_t rows = 6 + (with_color ? 2 * shape.channels : 0);
  double h[packed_cholesky::kMaxRows * packed_cholesky::kMaxRows] = {};
  // Motion column m is gradient axis[m] times factor[m] of (1, u, v); the product of two factors
  // is found in moment[][] of (1, u, v, uu, uv, vv).
  constexpr std::size_t axis[6] = {0, 1, 0, 0, 1, 1};
  constexpr std::size_t factor[6] = {0, 0, 1, 2, 1, 2};
  constexpr std::size_t moment[3][3] = {{0, 1, 2}, {1, 3, 4}, {2, 4, 5}};
  for (std::size_t i = 0; i < 6; ++i) {
    for (std::size_t j = 0; j <= i; ++j) {
      h[i * rows + j] = 0.25 * products.gradient[axis[i] + axis[j]][moment[factor[i]][factor[j]]];
    }
  }
  for (std::size_t c = 0; with_color && c < shape.channels; ++c) {
    double* gain_row = h + (6 + 2 * c) * rows;
    double* bias_row = gain_row + rows;
    for (std::size_t m = 0; m < 6; ++m) {
      gain_row[m] = 0.5 * products.cross[c][axis[m]][factor[m]];
      bias_row[m] = 0.5 * products.cross[c][2 + axis[m]][factor[m]];
    }
    gain_row[6 + 2 * c] = products.square[c];
    bias_row[6 + 2 * c] = products.sum[c];
    bias_row[7 + 2 * c] = static_cast<double>(shape.pixels());
  }
  return normal.Factor(h, rows);
}

void ComposeAffine(const double* step, AffineState& state) {
  const double m00 = 1.0 + static_cast<double>(state.a), m01 = static_cast<double>(state.b);
  const double m10 = static_cast<double>(state.c), m11 = 1.0 + static_cast<double>(state.d);
  const double n00 = 1.0 - step[2], n01 = -step[3], n10 = -step[4], n11 = 1.0 - step[5];
  const double scale = 1.0 / (n00 * n11 - n01 * n10);
  const double p00 = (m00 * n11 - m01 * n10) * scale;
  const double p01 = (m01 * n00 - m00 * n01) * scale;
  const double p10 = (m10 * n11 - m11 * n10) * scale;
  const double p11 = (m11 * n00 - m10 * n01) * scale;
  state.dx += static_cast<float>(p00 * step[0] + p01 * step[1]);
  state.dy += static_cast<float>(p10 * step[0] + p11 * step[1]);
  state.a = static_cast<float>(p00 - 1.0);
  state.b = static_cast<float>(p01);
  state.c = static_cast<float>(p10);
  state.d = static_cast<float>(p11 - 1.0);
}

int SolveAffine(const float* t, const window_shape& shape, const packed_cholesky& normal,
                const level_image& image, color_mode mode, const solver_tolerances& tolerances,
                int max_iterations, AffineState& state, float* window) {
  if (mode != color_mode::none && mode != color_mode::joint) return kLevelFailed;
  const bool with_color = mode == color_mode::joint;
  for (int k = 0; k < max_iterations; ++k) {
    if (!SampleWarped(image, shape, state, window)) return kLevelFailed;
    color_fit color;
    if (with_color) color = {state.gain, state.bias};
    double step[packed_cholesky::kMaxRows];
    kernels::AffineResidual(t, window, shape, color, step);
    for (std::size_t m = 0; m < 6; ++m) step[m] *= 0.5;
    normal.Solve(step);
    ComposeAffine(step, state);
    bool converged = true;
    for (std::size_t m = 0; m < 6; ++m) {
      const float tolerance = m < 2 ? tolerances.translation : tolerances.affine;
      converged = converged && std::abs(static_cast<float>(step[m])) < tolerance;
    }
    if (with_color && !UpdateColors(step + 6, shape.channels, tolerances, state)) converged = false;
    if (converged) return k;
  }
  return max_iterations;
}

}  // namespace marrow::tracking
