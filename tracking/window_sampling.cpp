#include "tracking/window_sampling.h"

#include <algorithm>
#include <bit>
#include <cmath>
#include <cstdint>
#include <limits>

#undef HWY_TARGET_INCLUDE
#define HWY_TARGET_INCLUDE "tracking/window_sampling.cpp"
#include <hwy/foreach_target.h>
// After foreach_target.
#include <hwy/highway.h>

#include "tracking/window_vectors-inl.h"

HWY_BEFORE_NAMESPACE();
namespace marrow::tracking::HWY_NAMESPACE {

template <class D, class T>
HWY_INLINE void SampleStrip(D d, const T* in, std::size_t in_stride, std::size_t channels, float fx,
                            float fy, std::size_t rows, float* out, std::size_t out_stride) {
  const auto wx = hn::Set(d, fx);
  const auto wy = hn::Set(d, fy);
  auto above = SlopeAt(d, in, channels).At(wx);
  for (std::size_t row = 0; row < rows; ++row) {
    in += in_stride;
    const auto below = SlopeAt(d, in, channels).At(wx);
    hn::StoreU(Lerp(above, below, wy), d, out);
    above = below;
    out += out_stride;
  }
}

template <class T>
HWY_INLINE void SampleWindow(const T* image, std::size_t image_width, std::size_t channels,
                             translated_sampling place, std::size_t columns, std::size_t rows,
                             float* out, std::size_t out_stride) {
  const Lanes d;
  const std::size_t N = hn::Lanes(d);
  const std::size_t in_stride = image_width * channels;
  const std::size_t end = columns * channels;
  const T* in = image + place.y * in_stride + place.x * channels;
  if (end < N) {
    for (std::size_t i = 0; i < end; ++i) {
      SampleStrip(hn::CappedTag<float, 1>(), in + i, in_stride, channels, place.fx, place.fy, rows,
                  out + i, out_stride);
    }
    return;
  }
  std::size_t i = 0;
  for (; i + N <= end; i += N) {
    SampleStrip(d, in + i, in_stride, channels, place.fx, place.fy, rows, out + i, out_stride);
  }
  if (i < end) {  // the last strip overlaps the one before
    i = end - N;
    SampleStrip(d, in + i, in_stride, channels, place.fx, place.fy, rows, out + i, out_stride);
  }
}

void SampleTranslatedFloats(const float* image, std::size_t image_width, std::size_t channels,
                            const translated_sampling& place, std::size_t columns, std::size_t rows,
                            float* out, std::size_t out_stride) {
  SampleWindow(image, image_width, channels, place, columns, rows, out, out_stride);
}

void SampleTranslatedBytes(const std::uint8_t* image, std::size_t image_width, std::size_t channels,
                           const translated_sampling& place, std::size_t columns, std::size_t rows,
                           float* out, std::size_t out_stride) {
  SampleWindow(image, image_width, channels, place, columns, rows, out, out_stride);
}

// One pixel: its channels from the four around it.
template <std::size_t C, class T>
HWY_INLINE void SamplePixel(const T* in, std::size_t stride, float fx, float fy, float* out) {
  const hn::CappedTag<float, 1> d;
  const auto wx = hn::Set(d, fx);
  const auto wy = hn::Set(d, fy);
  for (std::size_t c = 0; c < C; ++c) {
    const auto above = SlopeAt(d, in + c, C).At(wx);
    const auto below = SlopeAt(d, in + c + stride, C).At(wx);
    hn::StoreU(Lerp(above, below, wy), d, out + c);
  }
}

// Samples up to N columns of a window, from `column` on: one pixel after the other.
template <std::size_t C, class T>
HWY_INLINE void SampleAffinePixels(const T* origin, std::size_t stride, std::size_t count,
                                   Vector x_floor, Vector y_floor, Vector fx, Vector fy,
                                   float* out) {
  const Lanes d;
  HWY_ALIGN float places[4][kLanes];
  hn::Store(x_floor, d, places[0]);
  hn::Store(y_floor, d, places[1]);
  hn::Store(fx, d, places[2]);
  hn::Store(fy, d, places[3]);
  for (std::size_t j = 0; j < count; ++j) {
    const auto x = static_cast<std::ptrdiff_t>(places[0][j]);
    const auto y = static_cast<std::ptrdiff_t>(places[1][j]);
    SamplePixel<C>(
        origin + y * static_cast<std::ptrdiff_t>(stride) + x * static_cast<std::ptrdiff_t>(C),
        stride, places[2][j], places[3][j], out + j * C);
  }
}

// Samples up to N columns of a window, from `column` on. A warp is near the identity: most
// neighbours are read side by side, so that a vector of samples comes in one piece, or in a few,
// and each lane differs from a shift only by its pixel's fractions; and what was read for the lower
// side of a row's pixels is mostly the upper side of the next row's. kWide is for warps of which
// ReadsWide is true.
template <std::size_t C, bool kWide, class T>
HWY_NOINLINE void SampleAffineStrip(const T* image, std::size_t image_width, affine_sampling warp,
                                    window_shape shape, std::size_t column, float* out) {
  const Lanes d;
  const hn::RebindToSigned<Lanes> di;
  constexpr std::size_t N = kLanes;
  const std::size_t stride = image_width * C;
  const std::size_t out_stride = shape.stride();
  const std::size_t count = std::min(N, shape.columns() - column);
  const auto m00 = hn::Set(d, warp.m00);
  const auto m10 = hn::Set(d, warp.m10);
  const T* origin = image + warp.y * static_cast<std::ptrdiff_t>(stride) +
                    warp.x * static_cast<std::ptrdiff_t>(C);
  // The last lane has no next one, and none is asked for.
  const auto next = hn::IndicesFromVec(
      di, hn::Min(hn::Iota(di, 1), hn::Set(di, static_cast<std::int32_t>(N) - 1)));
  const auto u = hn::Iota(d, static_cast<float>(column) - static_cast<float>(shape.half_x));
  HWY_ALIGN std::int32_t offset[N];
  Slope<Vector> lower[C];
  std::int32_t lower_offset[C];  // of its first pixel
  Unrolled<C>([&](auto k) WINDOW_LAMBDA {
    lower[k] = {hn::Zero(d), hn::Zero(d)};
    lower_offset[k] = std::numeric_limits<std::int32_t>::min();
  });
  out += column * C;
  auto v = hn::Set(d, -static_cast<float>(shape.half_y));
  for (std::size_t row = 0; row < shape.rows(); ++row, out += out_stride) {
    const auto x = hn::MulAdd(m00, u, hn::MulAdd(hn::Set(d, warp.m01), v, hn::Set(d, warp.fx)));
    const auto y = hn::MulAdd(m10, u, hn::MulAdd(hn::Set(d, warp.m11), v, hn::Set(d, warp.fy)));
    v = hn::Add(v, hn::Set(d, 1.0f));
    const auto x_floor = hn::Floor(x);
    const auto y_floor = hn::Floor(y);
    const auto fx = hn::Sub(x, x_floor);
    const auto fy = hn::Sub(y, y_floor);
    if constexpr (!kWide) {
      SampleAffinePixels<C>(origin, stride, count, x_floor, y_floor, fx, fy, out);
      continue;
    }
    const auto offsets =
        hn::ConvertTo(di, hn::MulAdd(y_floor, hn::Set(d, static_cast<float>(stride)),
                                     hn::Mul(x_floor, hn::Set(d, static_cast<float>(C)))));
    hn::Store(offsets, di, offset);
    // Bit j: pixel j + 1 is not read right beside pixel j.
    const auto jump = hn::Ne(hn::Sub(hn::TableLookupLanes(offsets, next), offsets),
                             hn::Set(di, static_cast<std::int32_t>(C)));
    std::uint8_t bits[8] = {};
    hn::StoreMaskBits(di, jump, bits);
    const std::uint32_t jumps =
        (bits[0] | static_cast<std::uint32_t>(bits[1]) << 8) & ((1u << (count - 1)) - 1);
    Unrolled<C>([&](auto k) WINDOW_LAMBDA {
      if (k * N >= count * C) return;
      constexpr std::size_t first = k * N / C;
      constexpr std::size_t last = ((k + 1) * N - 1) / C;
      const T* in = origin + offset[first] + (k * N - first * C);
      const std::uint32_t inside = jumps & ((1u << last) - (1u << first));
      Slope<Vector> upper;
      if (inside == 0) {
        upper = offset[first] == lower_offset[k] ? lower[k] : SlopeAt(d, in, C);
        lower[k] = SlopeAt(d, in + stride, C);
        lower_offset[k] = offset[first] + static_cast<std::int32_t>(stride);
      } else {
        auto upper_left = LoadRaw(d, in);
        auto upper_right = LoadRaw(d, in + C);
        auto lower_left = LoadRaw(d, in + stride);
        auto lower_right = LoadRaw(d, in + stride + C);
        for (std::uint32_t left = inside; left != 0; left &= left - 1) {
          const std::size_t pixel = static_cast<std::size_t>(std::countr_zero(left)) + 1;
          const std::size_t lanes_before = pixel * C - k * N;
          const auto before = hn::FirstN(hn::DFromV<decltype(upper_left)>(), lanes_before);
          in = origin + offset[pixel] - lanes_before;
          upper_left = hn::IfThenElse(before, upper_left, LoadRaw(d, in));
          upper_right = hn::IfThenElse(before, upper_right, LoadRaw(d, in + C));
          lower_left = hn::IfThenElse(before, lower_left, LoadRaw(d, in + stride));
          lower_right = hn::IfThenElse(before, lower_right, LoadRaw(d, in + stride + C));
        }
        upper = SlopeOf(d, upper_left, upper_right);
        lower[k] = SlopeOf(d, lower_left, lower_right);
        lower_offset[k] = std::numeric_limits<std::int32_t>::min();
      }
      const auto pixels = hn::SetTableIndices(d, kPixelOfSample<C>.index + k * N);
      const auto wx = hn::TableLookupLanes(fx, pixels);
      const auto wy = hn::TableLookupLanes(fy, pixels);
      hn::StoreU(Lerp(upper.At(wx), lower[k].At(wx), wy), d, out + k * N);
    });
  }
}

// The corners, by the arithmetic of the strips above: rounding is monotonic, so that no sample of
// the window lies outside of what its corners span.
bool AffineWindowInside(const affine_sampling& warp, const window_shape& shape,
                        std::size_t image_width, std::size_t image_height) {
  const hn::CappedTag<float, 1> d;
  const float left = -static_cast<float>(warp.x);
  const float top = -static_cast<float>(warp.y);
  const float right = static_cast<float>(static_cast<std::ptrdiff_t>(image_width) - 1 - warp.x);
  const float bottom = static_cast<float>(static_cast<std::ptrdiff_t>(image_height) - 1 - warp.y);
  for (int corner = 0; corner < 4; ++corner) {
    const float u = static_cast<float>(shape.half_x) * (corner & 1 ? 1.0f : -1.0f);
    const float v = static_cast<float>(shape.half_y) * (corner & 2 ? 1.0f : -1.0f);
    const float x = hn::GetLane(
        hn::MulAdd(hn::Set(d, warp.m00), hn::Set(d, u),
                   hn::MulAdd(hn::Set(d, warp.m01), hn::Set(d, v), hn::Set(d, warp.fx))));
    const float y = hn::GetLane(
        hn::MulAdd(hn::Set(d, warp.m10), hn::Set(d, u),
                   hn::MulAdd(hn::Set(d, warp.m11), hn::Set(d, v), hn::Set(d, warp.fy))));
    if (!(x > left && x < right && y > top && y < bottom)) return false;
  }
  return true;
}

// Whether reads from any of the warped pixels may go a vector too far either way, because the rows
// about the window's are in the image too, and floats hold the pixels' distances.
HWY_INLINE bool ReadsWide(affine_sampling warp, window_shape shape, std::size_t image_width,
                          std::size_t image_height) {
  const auto half_x = static_cast<float>(shape.half_x);
  const auto half_y = static_cast<float>(shape.half_y);
  const float reach_x = std::abs(warp.m00) * half_x + std::abs(warp.m01) * half_y + 3.0f;
  const float reach_y = std::abs(warp.m10) * half_x + std::abs(warp.m11) * half_y + 3.0f;
  const auto y = static_cast<float>(warp.y);
  return image_width >= kWindowLanes && y - reach_y > 0.0f &&
         y + reach_y < static_cast<float>(image_height) - 1.0f &&
         (reach_y * static_cast<float>(image_width) + reach_x) *
                 static_cast<float>(shape.channels) <
             16e6f;
}

template <class T>
HWY_INLINE void SampleWarped(const T* image, std::size_t image_width, std::size_t image_height,
                             affine_sampling warp, window_shape shape, float* out) {
  const bool wide = ReadsWide(warp, shape, image_width, image_height);
  WithChannels(shape.channels, [&](auto channels) WINDOW_LAMBDA {
    constexpr std::size_t C = decltype(channels)::value;
    for (std::size_t column = 0; column < shape.columns(); column += kLanes) {
      if (wide) {
        SampleAffineStrip<C, true>(image, image_width, warp, shape, column, out);
      } else {
        SampleAffineStrip<C, false>(image, image_width, warp, shape, column, out);
      }
    }
  });
}

void SampleAffineFloats(const float* image, std::size_t image_width, std::size_t image_height,
                        const affine_sampling& warp, const window_shape& shape, float* out) {
  SampleWarped(image, image_width, image_height, warp, shape, out);
}

void SampleAffineBytes(const std::uint8_t* image, std::size_t image_width, std::size_t image_height,
                       const affine_sampling& warp, const window_shape& shape, float* out) {
  SampleWarped(image, image_width, image_height, warp, shape, out);
}

}  // namespace marrow::tracking::HWY_NAMESPACE
HWY_AFTER_NAMESPACE();

