#pragma once

#include <cmath>
#include <cstddef>
#include <limits>
#include <vector>

#include "tracking/affine_solver.h"
#include "tracking/image_pyramid.h"
#include "tracking/window_stack.h"

// Images given by formulas, and plain references for the solvers.
namespace marrow::tracking::testing {

// Smooth, with structure in every direction and colour; 18 to 238.
inline double Pattern(double x, double y, double c) {
  return 128 + 50 * std::sin(0.20 * x + 0.3 * c) + 40 * std::cos(0.15 * y - 0.2 * c) +
         20 * std::sin(0.11 * x + 0.07 * y);
}

// value(x, y, channel) on level 0, the other levels by reduction.
template <class Value>
ImagePyramid Picture(std::size_t width, std::size_t height, std::size_t channels,
                     std::size_t levels, Value value) {
  ImagePyramid pyramid(width, height, channels, levels);
  float* out = pyramid.LevelData(0);
  for (std::size_t y = 0; y < height; ++y) {
    for (std::size_t x = 0; x < width; ++x) {
      for (std::size_t c = 0; c < channels; ++c) {
        *out++ = static_cast<float>(
            value(static_cast<double>(x), static_cast<double>(y), static_cast<double>(c)));
      }
    }
  }
  BuildLevels(pyramid);
  return pyramid;
}

inline level_image Level0(const ImagePyramid& pyramid) {
  return pyramid.Level(0);
}

// A template around a point of level 0, with all that the solvers want beside it.
struct Template {
  Template(const ImagePyramid& pyramid, std::size_t half, float anchor_x, float anchor_y)
      : x(anchor_x), y(anchor_y), stack(half, half, pyramid.channels, pyramid.levels) {
    std::vector<float> scratch(WindowScratchSize(stack.shape));
    ExtractWindowStack(pyramid.levels, x, y, pyramid, stack, scratch.data());
    window.resize(stack.shape.plane_size());
    u.resize(window.size());
    v.resize(window.size());
    const int columns = static_cast<int>(stack.shape.columns());
    const int channels = static_cast<int>(pyramid.channels);
    for (int i = 0; i < static_cast<int>(stack.shape.samples()); ++i) {
      u[i] = static_cast<float>(i / channels % columns - static_cast<int>(half));
      v[i] = static_cast<float>(i / channels / columns - static_cast<int>(half));
    }
  }
  const window_shape& shape() const { return stack.shape; }
  template_planes planes() const { return stack.Level(0); }
  offset_planes offsets() const { return {u.data(), v.data()}; }

  float x, y;
  WindowStack stack;
  std::vector<float> u, v, window;
};

// The Gauss-Newton step by plain loops: least squares of J step = T - (gain I + bias) over the
// window, where I is the present sample. Columns of J: the first `motion` of Gx / 2, Gy / 2,
// u Gx / 2, v Gx / 2, u Gy / 2, v Gy / 2; with `color` T and 1 for each channel.
inline std::vector<double> PlainStep(const Template& t, const AffineState& state,
                                     std::size_t motion, bool color) {
  const std::size_t channels = t.shape().channels;
  const std::size_t rows = motion + (color ? 2 * channels : 0);
  std::vector<std::vector<double>> h(rows, std::vector<double>(rows + 1));
  for (std::size_t i = 0; i < t.shape().samples(); ++i) {
    const std::size_t c = i % channels;
    const double gx = 0.5 * t.planes().gx[i], gy = 0.5 * t.planes().gy[i];
    const double all[] = {gx, gy, t.u[i] * gx, t.v[i] * gx, t.u[i] * gy, t.v[i] * gy};
    std::vector<double> j(all, all + motion);
    j.resize(rows);
    if (color) {
      j[motion + 2 * c] = t.planes().t[i];
      j[motion + 2 * c + 1] = 1;
    }
    const double gain = color ? state.gain[c] : 1, bias = color ? state.bias[c] : 0;
    const double r = t.planes().t[i] - (gain * t.window[i] + bias);
    for (std::size_t a = 0; a < rows; ++a) {
      for (std::size_t b = 0; b < rows; ++b) h[a][b] += j[a] * j[b];
      h[a][rows] += j[a] * r;
    }
  }
  for (std::size_t p = 0; p < rows; ++p) {  // Gauss-Jordan
    for (std::size_t a = 0; a < rows; ++a) {
      if (a == p) continue;
      const double f = h[a][p] / h[p][p];
      for (std::size_t b = p; b <= rows; ++b) h[a][b] -= f * h[p][b];
    }
  }
  std::vector<double> step;
  for (std::size_t p = 0; p < rows; ++p) step.push_back(h[p][rows] / h[p][p]);
  return step;
}

inline constexpr float kNaN = std::numeric_limits<float>::quiet_NaN();

}  // namespace marrow::tracking::testing
