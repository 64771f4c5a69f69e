#pragma once

#include <cstddef>
#include <cstdint>

// The loops over a tracking window's samples, vectorized by Highway with the instruction set chosen
// at run time. A window is a plane of interleaved samples, row after row without gaps, followed by
// padding up to window_shape::plane_size() floats. Kernels read the padding of every plane: it must
// be 0 in templates and gradients and finite in a sampled window. Sums run in 32-bit lanes and are
// joined in double.
namespace marrow::tracking {

inline constexpr std::size_t kMaxChannels = 4;

// (2 * half_x + 1) by (2 * half_y + 1) pixels of 1 to kMaxChannels interleaved samples.
struct window_shape {
  std::size_t half_x = 0;
  std::size_t half_y = 0;
  std::size_t channels = 0;

  std::size_t columns() const { return 2 * half_x + 1; }
  std::size_t rows() const { return 2 * half_y + 1; }
  std::size_t pixels() const { return columns() * rows(); }
  std::size_t samples() const { return pixels() * channels; }
  // Room for whole vectors of 16 lanes of each channel, and for one sample more.
  std::size_t plane_size() const { return (pixels() + 16) / 16 * 16 * channels; }
};

// The planes of one level of a template: T and its central differences, which are not halved.
struct template_planes {
  const float* t;
  const float* gx;
  const float* gy;
};

// u and v of each sample of a window, in a plane each.
struct offset_planes {
  const float* u;
  const float* v;
};

// T = gain * I + bias for each channel; null stands for gain 1 and bias 0.
struct color_fit {
  const float* gain = nullptr;
  const float* bias = nullptr;
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

// Bilinear sample of columns x rows pixels whose first lies at (x + fx, y + fy), 0 <= f < 1. Reads
// pixels x to x + columns and y to y + rows of the image, which must be inside it. Bytes give what
// floats of their values give.
void SampleTranslated(const float* image, std::size_t image_width, std::size_t channels,
                      std::size_t x, std::size_t y, float fx, float fy, std::size_t columns,
                      std::size_t rows, float* out);
void SampleTranslated(const std::uint8_t* image, std::size_t image_width, std::size_t channels,
                      std::size_t x, std::size_t y, float fx, float fy, std::size_t columns,
                      std::size_t rows, float* out);

// Splits a block of columns + 2 by rows + 2 pixels into its inner window and the central
// differences (f(x + 1) - f(x - 1)). Padding of the three planes is not touched.
void SplitGradients(const float* block, const window_shape& shape, float* t, float* gx, float* gy);

// True if the four corners of the window, and with them all of it, have 0 < X < width - 1 and
// 0 < Y < height - 1. False if a coefficient is not finite.
bool AffineWindowInside(const affine_sampling& warp, const window_shape& shape,
                        std::size_t image_width, std::size_t image_height);

// Bilinear sample at the warped offsets of a window for which AffineWindowInside holds. One sample
// behind the window is set to 0.
void SampleAffine(const float* image, std::size_t image_width, std::size_t image_height,
                  const affine_sampling& warp, const window_shape& shape, float* out);
void SampleAffine(const std::uint8_t* image, std::size_t image_width, std::size_t image_height,
                  const affine_sampling& warp, const window_shape& shape, float* out);

// sums = {S(gx gx), S(gx gy), S(gy gy)}.
void GradientProducts(const template_planes& level, const window_shape& shape, double sums[3]);

// With r = T - (gain I + bias): sums = {S(gx r), S(gy r)}; with per_channel set, followed by S(T r)
// and S(r) of each channel.
void TranslationResidual(const template_planes& level, const float* window,
                         const window_shape& shape, const color_fit& color, bool per_channel,
                         double* sums);

// As above for the affine Jacobian: {S(gx r), S(gy r), S(u gx r), S(v gx r), S(u gy r), S(v gy r)},
// with a color fit followed by S(T r) and S(r) of each channel.
void AffineResidual(const template_planes& level, const offset_planes& offsets, const float* window,
                    const window_shape& shape, const color_fit& color, double* sums);

void TemplateProducts(const template_planes& level, const offset_planes& offsets,
                      const window_shape& shape, template_products& products);

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
