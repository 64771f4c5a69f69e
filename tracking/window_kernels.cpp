#include "tracking/window_kernels.h"

#include <algorithm>
#include <bit>
#include <cmath>
#include <cstdint>
#include <limits>
#include <type_traits>
#include <utility>

#undef HWY_TARGET_INCLUDE
#define HWY_TARGET_INCLUDE "tracking/window_kernels.cpp"
#include <hwy/foreach_target.h>
// After foreach_target.
#include <hwy/highway.h>

// Of a lambda in a kernel: it has to be part of the loop around it, but where a sanitizer watches
// every access that makes functions which compile for minutes.
#ifndef WINDOW_LAMBDA
#if HWY_IS_ASAN || HWY_IS_TSAN
#define WINDOW_LAMBDA HWY_ATTR
#else
#define WINDOW_LAMBDA HWY_ATTR __attribute__((always_inline))
#endif
#endif

HWY_BEFORE_NAMESPACE();
namespace marrow::tracking::HWY_NAMESPACE {
namespace hn = hwy::HWY_NAMESPACE;

// 16 lanes at most: rows have room for that.
using Lanes = hn::CappedTag<float, kWindowLanes>;
using Vector = hn::Vec<Lanes>;
constexpr std::size_t kLanes = hn::MaxLanes(Lanes());

template <class V>
HWY_INLINE V Lerp(V from, V to, V fraction) {
  return hn::MulAdd(fraction, hn::Sub(to, from), from);
}

// Calls `run` with the channel count as a constant.
template <class Run>
HWY_INLINE void WithChannels(std::size_t channels, Run run) {
  switch (channels) {
    case 1:
      return run(std::integral_constant<std::size_t, 1>());
    case 2:
      return run(std::integral_constant<std::size_t, 2>());
    case 3:
      return run(std::integral_constant<std::size_t, 3>());
    default:
      return run(std::integral_constant<std::size_t, 4>());
  }
}

// Calls run(0) to run(count - 1), with constants unless one-lane vectors make it many.
template <std::size_t kCount, class Run>
HWY_INLINE void Unrolled(Run run) {
  if constexpr (kCount <= kWindowLanes) {
    [&]<std::size_t... k>(std::index_sequence<k...>) WINDOW_LAMBDA {
      (run(std::integral_constant<std::size_t, k>()), ...);
    }
    (std::make_index_sequence<kCount>());
  } else {
    for (std::size_t k = 0; k < kCount; ++k) run(k);
  }
}

// A value for each of 16 C neighbouring samples of a row, after which vectors of every width start
// with the first channel again. Sums kept so have the same terms in the same order whatever the
// width; they are joined in double.
template <std::size_t C>
struct PerSample {
  static constexpr std::size_t kSize = kWindowLanes * C;

  // Of the vector whose first sample is the row's i-th.
  template <class D>
  HWY_INLINE hn::Vec<D> At(D d, std::size_t i) const {
    return hn::LoadU(d, values + i % kSize);
  }
  template <class D>
  HWY_INLINE void Set(D d, std::size_t i, hn::Vec<D> value) {
    hn::StoreU(value, d, values + i % kSize);
  }
  template <class D>
  HWY_INLINE void Add(D d, std::size_t i, hn::Vec<D> value) {
    Set(d, i, hn::Add(At(d, i), value));
  }

  HWY_INLINE void SpreadChannels(const float* channels) {
    for (std::size_t pixel = 0; pixel < kWindowLanes; ++pixel) {
      for (std::size_t c = 0; c < C; ++c) values[pixel * C + c] = channels[c];
    }
  }
  HWY_INLINE void TotalsByChannel(double* totals, std::size_t stride) const {
    double part[4 * C] = {};
    for (std::size_t j = 0; j < kSize; j += 4 * C) {
      for (std::size_t m = 0; m < 4 * C; ++m) part[m] += static_cast<double>(values[j + m]);
    }
    for (std::size_t c = 0; c < C; ++c) {
      totals[c * stride] = (part[c] + part[c + C]) + (part[c + 2 * C] + part[c + 3 * C]);
    }
  }
  HWY_INLINE double Total() const {
    static_assert(C == 1);
    double total;
    TotalsByChannel(&total, 1);
    return total;
  }

