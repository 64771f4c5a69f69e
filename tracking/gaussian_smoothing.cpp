#include "tracking/gaussian_smoothing.h"

#include <algorithm>
#include <cmath>
#include <cstdint>
#include <utility>

#undef HWY_TARGET_INCLUDE
#define HWY_TARGET_INCLUDE "tracking/gaussian_smoothing.cpp"
#include <hwy/foreach_target.h>
#include <hwy/highway.h>

HWY_BEFORE_NAMESPACE();
namespace marrow::tracking {
namespace HWY_NAMESPACE {
namespace hn = hwy::HWY_NAMESPACE;

// Both passes form taps[0] centre + sum over k of taps[k] (before(k) + after(k)), k ascending. Not
// fused into multiply-adds: targets without them would round differently.

// before(k) and after(k) are k pixels to the left and to the right. `padded` is readable and `out`
// writable for one block of vectors past count.
void SmoothAlongX(const float* taps, std::size_t radius, const float* padded, std::size_t count,
                  float* out) {
  const hn::ScalableTag<float> d;
  const std::size_t N = hn::Lanes(d);
  // Four vectors at a time hide the latency of the chain of additions.
  for (std::size_t x = 0; x < count; x += 4 * N) {
    const float* centre = padded + radius + x;
    const auto middle = hn::Set(d, taps[0]);
    auto s0 = hn::Mul(middle, hn::LoadU(d, centre));
    auto s1 = hn::Mul(middle, hn::LoadU(d, centre + N));
    auto s2 = hn::Mul(middle, hn::LoadU(d, centre + 2 * N));
    auto s3 = hn::Mul(middle, hn::LoadU(d, centre + 3 * N));
    for (std::size_t k = 1; k <= radius; ++k) {
      const auto tap = hn::Set(d, taps[k]);
      const float* b = centre - k;
      const float* a = centre + k;
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

// A row as floats, with `radius` repeats of its edges on both sides.
void PadRow(const std::uint8_t* row, std::size_t count, std::size_t radius, float* padded) {
  const hn::ScalableTag<float> d;
  const hn::RebindToSigned<decltype(d)> di;
  const hn::Rebind<std::uint8_t, decltype(d)> bytes;
  const std::size_t N = hn::Lanes(d);
  std::fill_n(padded, radius, static_cast<float>(row[0]));
  float* out = padded + radius;
  std::size_t x = 0;
  for (; x + N <= count; x += N) {
    hn::StoreU(hn::ConvertTo(d, hn::PromoteTo(di, hn::LoadU(bytes, row + x))), d, out + x);
  }
  for (; x < count; ++x) out[x] = row[x];
  std::fill_n(out + count, radius, static_cast<float>(row[count - 1]));
}

constexpr std::size_t kRowsAtOnce = SeparableSmoother::kRowsAtOnce;

// A vector of each of kRows rows one under the other: from tap to tap each of them takes over what
// its neighbour had, so that two loads serve them all.
template <std::size_t kRows, class D>
HWY_INLINE void SmoothRowsAt(D d, const float* taps, std::size_t radius, const float* const* rows,
                             std::size_t x, float* out, std::size_t stride) {
  const auto row = [=](std::size_t j) HWY_ATTR { return hn::LoadU(d, rows[j] + x); };
  hn::Vec<D> before[kRows], after[kRows], sum[kRows];
  for (std::size_t j = 0; j < kRows; ++j) {
    before[j] = after[j] = row(radius + j);
    sum[j] = hn::Mul(hn::Set(d, taps[0]), before[j]);
  }
  for (std::size_t k = 1; k <= radius; ++k) {
    const auto tap = hn::Set(d, taps[k]);
    for (std::size_t j = kRows - 1; j > 0; --j) before[j] = before[j - 1];
    for (std::size_t j = 0; j + 1 < kRows; ++j) after[j] = after[j + 1];
    before[0] = row(radius - k);
    after[kRows - 1] = row(radius + k + kRows - 1);
    for (std::size_t j = 0; j < kRows; ++j) {
      sum[j] = hn::Add(sum[j], hn::Mul(tap, hn::Add(before[j], after[j])));
    }
  }
  for (std::size_t j = 0; j < kRows; ++j) hn::StoreU(sum[j], d, out + j * stride + x);
}

template <std::size_t kRows>
HWY_INLINE void SmoothRows(const float* taps, std::size_t radius, const float* const* rows,
                           std::size_t count, float* out, std::size_t stride) {
  const hn::ScalableTag<float> d;
  const std::size_t N = hn::Lanes(d);
  std::size_t x = 0;
  for (; x + N <= count; x += N) SmoothRowsAt<kRows>(d, taps, radius, rows, x, out, stride);
  for (; x < count; ++x) {
    SmoothRowsAt<kRows>(hn::CappedTag<float, 1>(), taps, radius, rows, x, out, stride);
  }
}

// rows[radius] lies at out's first row. `out_rows` is kRowsAtOnce or less.
void SmoothAlongY(const float* taps, std::size_t radius, const float* const* rows,
                  std::size_t count, std::size_t out_rows, float* out, std::size_t stride) {
  if (out_rows == kRowsAtOnce) {
    SmoothRows<kRowsAtOnce>(taps, radius, rows, count, out, stride);
    return;
  }
  for (std::size_t j = 0; j < out_rows; ++j) {
    SmoothRows<1>(taps, radius, rows + j, count, out + j * stride, stride);
  }
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

HWY_EXPORT(PadRow);
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

SeparableSmoother::SeparableSmoother(std::vector<float> kernel, std::size_t max_width,
                                     std::size_t kept_rows)
    : taps_(kernel.begin() + static_cast<std::ptrdiff_t>(kernel.size() / 2), kernel.end()) {
  const std::size_t block = HWY_DYNAMIC_DISPATCH(BlockOfVectors)();
  ring_stride_ = (max_width + block - 1) / block * block;
  rows_.resize(kernel.size() + kRowsAtOnce - 1);
  padded_.resize(ring_stride_ + kernel.size());
  ring_.resize(ring_stride_ * rows_.size());
  smooth_rows_ = (kept_rows + 2 * kRowsAtOnce - 2) / kRowsAtOnce * kRowsAtOnce;
  smooth_.resize(ring_stride_ * smooth_rows_);
}

void SeparableSmoother::Start(const std::uint8_t* image, std::size_t stride,
                              const PixelRegion& region) {
  image_ = image;
  stride_ = stride;
  region_ = region;
  in_ring_ = 0;
  made_ = 0;
}

const float* SeparableSmoother::Row(std::size_t y) {
  while (made_ <= y) MakeRows();
  return smooth_.data() + y % smooth_rows_ * ring_stride_;
}

void SeparableSmoother::MakeRows() {
  const std::size_t radius = taps_.size() - 1;
  const std::size_t count = region_.x1 - region_.x0;
  const std::size_t height = region_.y1 - region_.y0;
  const auto ring_row = [&](std::size_t y) {
    return ring_.data() + y % rows_.size() * ring_stride_;
  };
  const std::size_t out_rows = std::min(kRowsAtOnce, height - made_);
  for (; in_ring_ < std::min(height, made_ + out_rows + radius); ++in_ring_) {
    const std::uint8_t* row = image_ + (region_.y0 + in_ring_) * stride_ + region_.x0;
    HWY_DYNAMIC_DISPATCH(PadRow)(row, count, radius, padded_.data());
    HWY_DYNAMIC_DISPATCH(SmoothAlongX)
    (taps_.data(), radius, padded_.data(), count, ring_row(in_ring_));
  }
  for (std::size_t j = 0; j < out_rows + 2 * radius; ++j) {
    const std::size_t below = std::min(made_ + j, height - 1 + radius);
    rows_[j] = ring_row(below < radius ? 0 : below - radius);
  }
  HWY_DYNAMIC_DISPATCH(SmoothAlongY)
  (taps_.data(), radius, rows_.data(), count, out_rows,
   smooth_.data() + made_ % smooth_rows_ * ring_stride_, ring_stride_);
  made_ += out_rows;
}

}  // namespace marrow::tracking
#endif  // HWY_ONCE
