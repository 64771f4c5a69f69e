#include "tracking/gaussian_smoothing.h"

#include <hwy/cache_control.h>

#include <algorithm>
#include <cmath>
#include <cstdint>
#include <utility>

#undef HWY_TARGET_INCLUDE
#define HWY_TARGET_INCLUDE "tracking/gaussian_smoothing.cpp"
#include <hwy/foreach_target.h>
#include <hwy/highway.h>

#include "tracking/multiplier_add-inl.h"

HWY_BEFORE_NAMESPACE();
namespace marrow::tracking {
namespace HWY_NAMESPACE {
namespace hn = hwy::HWY_NAMESPACE;

using Floats = hn::CappedTag<float, RowFolding::kSegments>;
// Neighbours that are made together: three vectors of each should fit into the registers, of which
// processors with vectors this long have 32, others 16.
constexpr std::size_t kAtOnce = HWY_MAX_BYTES >= 64 ? 8 : 4;
static_assert(SeparableSmoother::kMostAtOnce % kAtOnce == 0);

// taps[0] centre + sum over k of taps[k] (before(k) + after(k)), k ascending. Not fused into
// multiply-adds: targets without them would round differently. Of kMany neighbours each takes over
// what the next one had, from tap to tap, so that two loads serve all.
// load(j) is the vector that lies radius - j before the first one made.
template <std::size_t kMany, class Load, class Store>
HWY_INLINE void Smooth(const float* taps, std::size_t radius, Load load, Store store) {
  const Floats d;
  hn::Vec<Floats> before[kMany], after[kMany], sum[kMany];
  for (std::size_t j = 0; j < kMany; ++j) {
    before[j] = after[j] = load(radius + j);
    sum[j] = hn::Mul(hn::Set(d, taps[0]), before[j]);
  }
  for (std::size_t k = 1; k <= radius; ++k) {
    const auto tap = hn::Set(d, taps[k]);
    for (std::size_t j = kMany - 1; j > 0; --j) before[j] = before[j - 1];
    for (std::size_t j = 0; j + 1 < kMany; ++j) after[j] = after[j + 1];
    before[0] = load(radius - k);
    after[kMany - 1] = load(radius + k + kMany - 1);
    for (std::size_t j = 0; j < kMany; ++j) {
      const auto pair =
          j < kMany / 2 ? AddByMultiplier(d, before[j], after[j]) : hn::Add(before[j], after[j]);
      sum[j] = hn::Add(sum[j], hn::Mul(tap, pair));
    }
  }
  for (std::size_t j = 0; j < kMany; ++j) store(j, sum[j]);
}

// `folded` has a halo of `radius` positions. Up to kAtOnce - 1 positions past the last are read and
// written too.
void SmoothAlongX(const float* taps, std::size_t radius, const float* folded, std::size_t positions,
                  float* HWY_RESTRICT out) {
  const Floats d;
  constexpr std::size_t kSegments = RowFolding::kSegments;
  const float* first = folded - radius * kSegments;
  for (std::size_t p = 0; p < positions; p += kAtOnce) {
    for (std::size_t i = p * kSegments; i < (p + 1) * kSegments; i += hn::Lanes(d)) {
      Smooth<kAtOnce>(
          taps, radius,
          [=](std::size_t j) HWY_ATTR { return hn::LoadU(d, first + i + j * kSegments); },
          [=](std::size_t j, auto v) HWY_ATTR { hn::StoreU(v, d, out + i + j * kSegments); });
    }
  }
}

template <std::size_t kRows>
HWY_INLINE void SmoothRows(const float* taps, std::size_t radius, const float* const* rows,
                           std::size_t count, float* HWY_RESTRICT out, std::size_t stride) {
  const Floats d;
  for (std::size_t i = 0; i < count; i += hn::Lanes(d)) {
    Smooth<kRows>(
        taps, radius, [=](std::size_t j) HWY_ATTR { return hn::LoadU(d, rows[j] + i); },
        [=](std::size_t j, auto v) HWY_ATTR { hn::StoreU(v, d, out + j * stride + i); });
  }
}

// rows[radius] lies at out's first row. count, of values, is a multiple of RowFolding::kSegments.
void SmoothAlongY(const float* taps, std::size_t radius, const float* const* rows,
                  std::size_t count, std::size_t out_rows, float* out, std::size_t stride) {
  std::size_t j = 0;
  for (; j + kAtOnce <= out_rows; j += kAtOnce) {
    SmoothRows<kAtOnce>(taps, radius, rows + j, count, out + j * stride, stride);
  }
  for (; j < out_rows; ++j) {
    SmoothRows<1>(taps, radius, rows + j, count, out + j * stride, stride);
  }
}

}  // namespace HWY_NAMESPACE
}  // namespace marrow::tracking
HWY_AFTER_NAMESPACE();

