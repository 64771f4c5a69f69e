#include "tracking/translation_solver.h"

#include <cmath>

#include "tracking/correlation.h"
#include "tracking/window_moments.h"
#include "tracking/window_products.h"
#include "tracking/window_residuals.h"
#include "tracking/window_sampling.h"

namespace marrow::tracking {
namespace {

bool FindPlace(const level_image& image, const window_shape& shape, const AffineState& state,
               translated_sampling& place) {
  if (image.width < 2 * shape.half_x + 2 || image.height < 2 * shape.half_y + 3) return false;
  const double x = static_cast<double>(state.x) + static_cast<double>(state.dx);
  const double y = static_cast<double>(state.y) + static_cast<double>(state.dy);
  const double ix = std::floor(x);
  const double iy = std::floor(y);
  const auto half_x = static_cast<double>(shape.half_x);
  const auto half_y = static_cast<double>(shape.half_y);
  // A position that is not a number fails each of these.
  if (!(ix >= half_x && ix <= static_cast<double>(image.width) - half_x - 2.0 && iy >= half_y &&
        iy <= static_cast<double>(image.height) - half_y - 3.0)) {
    return false;
  }
  place = {static_cast<std::size_t>(ix) - shape.half_x, static_cast<std::size_t>(iy) - shape.half_y,
           static_cast<float>(x - ix), static_cast<float>(y - iy)};
  return true;
}

void Sample(const level_image& image, const window_shape& shape, const translated_sampling& place,
            float* window) {
  image.WithSamples([&](const auto* samples) {
    kernels::SampleTranslated(samples, image.width, shape.channels, place, shape.columns(),
                              shape.rows(), window, shape.stride());
  });
}

// T = gain I + bias by least squares, for each channel. A flat window gives no finite answer.
void RegressColors(const float* t, const channel_moments& t_moments, const float* window,
                   const window_shape& shape, AffineState& state) {
  float mean[kMaxChannels];
  double product[kMaxChannels];
  double square[kMaxChannels];
  kernels::ChannelMeans(window, shape, mean);
  kernels::CentredProducts(t, t_moments.mean, window, mean, shape, product, square);
  for (std::size_t c = 0; c < shape.channels; ++c) {
    const double gain = product[c] / square[c];
    state.gain[c] = static_cast<float>(gain);
    state.bias[c] = static_cast<float>(static_cast<double>(t_moments.mean[c]) -
                                       gain * static_cast<double>(mean[c]));
  }
}

}  // namespace

bool UpdateColors(const double* steps, std::size_t channels, const solver_tolerances& tolerances,
                  AffineState& state) {
  bool small = true;
  for (std::size_t c = 0; c < channels; ++c) {
    const auto lambda = static_cast<float>(steps[2 * c]);
    const auto delta = static_cast<float>(steps[2 * c + 1]);
    const float e = std::exp(lambda);
    state.gain[c] *= e;
    state.bias[c] = (state.bias[c] + delta) * e;
    small = small && std::abs(lambda) < tolerances.color_lambda &&
            std::abs(delta) < tolerances.color_delta;
  }
  return small;
}

bool PrepareTranslation(const float* t, const window_shape& shape, color_mode mode,
                        translation_normal& normal) {
  if (mode != color_mode::joint) {
    double sums[3];
    kernels::GradientProducts(t, shape, sums);
    const double xx = 0.25 * sums[0];
    const double xy = 0.25 * sums[1];
    const double yy = 0.25 * sums[2];
    const double determinant = xx * yy - xy * xy;
    normal.xx = yy / determinant;
    normal.xy = -xy / determinant;
    normal.yy = xx / determinant;
    return true;
  }
  template_products products;
  kernels::TemplateProducts(t, shape, products);
  const std::size_t rows = 2 + 2 * shape.channels;
  double h[packed_cholesky::kMaxRows * packed_cholesky::kMaxRows] = {};
  h[0] = 0.25 * products.gradient[0][0];
  h[rows] = 0.25 * products.gradient[1][0];
  h[rows + 1] = 0.25 * products.gradient[2][0];
  for (std::size_t c = 0; c < shape.channels; ++c) {
    double* gain_row = h + (2 + 2 * c) * rows;
    double* bias_row = gain_row + rows;
    for (std::size_t axis = 0; axis < 2; ++axis) {
      gain_row[axis] = 0.5 * products.cross[c][axis][0];
      bias_row[axis] = 0.5 * products.cross[c][2 + axis][0];
    }
    gain_row[2 + 2 * c] = products.square[c];
    bias_row[2 + 2 * c] = products.sum[c];
    bias_row[3 + 2 * c] = static_cast<double>(shape.pixels());
  }
  return normal.joint.Factor(h, rows);
}

int SolveTranslation(const float* t, const window_shape& shape, const translation_normal& normal,
                     const level_image& image, color_mode mode, const solver_tolerances& tolerances,
                     int max_iterations, AffineState& state, float* window) {
  switch (mode) {
    case color_mode::none:
    case color_mode::joint:
    case color_mode::regressed:
      break;
    case color_mode::unused:  // never updates, so it can only run out of iterations
      return max_iterations;
    default:  // a number read from settings
      return kLevelFailed;
  }
  channel_moments moments;
  if (mode == color_mode::regressed) moments = ChannelMoments(t, shape);
  for (int k = 0; k < max_iterations; ++k) {
    translated_sampling place;
    if (!FindPlace(image, shape, state, place)) return kLevelFailed;
    if (mode == color_mode::regressed) {
      Sample(image, shape, place, window);
      RegressColors(t, moments, window, shape, state);
    }
    color_fit color;
    if (mode != color_mode::none) color = {state.gain, state.bias};
    double step[packed_cholesky::kMaxRows];
    image.WithSamples([&](const auto* samples) {
      kernels::TranslationResidual(t, samples, image.width, image.height, place, shape, color,
                                   step);
    });
    const double bx = 0.5 * step[0];
    const double by = 0.5 * step[1];
    if (mode == color_mode::joint) {
      step[0] = bx;
      step[1] = by;
      normal.joint.Solve(step);
    } else {
      step[0] = normal.xx * bx + normal.xy * by;
      step[1] = normal.xy * bx + normal.yy * by;
    }
    const auto delta_x = static_cast<float>(step[0]);
    const auto delta_y = static_cast<float>(step[1]);
    state.dx += delta_x;
    state.dy += delta_y;
    bool converged =
        std::abs(delta_x) < tolerances.translation && std::abs(delta_y) < tolerances.translation;
    if (mode == color_mode::joint && !UpdateColors(step + 2, shape.channels, tolerances, state)) {
      converged = false;
    }
    if (converged || k + 1 == max_iterations) {
      Sample(image, shape, place, window);
      return converged ? k : max_iterations;
    }
  }
  return max_iterations;
}

}  // namespace marrow::tracking