  HWY_ALIGN float values[kSize];
};

// Calls walk(i, keep) for each vector of a row, whose first sample is the row's i-th. `keep` zeroes
// the lanes behind the row's last sample.
template <class Walk>
HWY_INLINE void ForEachColumn(window_shape shape, Walk walk) {
  const Lanes d;
  const std::size_t N = hn::Lanes(d);
  const std::size_t end = shape.row_samples();
  std::size_t i = 0;
  for (; i + N <= end; i += N) walk(i, [](Vector v) WINDOW_LAMBDA { return v; });
  if (i < end) {
    const auto inside = hn::FirstN(d, end - i);
    walk(i, [inside](Vector v) WINDOW_LAMBDA { return hn::IfThenElseZero(inside, v); });
  }
}

// PerSample's sums in vectors.
template <std::size_t C>
struct RowSums {
  RowSums() {
    for (Vector& s : sum) s = hn::Zero(Lanes());
  }
  HWY_INLINE void ByChannel(double* totals) const {
    PerSample<C> sums;
    for (std::size_t k = 0; k < kVectors; ++k) sums.Set(Lanes(), k * kLanes, sum[k]);
    sums.TotalsByChannel(totals, 1);
  }

  static constexpr std::size_t kVectors = PerSample<C>::kSize / kLanes;
  Vector sum[kVectors];
};

// Calls step(at, k, keep) for each vector of each row: `at` its first sample's place in the plane,
// k its place in RowSums. `keep` as above.
template <std::size_t C, class Step>
HWY_INLINE void ForEachVector(window_shape shape, Step step) {
  const Lanes d;
  constexpr std::size_t kBlock = PerSample<C>::kSize;
  const std::size_t end = shape.row_samples();
  const std::size_t stride = shape.stride();
  std::size_t i = 0;
  for (; i + kBlock <= end; i += kBlock) {
    for (std::size_t row = 0; row < shape.rows(); ++row) {
      Unrolled<RowSums<C>::kVectors>([&](auto k) WINDOW_LAMBDA {
        step(row * stride + i + k * kLanes, k, [](Vector v) WINDOW_LAMBDA { return v; });
      });
    }
  }
  for (std::size_t row = 0; row < shape.rows() && i < end; ++row) {
    Unrolled<RowSums<C>::kVectors>([&](auto k) WINDOW_LAMBDA {
      const std::size_t first = i + k * kLanes;
      if (first >= end) return;
      const auto inside = hn::FirstN(d, end - first);
      step(row * stride + first, k,
           [inside](Vector v) WINDOW_LAMBDA { return hn::IfThenElseZero(inside, v); });
    });
  }
}

template <class D>
HWY_INLINE auto LoadRaw(D d, const float* samples) {
  return hn::LoadU(d, samples);
}

template <class D>
HWY_INLINE auto LoadRaw(D, const std::uint8_t* samples) {
  return hn::LoadU(hn::Rebind<std::uint8_t, D>(), samples);
}

// Samples and what leads from each to its right neighbour.
template <class V>
struct Slope {
  HWY_INLINE V At(V fraction) const { return hn::MulAdd(fraction, step, from); }
  V from, step;
};

template <class D>
HWY_INLINE Slope<hn::Vec<D>> SlopeOf(D, hn::Vec<D> from, hn::Vec<D> to) {
  return {from, hn::Sub(to, from)};
}

// The difference of bytes is as exact in whole numbers, where it costs less.
template <class D>
HWY_INLINE Slope<hn::Vec<D>> SlopeOf(D d, hn::Vec<hn::Rebind<std::uint8_t, D>> from,
                                     hn::Vec<hn::Rebind<std::uint8_t, D>> to) {
  const hn::RebindToSigned<D> di;
  const auto a = hn::PromoteTo(di, from);
  const auto b = hn::PromoteTo(di, to);
  return {hn::ConvertTo(d, a), hn::ConvertTo(d, hn::Sub(b, a))};
}

template <class D, class T>
HWY_INLINE Slope<hn::Vec<D>> SlopeAt(D d, const T* in, std::size_t channels) {
  return SlopeOf(d, LoadRaw(d, in), LoadRaw(d, in + channels));
}

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

// The pixel that each of the first 16 C samples of a row belongs to.
template <std::size_t C>
struct PixelOfSample {
  constexpr PixelOfSample() : index() {
    for (std::size_t i = 0; i < kWindowLanes * C; ++i) {
      index[i] = static_cast<std::int32_t>(i / C);
    }
  }
  HWY_ALIGN std::int32_t index[kWindowLanes * C];
};
template <std::size_t C>
inline constexpr PixelOfSample<C> kPixelOfSample;

// u of the vector whose first sample is the row's i-th.
template <std::size_t C, class D>
HWY_INLINE hn::Vec<D> OffsetsU(D d, std::size_t i, window_shape shape) {
  constexpr std::size_t kBlock = kWindowLanes * C;
  const hn::RebindToSigned<D> di;
  const auto pixel = hn::LoadU(di, kPixelOfSample<C>.index + i % kBlock);
  const auto first = static_cast<float>(i / kBlock * kWindowLanes);
  return hn::Add(hn::ConvertTo(d, pixel), hn::Set(d, first - static_cast<float>(shape.half_x)));
}

template <std::size_t C>
struct ResidualSums {
  PerSample<1> motion[6] = {};  // of gx r, gy r, u gx r, v gx r, u gy r, v gy r
  PerSample<C> tr = {};         // of T r
  PerSample<C> ones = {};       // of r
  PerSample<C> gain, bias;      // of the fit
};

// The window's samples of one vector in each row, one row after the other: of an image at a shift,
// or sampled before.
template <std::size_t C, class D, class T>
struct TranslatedRows {
  TranslatedRows(D d, const T* first, std::size_t image_stride, float fx, float fy)
      : in(first),
        stride(image_stride),
        wx(hn::Set(d, fx)),
        wy(hn::Set(d, fy)),
        above(SlopeAt(d, first, C).At(wx)) {}
  HWY_INLINE hn::Vec<D> Next(D d) {
    in += stride;
    const auto below = SlopeAt(d, in, C).At(wx);
    const auto sample = Lerp(above, below, wy);
    above = below;
    return sample;
  }