#if HWY_ONCE
namespace marrow::tracking {
namespace {

HWY_EXPORT(SmoothAlongX);
HWY_EXPORT(SmoothAlongY);

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
  const std::size_t radius = taps_.size() - 1;
  const std::size_t positions = RowFolding{max_width}.positions();
  padded_.resize(positions * RowFolding::kSegments + kFoldingSlack);
  folded_.resize(FoldedStride(positions + kFoldingSlack + 2 * radius + kMostAtOnce));
  ring_stride_ = FoldedStride(positions + kMostAtOnce - 1);
  rows_.resize(kernel.size() + kMostAtOnce - 1);
  ring_.resize(ring_stride_ * rows_.size());
  smooth_stride_ = FoldedStride(positions + 2);
  smooth_rows_ = (kept_rows + 2 * kMostAtOnce - 2) / kMostAtOnce * kMostAtOnce;
  smooth_.resize(smooth_stride_ * smooth_rows_);
}

void SeparableSmoother::Start(const std::uint8_t* image, std::size_t stride,
                              const PixelRegion& region) {
  image_ = image;
  stride_ = stride;
  region_ = region;
  folding_.columns = region.x1 - region.x0;
  in_ring_ = 0;
  made_ = 0;
}

const float* SeparableSmoother::Row(std::size_t y) {
  while (made_ <= y) MakeRows();
  return SmoothRow(y);
}

float* SeparableSmoother::SmoothRow(std::size_t y) {
  return smooth_.data() + y % smooth_rows_ * smooth_stride_ + RowFolding::kSegments;
}

float* SeparableSmoother::RingRow(std::size_t y) {
  return ring_.data() + y % rows_.size() * ring_stride_;
}

void SeparableSmoother::PutIntoRing(std::size_t y) {
  const std::size_t radius = taps_.size() - 1;
  const std::size_t positions = folding_.positions();
  const std::uint8_t* row = image_ + (region_.y0 + y) * stride_ + region_.x0;
  if (region_.y0 + y + 1 < region_.y1) {
    for (std::size_t x = 0; x < folding_.columns; x += 64) hwy::Prefetch(row + stride_ + x);
  }
  const std::uint8_t last = row[folding_.columns - 1];
  std::fill(std::copy_n(row, folding_.columns, padded_.begin()), padded_.end(), last);
  float* folded = folded_.data() + radius * RowFolding::kSegments;
  FoldRow(padded_.data(), positions, folded);
  FillHalo(folded, positions, radius, row[0], last);
  HWY_DYNAMIC_DISPATCH(SmoothAlongX)(taps_.data(), radius, folded, positions, RingRow(y));
}

void SeparableSmoother::MakeRows() {
  const std::size_t radius = taps_.size() - 1;
  const std::size_t height = region_.y1 - region_.y0;
  const std::size_t out_rows = std::min(kMostAtOnce, height - made_);
  for (; in_ring_ < std::min(height, made_ + out_rows + radius); ++in_ring_) PutIntoRing(in_ring_);
  for (std::size_t j = 0; j < out_rows + 2 * radius; ++j) {
    const std::size_t below = std::min(made_ + j, height - 1 + radius);
    rows_[j] = RingRow(below < radius ? 0 : below - radius);
  }
  const std::size_t positions = folding_.positions();
  HWY_DYNAMIC_DISPATCH(SmoothAlongY)
  (taps_.data(), radius, rows_.data(), positions * RowFolding::kSegments, out_rows,
   SmoothRow(made_), smooth_stride_);
  for (std::size_t j = 0; j < out_rows; ++j) {
    float* row = SmoothRow(made_ + j);
    FillHalo(row, positions, 1, row[0], row[positions * RowFolding::kSegments - 1]);
  }
  made_ += out_rows;
}

}  // namespace marrow::tracking
#endif  // HWY_ONCE