#if HWY_ONCE
namespace marrow::tracking {

HWY_EXPORT(SampleTranslatedFloats);
HWY_EXPORT(SampleTranslatedBytes);
HWY_EXPORT(AffineWindowInside);
HWY_EXPORT(SampleAffineFloats);
HWY_EXPORT(SampleAffineBytes);

namespace kernels {

void SampleTranslated(const float* image, std::size_t image_width, std::size_t channels,
                      const translated_sampling& place, std::size_t columns, std::size_t rows,
                      float* out, std::size_t out_stride) {
  HWY_DYNAMIC_DISPATCH(SampleTranslatedFloats)
  (image, image_width, channels, place, columns, rows, out, out_stride);
}

void SampleTranslated(const std::uint8_t* image, std::size_t image_width, std::size_t channels,
                      const translated_sampling& place, std::size_t columns, std::size_t rows,
                      float* out, std::size_t out_stride) {
  HWY_DYNAMIC_DISPATCH(SampleTranslatedBytes)
  (image, image_width, channels, place, columns, rows, out, out_stride);
}

bool AffineWindowInside(const affine_sampling& warp, const window_shape& shape,
                        std::size_t image_width, std::size_t image_height) {
  return HWY_DYNAMIC_DISPATCH(AffineWindowInside)(warp, shape, image_width, image_height);
}

void SampleAffine(const float* image, std::size_t image_width, std::size_t image_height,
                  const affine_sampling& warp, const window_shape& shape, float* out) {
  HWY_DYNAMIC_DISPATCH(SampleAffineFloats)(image, image_width, image_height, warp, shape, out);
}

void SampleAffine(const std::uint8_t* image, std::size_t image_width, std::size_t image_height,
                  const affine_sampling& warp, const window_shape& shape, float* out) {
  HWY_DYNAMIC_DISPATCH(SampleAffineBytes)(image, image_width, image_height, warp, shape, out);
}

}  // namespace kernels
}  // namespace marrow::tracking
#endif
