#pragma once

#include <cstddef>
#include <cstdint>

// The loops over a tracking window's samples, vectorized by Highway with the instruction set chosen
// at run time. A window is a plane of interleaved samples; the pointer to it is to its first
// sample, and its rows start window_shape::stride() floats apart. A template has a border of one
// pixel, from which its gradients come, the central differences Gx(u, v) = T(u + 1, v) - T(u - 1,
// v) and Gy likewise, not halved. Kernels read, and ignore, whatever else a plane holds,
// which in a template has to be finite. Sums run in 32-bit lanes, sixteen of each channel whatever
// the width of a vector, and are joined in double.
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

// T = gain * I + bias for each channel; null stands for gain 1 and bias 0.
struct color_fit {
  const float* gain = nullptr;
  const float* bias = nullptr;
};

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

// The sums that make up the normal matrices of both stages.
struct template_products {
  // [gx gx, gx gy, gy gy][1, u, v, u u, u v, v v], over all channels.
  double gradient[3][6];
  // For each channel [gx T, gy T, gx, gy][1, u, v], and S(T T), S(T).
  double cross[kMaxChannels][4][3];
  double square[kMaxChannels];
  double sum[kMaxChannels];
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

// With r = T - (gain I + bias), I what SampleTranslated gives for the window at `place`, which goes
// no further than into registers: sums = {S(gx r), S(gy r)}, with a color fit followed by S(T r)
// and S(r) of each channel.
void TranslationResidual(const float* t, const float* image, std::size_t image_width,
                         std::size_t image_height, const translated_sampling& place,
                         const window_shape& shape, const color_fit& color, double* sums);
void TranslationResidual(const float* t, const std::uint8_t* image, std::size_t image_width,
                         std::size_t image_height, const translated_sampling& place,
                         const window_shape& shape, const color_fit& color, double* sums);

// As above for the affine Jacobian, of a window that was sampled before: {S(gx r), S(gy r),
// S(u gx r), S(v gx r), S(u gy r), S(v gy r)}, and the same with a color fit.
void AffineResidual(const float* t, const float* window, const window_shape& shape,
                    const color_fit& color, double* sums);

// sums = {S(gx gx), S(gx gy), S(gy gy)}.
void GradientProducts(const float* t, const window_shape& shape, double sums[3]);

void TemplateProducts(const float* t, const window_shape& shape, template_products& products);

// S(t t) of each channel.
void ChannelEnergies(const float* t, const window_shape& shape, double* energies);

// Mean of each channel; exact for a flat channel.
void ChannelMeans(const float* window, const window_shape& shape, float* means);

// Sums about the given means for each channel: S(x x), and with y S(x y) and S(y y).
void CentredSquares(const float* x, const float* x_means, const window_shape& shape, double* xx);
void CentredProducts(const float* x, const float* x_means, const float* y, const float* y_means,
                     const window_shape& shape, double* xy, double* yy);

}  // namespace kernels
}  // namespace marrow::tracking
