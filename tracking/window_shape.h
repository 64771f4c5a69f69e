#pragma once

#include <cstddef>

// The loops over a tracking window's samples, in window_sampling.h, window_residuals.h,
// window_products.h and window_moments.h, are vectorized by Highway with the instruction set chosen
// at run time. A window is a plane of interleaved samples; the pointer to it is to its first
// sample, and its rows start window_shape::stride() floats apart. A template has a border of one
// pixel, from which its gradients come, the central differences Gx(u, v) = T(u + 1, v) - T(u - 1,
// v) and Gy likewise, not halved. Kernels read, and ignore, whatever else a plane holds, which in a
// template has to be finite. Sums run in 32-bit lanes, sixteen of each channel whatever the width
// of a vector, and are joined in double.
namespace marrow::tracking {

inline constexpr std::size_t kMaxChannels = 4;
inline constexpr std::size_t kWindowLanes = 16;  // of the longest vector

// (2 * half_x + 1) by (2 * half_y + 1) pixels of 1 to kMaxChannels interleaved samples.
struct window_shape {
  std::size_t half_x = 0;
  std::size_t half_y = 0;
  std::size_t channels = 0;

  std::size_t columns() const { return 2 * half_x + 1; }
  std::size_t rows() const { return 2 * half_y + 1; }
  std::size_t pixels() const { return columns() * rows(); }
  std::size_t row_samples() const { return columns() * channels; }
  // Floats from row to row: a pixel of border on either side, in whole vectors.
  std::size_t stride() const {
    return (row_samples() + 2 * channels + kWindowLanes - 1) / kWindowLanes * kWindowLanes;
  }
  // Floats of a plane with its border, and those of them before the window's first sample. With
  // the plane's start every row's start is aligned to a vector.
  std::size_t plane_size() const { return (rows() + 2) * stride() + 2 * kWindowLanes; }
  std::size_t plane_start() const { return stride() + kWindowLanes; }
};

}  // namespace marrow::tracking
