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

// A template around a point of level 0, and room for a sample.
struct Template {
  Template(const ImagePyramid& pyramid, std::size_t half, float anchor_x, float anchor_y)
      : x(anchor_x),
        y(anchor_y),
        stack(half, half, pyramid.channels, pyramid.levels),
        sample(half, half, pyramid.channels, 1) {
    ExtractWindowStack(pyramid.levels, x, y, pyramid, stack);
  }
  const window_shape& shape() const { return stack.shape; }
  const float* plane() const { return stack.Level(0); }
  float* window() { return sample.Level(0); }
  const float* window() const { return sample.Level(0); }

  float x, y;
  WindowStack stack, sample;
};

// One sample of a window, with its place and the gradients of a template.
struct Sample {
  Sample(const window_shape& shape, const float* plane, std::size_t i)
      : c(i % shape.channels),
        u(static_cast<double>(i / shape.channels % shape.columns()) - shape.half_x),
        v(static_cast<double>(i / shape.channels / shape.columns()) - shape.half_y),
        at(i / shape.row_samples() * shape.stride() + i % shape.row_samples()),
        value(plane[at]),
        gx(plane[at + shape.channels] - plane[static_cast<std::ptrdiff_t>(at - shape.channels)]),
        gy(plane[at + shape.stride()] - plane[static_cast<std::ptrdiff_t>(at - shape.stride())]) {}

  std::size_t c;
  double u, v;
  std::size_t at;  // in the plane
  double value, gx, gy;
};

inline std::vector<Sample> Samples(const window_shape& shape, const float* plane) {
  std::vector<Sample> samples;
  for (std::size_t i = 0; i < shape.pixels() * shape.channels; ++i) {
    samples.emplace_back(shape, plane, i);
  }
  return samples;
}

// The Gauss-Newton step by plain loops: least squares of J step = T - (gain I + bias) over the
// window, where I is the present sample and gain and bias are the state's. Columns of J: the first
// `motion` of Gx / 2, Gy / 2, u Gx / 2, v Gx / 2, u Gy / 2, v Gy / 2; with `color` T and 1 for each
// channel.
inline std::vector<double> PlainStep(const Template& t, const AffineState& state,
                                     std::size_t motion, bool color) {
  const std::size_t channels = t.shape().channels;
  const std::size_t rows = motion + (color ? 2 * channels : 0);
  std::vector<std::vector<double>> h(rows, std::vector<double>(rows + 1));
  for (const Sample& s : Samples(t.shape(), t.plane())) {
    const double gx = 0.5 * s.gx, gy = 0.5 * s.gy;
    const double all[] = {gx, gy, s.u * gx, s.v * gx, s.u * gy, s.v * gy};
    std::vector<double> j(all, all + motion);
    j.resize(rows);
    if (color) {
      j[motion + 2 * s.c] = s.value;
      j[motion + 2 * s.c + 1] = 1;
    }
    const double r = s.value - (1.0 * state.gain[s.c] * t.window()[s.at] + state.bias[s.c]);
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
