#pragma once

#include <cstddef>
#include <cstdint>

#include "tracking/window_shape.h"

namespace marrow::tracking {

// Where the first of a block of pixels lies: at (x + fx, y + fy), 0 <= f < 1.
struct translated_sampling {
  std::size_t x, y;
  float fx, fy;
};

// The affine warp of a window's offsets: offset (u, v) lies at
//   (x + fx + m00 u + m01 v, y + fy + m10 u + m11 v), x and y whole pixels, 0 <= fx, fy < 1.
struct affine_sampling {
  std::ptrdiff_t x, y;
  float fx, fy;
  float m00, m01, m10, m11;
};

namespace kernels {

// Bilinear sample of columns x rows pixels to rows `out_stride` floats apart. Reads pixels x to
// x + columns and y to y + rows of the image, which must be inside it. Bytes give what floats of
// their values give.
void SampleTranslated(const float* image, std::size_t image_width, std::size_t channels,
                      const translated_sampling& place, std::size_t columns, std::size_t rows,
                      float* out, std::size_t out_stride);
void SampleTranslated(const std::uint8_t* image, std::size_t image_width, std::size_t channels,
                      const translated_sampling& place, std::size_t columns, std::size_t rows,
                      float* out, std::size_t out_stride);

// True if the four corners of the window, and with them all of it, have 0 < X < width - 1 and
// 0 < Y < height - 1. False if a coefficient is not finite.
bool AffineWindowInside(const affine_sampling& warp, const window_shape& shape,
                        std::size_t image_width, std::size_t image_height);

// Bilinear sample at the warped offsets of a window for which AffineWindowInside holds. Whole
// vectors are written, up to the border of the next row.
void SampleAffine(const float* image, std::size_t image_width, std::size_t image_height,
                  const affine_sampling& warp, const window_shape& shape, float* out);
void SampleAffine(const std::uint8_t* image, std::size_t image_width, std::size_t image_height,
                  const affine_sampling& warp, const window_shape& shape, float* out);

}  // namespace kernels
}  // namespace marrow::tracking