  const T* in;
  std::size_t stride;
  hn::Vec<D> wx, wy, above;
};
template <class D>
struct SampledRows {
  HWY_INLINE hn::Vec<D> Next(D d) {
    const auto sample = hn::LoadU(d, in);
    in += stride;
    return sample;
  }

  const float* in;
  std::size_t stride;
};

// Adds what the residuals of one vector in each row tell.
template <std::size_t C, bool kAffine, bool kColor, class D, class Rows, class Keep>
HWY_NOINLINE void AddResiduals(D d, std::size_t i, const float* t, window_shape shape, Rows rows,
                               Keep keep, ResidualSums<C>& sums) {
  const std::size_t stride = shape.stride();
  auto gain = hn::Zero(d), bias = hn::Zero(d);
  if constexpr (kColor) {
    gain = sums.gain.At(d, i);
    bias = sums.bias.At(d, i);
  }
  // u is the same in every row, so that it has to meet the sums of the rows only.
  auto x = hn::Zero(d), y = hn::Zero(d), vx = hn::Zero(d), vy = hn::Zero(d);
  auto tr = hn::Zero(d), ones = hn::Zero(d);
  t += i;
  auto t_above = hn::LoadU(d, t - stride);
  auto t_here = hn::LoadU(d, t);
  auto v = hn::Set(d, -static_cast<float>(shape.half_y));
  for (std::size_t row = 0; row < shape.rows(); ++row, t += stride) {
    auto present = rows.Next(d);
    if constexpr (kColor) present = hn::MulAdd(gain, present, bias);
    const auto r = keep(hn::Sub(t_here, present));
    const auto t_below = hn::LoadU(d, t + stride);
    const auto gx = hn::Sub(hn::LoadU(d, t + C), hn::LoadU(d, t - C));
    const auto gy = hn::Sub(t_below, t_above);
    if constexpr (kAffine) {
      const auto gxr = hn::Mul(gx, r);
      const auto gyr = hn::Mul(gy, r);
      x = hn::Add(x, gxr);
      y = hn::Add(y, gyr);
      vx = hn::MulAdd(v, gxr, vx);
      vy = hn::MulAdd(v, gyr, vy);
      v = hn::Add(v, hn::Set(d, 1.0f));
    } else {
      x = hn::MulAdd(gx, r, x);
      y = hn::MulAdd(gy, r, y);
    }
    if constexpr (kColor) {
      tr = hn::MulAdd(t_here, r, tr);
      ones = hn::Add(ones, r);
    }
    t_above = t_here;
    t_here = t_below;
  }
  sums.motion[0].Add(d, i, x);
  sums.motion[1].Add(d, i, y);
  if constexpr (kAffine) {
    const auto u = OffsetsU<C>(d, i, shape);
    sums.motion[2].Add(d, i, hn::Mul(u, x));
    sums.motion[3].Add(d, i, vx);
    sums.motion[4].Add(d, i, hn::Mul(u, y));
    sums.motion[5].Add(d, i, vy);
  }
  if constexpr (kColor) {
    sums.tr.Add(d, i, tr);
    sums.ones.Add(d, i, ones);
  }
}

template <std::size_t C, bool kColor, class T>
HWY_INLINE void TranslationSums(const float* t, const T* image, std::size_t image_width,
                                std::size_t image_height, translated_sampling place,
                                window_shape shape, const color_fit& color, double* totals) {
  const std::size_t in_stride = image_width * C;
  const std::size_t first = place.y * in_stride + place.x * C;
  ResidualSums<C> sums;
  if constexpr (kColor) {
    sums.gain.SpreadChannels(color.gain);
    sums.bias.SpreadChannels(color.bias);
  }
  const auto add = [&](auto d, std::size_t i, auto keep) WINDOW_LAMBDA {
    const TranslatedRows<C, decltype(d), T> rows(d, image + first + i, in_stride, place.fx,
                                                 place.fy);
    AddResiduals<C, false, kColor>(d, i, t, shape, rows, keep, sums);
  };
  // Whole vectors read on behind the window's last pixel, which may lie behind the image.
  const bool wide =
      first + shape.rows() * in_stride + C + shape.stride() <= in_stride * image_height;
  const std::size_t end = shape.row_samples();
  const std::size_t whole = end - end % kLanes;
  ForEachColumn(shape, [&](std::size_t i, auto keep) WINDOW_LAMBDA {
    if (i < whole || wide) add(Lanes(), i, keep);
  });
  for (std::size_t i = wide ? end : whole; i < end; ++i) {
    add(hn::CappedTag<float, 1>(), i, [](auto v) WINDOW_LAMBDA { return v; });
  }
  for (std::size_t m = 0; m < 2; ++m) totals[m] = sums.motion[m].Total();
  if constexpr (kColor) {
    sums.tr.TotalsByChannel(totals + 2, 2);
    sums.ones.TotalsByChannel(totals + 3, 2);
  }
}

template <class T>
HWY_INLINE void TranslationResidual(const float* t, const T* image, std::size_t image_width,
                                    std::size_t image_height, translated_sampling place,
                                    window_shape shape, const color_fit& color, double* sums) {
  WithChannels(shape.channels, [&](auto channels) WINDOW_LAMBDA {
    constexpr std::size_t C = decltype(channels)::value;
    if (color.gain != nullptr) {
      TranslationSums<C, true>(t, image, image_width, image_height, place, shape, color, sums);
    } else {
      TranslationSums<C, false>(t, image, image_width, image_height, place, shape, color, sums);
    }
  });
}

void TranslationResidualFloats(const float* t, const float* image, std::size_t image_width,
                               std::size_t image_height, const translated_sampling& place,
                               const window_shape& shape, const color_fit& color, double* sums) {
  TranslationResidual(t, image, image_width, image_height, place, shape, color, sums);
}

void TranslationResidualBytes(const float* t, const std::uint8_t* image, std::size_t image_width,
                              std::size_t image_height, const translated_sampling& place,
                              const window_shape& shape, const color_fit& color, double* sums) {
  TranslationResidual(t, image, image_width, image_height, place, shape, color, sums);
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

template <std::size_t C, bool kColor>
HWY_INLINE void AffineSums(const float* t, const float* window, window_shape shape,
                           const color_fit& color, double* totals) {
  const Lanes d;
  ResidualSums<C> sums;
  if constexpr (kColor) {
    sums.gain.SpreadChannels(color.gain);
    sums.bias.SpreadChannels(color.bias);
  }
  ForEachColumn(shape, [&](std::size_t i, auto keep) WINDOW_LAMBDA {
    AddResiduals<C, true, kColor>(d, i, t, shape, SampledRows<Lanes>{window + i, shape.stride()},
                                  keep, sums);
  });
  for (std::size_t m = 0; m < 6; ++m) totals[m] = sums.motion[m].Total();
  if constexpr (kColor) {
    sums.tr.TotalsByChannel(totals + 6, 2);
    sums.ones.TotalsByChannel(totals + 7, 2);
  }
}

void AffineResidual(const float* t, const float* window, const window_shape& shape,
                    const color_fit& color, double* sums) {
  WithChannels(shape.channels, [&](auto channels) WINDOW_LAMBDA {
    constexpr std::size_t C = decltype(channels)::value;
    if (color.gain != nullptr) {
      AffineSums<C, true>(t, window, shape, color, sums);
    } else {
      AffineSums<C, false>(t, window, shape, color, sums);
    }
  });
}

void GradientProducts(const float* t, const window_shape& shape, double sums[3]) {
  const Lanes d;
  const std::size_t C = shape.channels;
  const std::size_t stride = shape.stride();
  PerSample<1> products[3] = {};
  ForEachColumn(shape, [&](std::size_t i, auto keep) WINDOW_LAMBDA {
    auto xx = products[0].At(d, i);
    auto xy = products[1].At(d, i);
    auto yy = products[2].At(d, i);
    const float* p = t + i;
    auto above = hn::LoadU(d, p - stride);
    auto here = hn::LoadU(d, p);
    for (std::size_t row = 0; row < shape.rows(); ++row, p += stride) {
      const auto below = hn::LoadU(d, p + stride);
      const auto gx = keep(hn::Sub(hn::LoadU(d, p + C), hn::LoadU(d, p - C)));
      const auto gy = keep(hn::Sub(below, above));
      above = here;
      here = below;
      xx = hn::MulAdd(gx, gx, xx);
      xy = hn::MulAdd(gx, gy, xy);
      yy = hn::MulAdd(gy, gy, yy);
    }
    products[0].Set(d, i, xx);
    products[1].Set(d, i, xy);
    products[2].Set(d, i, yy);
  });
  for (std::size_t p = 0; p < 3; ++p) sums[p] = products[p].Total();
}

void TemplateProducts(const float* t, const window_shape& shape, template_products& products) {
  const Lanes d;
  const std::size_t stride = shape.stride();
  products = {};
  WithChannels(shape.channels, [&](auto channels) WINDOW_LAMBDA {
    constexpr std::size_t C = decltype(channels)::value;
    PerSample<1> gradient[3][6] = {};
    PerSample<C> cross[4][3] = {};
    PerSample<C> square = {}, sum = {};
    ForEachColumn(shape, [&](std::size_t i, auto keep) WINDOW_LAMBDA {
      // Times 1, v and v v; u is the same in every row, so that it has to meet the sums only.
      Vector pairs[3][3], factors[4][2];
      for (auto& entry : pairs) entry[0] = entry[1] = entry[2] = hn::Zero(d);
      for (auto& entry : factors) entry[0] = entry[1] = hn::Zero(d);
      auto squares = hn::Zero(d);
      auto values = hn::Zero(d);
      auto v = hn::Set(d, -static_cast<float>(shape.half_y));
      const float* p = t + i;
      for (std::size_t row = 0; row < shape.rows(); ++row, p += stride) {
        const auto here = keep(hn::LoadU(d, p));
        const auto gx = keep(hn::Sub(hn::LoadU(d, p + C), hn::LoadU(d, p - C)));
        const auto gy = keep(hn::Sub(hn::LoadU(d, p + stride), hn::LoadU(d, p - stride)));
        const Vector pair[3] = {hn::Mul(gx, gx), hn::Mul(gx, gy), hn::Mul(gy, gy)};
        for (std::size_t q = 0; q < 3; ++q) {
          const auto pv = hn::Mul(pair[q], v);
          pairs[q][0] = hn::Add(pairs[q][0], pair[q]);
          pairs[q][1] = hn::Add(pairs[q][1], pv);
          pairs[q][2] = hn::MulAdd(pv, v, pairs[q][2]);
        }
        const Vector factor[4] = {hn::Mul(gx, here), hn::Mul(gy, here), gx, gy};
        for (std::size_t q = 0; q < 4; ++q) {
          factors[q][0] = hn::Add(factors[q][0], factor[q]);
          factors[q][1] = hn::MulAdd(factor[q], v, factors[q][1]);
        }
        v = hn::Add(v, hn::Set(d, 1.0f));
        squares = hn::MulAdd(here, here, squares);
        values = hn::Add(values, here);
      }
      const auto u = OffsetsU<C>(d, i, shape);
      for (std::size_t q = 0; q < 3; ++q) {
        const auto pu = hn::Mul(pairs[q][0], u);
        gradient[q][0].Add(d, i, pairs[q][0]);
        gradient[q][1].Add(d, i, pu);
        gradient[q][2].Add(d, i, pairs[q][1]);
        gradient[q][3].Add(d, i, hn::Mul(pu, u));
        gradient[q][4].Add(d, i, hn::Mul(pairs[q][1], u));
        gradient[q][5].Add(d, i, pairs[q][2]);
      }
      for (std::size_t q = 0; q < 4; ++q) {
        cross[q][0].Add(d, i, factors[q][0]);
        cross[q][1].Add(d, i, hn::Mul(factors[q][0], u));
        cross[q][2].Add(d, i, factors[q][1]);
      }
      square.Add(d, i, squares);
      sum.Add(d, i, values);
    });
    for (std::size_t p = 0; p < 3; ++p) {
      for (std::size_t q = 0; q < 6; ++q) products.gradient[p][q] = gradient[p][q].Total();
    }
    for (std::size_t p = 0; p < 4; ++p) {
      for (std::size_t q = 0; q < 3; ++q) {
        double by_channel[C];
        cross[p][q].TotalsByChannel(by_channel, 1);
        for (std::size_t c = 0; c < C; ++c) products.cross[c][p][q] = by_channel[c];
      }
    }
    square.TotalsByChannel(products.square, 1);
    sum.TotalsByChannel(products.sum, 1);
  });
}

void ChannelEnergies(const float* t, const window_shape& shape, double* energies) {
  const Lanes d;
  WithChannels(shape.channels, [&](auto channels) WINDOW_LAMBDA {
    constexpr std::size_t C = decltype(channels)::value;
    RowSums<C> square;
    ForEachVector<C>(shape, [&](std::size_t at, auto k, auto keep) WINDOW_LAMBDA {
      const auto x = keep(hn::LoadU(d, t + at));
      square.sum[k] = hn::MulAdd(x, x, square.sum[k]);
    });
    square.ByChannel(energies);
  });
}

void ChannelMeans(const float* window, const window_shape& shape, float* means) {
  const Lanes d;
  WithChannels(shape.channels, [&](auto channels) WINDOW_LAMBDA {
    constexpr std::size_t C = decltype(channels)::value;
    // Differences from the first pixel, so that a flat channel's mean has no rounding error.
    PerSample<C> pivot;
    pivot.SpreadChannels(window);
    RowSums<C> differences;
    ForEachVector<C>(shape, [&](std::size_t at, auto k, auto keep) WINDOW_LAMBDA {
      const auto x = hn::LoadU(d, window + at);
      differences.sum[k] = hn::Add(differences.sum[k], keep(hn::Sub(x, pivot.At(d, k * kLanes))));
    });
    double totals[C];
    differences.ByChannel(totals);
    for (std::size_t c = 0; c < C; ++c) {
      means[c] = window[c] + static_cast<float>(totals[c] / static_cast<double>(shape.pixels()));
    }
  });
}

void CentredSquares(const float* x, const float* x_means, const window_shape& shape, double* xx) {
  const Lanes d;
  WithChannels(shape.channels, [&](auto channels) WINDOW_LAMBDA {
    constexpr std::size_t C = decltype(channels)::value;
    PerSample<C> mean;
    mean.SpreadChannels(x_means);
    RowSums<C> square;
    ForEachVector<C>(shape, [&](std::size_t at, auto k, auto keep) WINDOW_LAMBDA {
      const auto e = keep(hn::Sub(hn::LoadU(d, x + at), mean.At(d, k * kLanes)));
      square.sum[k] = hn::MulAdd(e, e, square.sum[k]);
    });
    square.ByChannel(xx);
  });
}

void CentredProducts(const float* x, const float* x_means, const float* y, const float* y_means,
                     const window_shape& shape, double* xy, double* yy) {
  const Lanes d;
  WithChannels(shape.channels, [&](auto channels) WINDOW_LAMBDA {
    constexpr std::size_t C = decltype(channels)::value;
    PerSample<C> x_mean, y_mean;
    x_mean.SpreadChannels(x_means);
    y_mean.SpreadChannels(y_means);
    RowSums<C> product, square;
    ForEachVector<C>(shape, [&](std::size_t at, auto k, auto keep) WINDOW_LAMBDA {
      const auto e = keep(hn::Sub(hn::LoadU(d, x + at), x_mean.At(d, k * kLanes)));
      const auto f = keep(hn::Sub(hn::LoadU(d, y + at), y_mean.At(d, k * kLanes)));
      product.sum[k] = hn::MulAdd(e, f, product.sum[k]);
      square.sum[k] = hn::MulAdd(f, f, square.sum[k]);
    });
    product.ByChannel(xy);
    square.ByChannel(yy);
  });
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
HWY_EXPORT(TranslationResidualFloats);
HWY_EXPORT(TranslationResidualBytes);
HWY_EXPORT(AffineResidual);
HWY_EXPORT(GradientProducts);
HWY_EXPORT(TemplateProducts);
HWY_EXPORT(ChannelEnergies);
HWY_EXPORT(ChannelMeans);
HWY_EXPORT(CentredSquares);
HWY_EXPORT(CentredProducts);

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

void TranslationResidual(const float* t, const float* image, std::size_t image_width,
                         std::size_t image_height, const translated_sampling& place,
                         const window_shape& shape, const color_fit& color, double* sums) {
  HWY_DYNAMIC_DISPATCH(TranslationResidualFloats)
  (t, image, image_width, image_height, place, shape, color, sums);
}

void TranslationResidual(const float* t, const std::uint8_t* image, std::size_t image_width,
                         std::size_t image_height, const translated_sampling& place,
                         const window_shape& shape, const color_fit& color, double* sums) {
  HWY_DYNAMIC_DISPATCH(TranslationResidualBytes)
  (t, image, image_width, image_height, place, shape, color, sums);
}

void AffineResidual(const float* t, const float* window, const window_shape& shape,
                    const color_fit& color, double* sums) {
  HWY_DYNAMIC_DISPATCH(AffineResidual)(t, window, shape, color, sums);
}

void GradientProducts(const float* t, const window_shape& shape, double sums[3]) {
  HWY_DYNAMIC_DISPATCH(GradientProducts)(t, shape, sums);
}

void TemplateProducts(const float* t, const window_shape& shape, template_products& products) {
  HWY_DYNAMIC_DISPATCH(TemplateProducts)(t, shape, products);
}

void ChannelEnergies(const float* t, const window_shape& shape, double* energies) {
  HWY_DYNAMIC_DISPATCH(ChannelEnergies)(t, shape, energies);
}

void ChannelMeans(const float* window, const window_shape& shape, float* means) {
  HWY_DYNAMIC_DISPATCH(ChannelMeans)(window, shape, means);
}

void CentredSquares(const float* x, const float* x_means, const window_shape& shape, double* xx) {
  HWY_DYNAMIC_DISPATCH(CentredSquares)(x, x_means, shape, xx);
}

void CentredProducts(const float* x, const float* x_means, const float* y, const float* y_means,
                     const window_shape& shape, double* xy, double* yy) {
  HWY_DYNAMIC_DISPATCH(CentredProducts)(x, x_means, y, y_means, shape, xy, yy);
}

}  // namespace kernels
}  // namespace marrow::tracking
#endif
