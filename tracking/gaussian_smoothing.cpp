#include "tracking/gaussian_smoothing.h"

#include <algorithm>
#include <cmath>
#include <cstring>
#include <utility>

#undef HWY_TARGET_INCLUDE
#define HWY_TARGET_INCLUDE "tracking/gaussian_smoothing.cpp"
#include <hwy/foreach_target.h>
#include <hwy/highway.h>

HWY_BEFORE_NAMESPACE();
namespace marrow::tracking {
namespace HWY_NAMESPACE {
namespace hn = hwy::HWY_NAMESPACE;

// out[x] = taps[0] centre[x] + sum over k of taps[k] (before(k)[x] + after(k)[x]). Inputs are
// readable and `out` is writable for one block of vectors past count. Not fused into multiply-adds:
// targets without them would round differently.
template <class Before, class After>
HWY_INLINE void Convolve(const float* taps, std::size_t radius, const float* centre,
                         const Before& before, const After& after, std::size_t count, float* out) {
  const hn::ScalableTag<float> d;
  const std::size_t N = hn::Lanes(d);
  // Four vectors at a time hide the latency of the chain of additions.
  for (std::size_t x = 0; x < count; x += 4 * N) {
    const auto middle = hn::Set(d, taps[0]);
    auto s0 = hn::Mul(middle, hn::LoadU(d, centre + x));
    auto s1 = hn::Mul(middle, hn::LoadU(d, centre + x + N));
    auto s2 = hn::Mul(middle, hn::LoadU(d, centre + x + 2 * N));
    auto s3 = hn::Mul(middle, hn::LoadU(d, centre + x + 3 * N));
    for (std::size_t k = 1; k <= radius; ++k) {
      const auto tap = hn::Set(d, taps[k]);
      const float* b = before(k) + x;
      const float* a = after(k) + x;
      s0 = hn::Add(s0, hn::Mul(tap, hn::Add(hn::LoadU(d, b), hn::LoadU(d, a))));
      s1 = hn::Add(s1, hn::Mul(tap, hn::Add(hn::LoadU(d, b + N), hn::LoadU(d, a + N))));
      s2 = hn::Add(s2, hn::Mul(tap, hn::Add(hn::LoadU(d, b + 2 * N), hn::LoadU(d, a + 2 * N))));
      s3 = hn::Add(s3, hn::Mul(tap, hn::Add(hn::LoadU(d, b + 3 * N), hn::LoadU(d, a + 3 * N))));
    }
    hn::StoreU(s0, d, out + x);
    hn::StoreU(s1, d, out + x + N);
    hn::StoreU(s2, d, out + x + 2 * N);
    hn::StoreU(s3, d, out + x + 3 * N);
  }
}

void SmoothAlongX(const float* taps, std::size_t radius, const float* padded, std::size_t count,
                  float* out) {
  const float* centre = padded + radius;
  Convolve(
      taps, radius, centre, [centre](std::size_t k) { return centre - k; },
      [centre](std::size_t k) { return centre + k; }, count, out);
}

// rows[radius] is the centre.
void SmoothAlongY(const float* taps, std::size_t radius, const float* const* rows,
                  std::size_t count, float* out) {
  Convolve(
      taps, radius, rows[radius], [=](std::size_t k) { return rows[radius - k]; },
      [=](std::size_t k) { return rows[radius + k]; }, count, out);
}

std::size_t BlockOfVectors() {
  return 4 * hn::Lanes(hn::ScalableTag<float>());
}

}  // namespace HWY_NAMESPACE
}  // namespace marrow::tracking
HWY_AFTER_NAMESPACE();

#if HWY_ONCE
namespace marrow::tracking {
namespace {

HWY_EXPORT(SmoothAlongX);
HWY_EXPORT(SmoothAlongY);
HWY_EXPORT(BlockOfVectors);

}  // namespace

std::vector<float> IntegratedGaussian(double sigma) {
  const std::size_t radius = static_cast<std::size_t>(sigma * 3.5 + 0.5);
  const double s = 1.0 / (sigma * std::sqrt(2.0));
  std::vector<double> half(radius + 1);
  half[0] = std::erf(0.5 * s) - std::erf(-0.5 * s);
  double sum = half[0];
  for (std::size_t k = 1; k <= radius; ++k) {
    const double x = static_cast<double>(k);
    // Far out both values of erf are near 1 and their difference would lose its digits.
    half[k] = x * s >= 2.5 ? std::erfc((x - 0.5) * s) - std::erfc((x + 0.5) * s)
                           : std::erf((x + 0.5) * s) - std::erf((x - 0.5) * s);
    sum += 2.0 * half[k];
  }
  std::vector<float> kernel(2 * radius + 1);
  for (std::size_t k = 0; k <= radius; ++k) {
    kernel[radius + k] = kernel[radius - k] = static_cast<float>(half[k] / sum);
  }
  return kernel;
}

SeparableSmoother::SeparableSmoother(std::vector<float> kernel, std::size_t max_width)
    : taps_(kernel.begin() + static_cast<std::ptrdiff_t>(kernel.size() / 2), kernel.end()) {
  const std::size_t block = HWY_DYNAMIC_DISPATCH(BlockOfVectors)();
  ring_stride_ = (max_width + block - 1) / block * block;
  padded_.resize(ring_stride_ + kernel.size());
  ring_.resize(ring_stride_ * (kernel.size() + 1));
  rows_.resize(kernel.size());
}

void SeparableSmoother::Smooth(float* image, std::size_t stride, const PixelRegion& region) {
  if (region.empty()) return;
  const std::size_t radius = taps_.size() - 1;
  const std::size_t ring_rows = 2 * radius + 1;
  const std::size_t count = region.x1 - region.x0;
  const std::size_t height = region.y1 - region.y0;
  float* out = ring_.data() + ring_rows * ring_stride_;

  // Row y may be overwritten as soon as rows up to y + radius are in the ring.
  std::size_t in_ring = 0;
  for (std::size_t y = 0; y < height; ++y) {
    for (; in_ring < std::min(height, y + radius + 1); ++in_ring) {
      const float* row = image + (region.y0 + in_ring) * stride + region.x0;
      std::fill_n(padded_.begin(), radius, row[0]);
      std::copy_n(row, count, padded_.data() + radius);
      std::fill_n(padded_.data() + radius + count, radius, row[count - 1]);
      HWY_DYNAMIC_DISPATCH(SmoothAlongX)
      (taps_.data(), radius, padded_.data(), count,
       ring_.data() + in_ring % ring_rows * ring_stride_);
    }
    for (std::size_t k = 0; k < ring_rows; ++k) {
      const std::size_t below = std::min(y + k, height - 1 + radius);
      const std::size_t row = below < radius ? 0 : below - radius;
      rows_[k] = ring_.data() + row % ring_rows * ring_stride_;
    }
    HWY_DYNAMIC_DISPATCH(SmoothAlongY)(taps_.data(), radius, rows_.data(), count, out);
    std::copy_n(out, count, image + (region.y0 + y) * stride + region.x0);
  }
}

}  // namespace marrow::tracking
#endif  // HWY_ONCE
