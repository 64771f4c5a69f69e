#include "tracking/window_kernels.h"

#include <algorithm>
#include <cstdint>

#undef HWY_TARGET_INCLUDE
#define HWY_TARGET_INCLUDE "tracking/window_kernels.cpp"
#include <hwy/foreach_target.h>
// After foreach_target.
#include <hwy/highway.h>

HWY_BEFORE_NAMESPACE();
namespace marrow::tracking::HWY_NAMESPACE {
namespace hn = hwy::HWY_NAMESPACE;

// 16 lanes at most: planes are padded for that.
using Lanes = hn::CappedTag<float, 16>;
using Vector = hn::Vec<Lanes>;

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

HWY_INLINE double Total(Vector sums) {
  const Lanes d;
  HWY_ALIGN float lanes[16];
  hn::Store(sums, d, lanes);
  double total = 0.0;
  for (std::size_t j = 0; j < hn::Lanes(d); ++j) total += static_cast<double>(lanes[j]);
  return total;
}

// Interleaved samples are read in blocks of C vectors, so that lane j of the block's vector k holds
// channel (k * N + j) % C in every block: per-channel sums are C vectors, told apart at the end.
template <std::size_t C>
HWY_INLINE void AddByChannel(const Vector (&sums)[C], double* totals, std::size_t stride) {
  const Lanes d;
  const std::size_t N = hn::Lanes(d);
  HWY_ALIGN float lanes[16];
  for (std::size_t k = 0; k < C; ++k) {
    hn::Store(sums[k], d, lanes);
    for (std::size_t j = 0; j < N; ++j) {
      totals[(k * N + j) % C * stride] += static_cast<double>(lanes[j]);
    }
  }
}

template <std::size_t C>
HWY_INLINE void SpreadChannels(const float* values, Vector (&spread)[C]) {
  const Lanes d;
  const std::size_t N = hn::Lanes(d);
  HWY_ALIGN float lanes[16];
  for (std::size_t k = 0; k < C; ++k) {
    for (std::size_t j = 0; j < N; ++j) lanes[j] = values[(k * N + j) % C];
    spread[k] = hn::Load(d, lanes);
  }
}

// Calls step(i, k, keep) for every vector: i its first sample, k its place in the block. `keep`
// zeroes the lanes of a vector that lie behind the window's last sample.
template <std::size_t C, class Step>
HWY_INLINE void ForEachVector(std::size_t samples, Step step) {
  const Lanes d;
  const std::size_t N = hn::Lanes(d);
  const auto whole = [](Vector v) HWY_ATTR { return v; };
  std::size_t i = 0;
  for (; i + C * N <= samples; i += C * N) {
    for (std::size_t k = 0; k < C; ++k) step(i + k * N, k, whole);
  }
  for (std::size_t k = 0; k < C && i < samples; ++k, i += N) {
    const auto inside = hn::FirstN(d, samples - i);
    step(i, k, [inside](Vector v) HWY_ATTR { return hn::IfThenElseZero(inside, v); });
  }
}

template <class D>
HWY_INLINE hn::Vec<D> LoadSamples(D d, const float* samples) {
  return hn::LoadU(d, samples);
}

template <class D>
HWY_INLINE hn::Vec<D> LoadSamples(D d, const std::uint8_t* samples) {
  const hn::Rebind<std::uint8_t, D> bytes;
  const hn::RebindToSigned<D> di;
  return hn::ConvertTo(d, hn::PromoteTo(di, hn::LoadU(bytes, samples)));
}

template <class D, class T>
HWY_INLINE void SampleStrip(D d, const T* in, std::size_t in_stride, std::size_t channels, float fx,
                            float fy, std::size_t rows, float* out, std::size_t out_stride) {
  const auto wx = hn::Set(d, fx);
  const auto wy = hn::Set(d, fy);
  auto above = Lerp(LoadSamples(d, in), LoadSamples(d, in + channels), wx);
  for (std::size_t row = 0; row < rows; ++row) {
    in += in_stride;
    const auto below = Lerp(LoadSamples(d, in), LoadSamples(d, in + channels), wx);
    hn::StoreU(Lerp(above, below, wy), d, out);
    above = below;
    out += out_stride;
  }
}

template <class T>
HWY_INLINE void SampleWindow(const T* image, std::size_t image_width, std::size_t channels,
                             std::size_t x, std::size_t y, float fx, float fy, std::size_t columns,
                             std::size_t rows, float* out) {
  const Lanes d;
  const std::size_t N = hn::Lanes(d);
  const std::size_t in_stride = image_width * channels;
  const std::size_t out_stride = columns * channels;
  const T* in = image + y * in_stride + x * channels;
  if (out_stride < N) {
    for (std::size_t i = 0; i < out_stride; ++i) {
      SampleStrip(hn::CappedTag<float, 1>(), in + i, in_stride, channels, fx, fy, rows, out + i,
                  out_stride);
    }
    return;
  }
  std::size_t i = 0;
  for (; i + N <= out_stride; i += N) {
    SampleStrip(d, in + i, in_stride, channels, fx, fy, rows, out + i, out_stride);
  }
  if (i < out_stride) {  // the last strip overlaps the one before
    i = out_stride - N;
    SampleStrip(d, in + i, in_stride, channels, fx, fy, rows, out + i, out_stride);
  }
}

void SampleTranslatedFloats(const float* image, std::size_t image_width, std::size_t channels,
                            std::size_t x, std::size_t y, float fx, float fy, std::size_t columns,
                            std::size_t rows, float* out) {
  SampleWindow(image, image_width, channels, x, y, fx, fy, columns, rows, out);
}

void SampleTranslatedBytes(const std::uint8_t* image, std::size_t image_width, std::size_t channels,
                           std::size_t x, std::size_t y, float fx, float fy, std::size_t columns,
                           std::size_t rows, float* out) {
  SampleWindow(image, image_width, channels, x, y, fx, fy, columns, rows, out);
}

template <class D>
HWY_INLINE void SplitVector(D d, const float* centre, std::size_t channels, std::size_t stride,
                            float* t, float* gx, float* gy) {
  hn::StoreU(hn::LoadU(d, centre), d, t);
  hn::StoreU(hn::Sub(hn::LoadU(d, centre + channels), hn::LoadU(d, centre - channels)), d, gx);
  hn::StoreU(hn::Sub(hn::LoadU(d, centre + stride), hn::LoadU(d, centre - stride)), d, gy);
}

void SplitGradients(const float* block, const window_shape& shape, float* t, float* gx, float* gy) {
  const Lanes d;
  const std::size_t N = hn::Lanes(d);
  const std::size_t C = shape.channels;
  const std::size_t length = shape.columns() * C;
  const std::size_t stride = length + 2 * C;
  for (std::size_t row = 0; row < shape.rows(); ++row) {
    const float* centre = block + (row + 1) * stride + C;
    const std::size_t o = row * length;
    std::size_t i = 0;
    for (; i + N <= length; i += N) {
      SplitVector(d, centre + i, C, stride, t + o + i, gx + o + i, gy + o + i);
    }
    if (i < length && length >= N) {  // the last vector overlaps the one before
      i = length - N;
      SplitVector(d, centre + i, C, stride, t + o + i, gx + o + i, gy + o + i);
      continue;
    }
    for (; i < length; ++i) {
      SplitVector(hn::CappedTag<float, 1>(), centre + i, C, stride, t + o + i, gx + o + i,
                  gy + o + i);
    }
  }
}

// One pixel: its channels from the four around it. `kWide` reads and writes four samples for three.
template <std::size_t C, bool kWide, class T>
HWY_INLINE void SamplePixel(const T* in, std::size_t stride, float fx, float fy, float* out) {
  const hn::CappedTag<float, kWide ? 4 : 1> d;
  const auto wx = hn::Set(d, fx);
  const auto wy = hn::Set(d, fy);
  for (std::size_t c = 0; c < (kWide ? 1 : C); ++c) {
    const T* p = in + c;
    const auto above = Lerp(LoadSamples(d, p), LoadSamples(d, p + C), wx);
    const auto below = Lerp(LoadSamples(d, p + stride), LoadSamples(d, p + stride + C), wx);
    hn::StoreU(Lerp(above, below, wy), d, out + c);
  }
}

// Where N neighbouring pixels of a row come from: the four samples about each start at offset[j].
struct PixelPlaces {
  HWY_ALIGN std::int32_t offset[16];
  HWY_ALIGN float fx[16];
  HWY_ALIGN float fy[16];
  std::uint32_t jumps = 0;  // bit j: pixel j + 1 is not read right beside pixel j
};

template <std::size_t C, bool kWide, class T>
HWY_INLINE void SamplePixels(const T* origin, std::size_t stride, const PixelPlaces& places,
                             std::size_t first, std::size_t end, float* out) {
  for (std::size_t j = first; j < end; ++j) {
    SamplePixel<C, kWide>(origin + places.offset[j], stride, places.fx[j], places.fy[j],
                          out + j * C);
  }
}

// A warp is near the identity: most neighbours are read side by side, so that a vector of samples
// comes in one piece, and each lane differs from a shift only by its pixel's fractions. kWide
// allows to read a vector past a pixel's four, and to write as much past all rows but the last.
template <std::size_t C, bool kWide, class T>
HWY_INLINE void SampleAffineRows(const T* image, std::size_t image_width,
                                 const affine_sampling& warp, const window_shape& shape,
                                 float* out) {
  const Lanes d;
  const hn::RebindToSigned<Lanes> di;
  const std::size_t N = hn::Lanes(d);
  const std::size_t stride = image_width * C;
  const auto pixel_step = hn::Set(di, static_cast<std::int32_t>(C));
  const auto row_step = hn::Set(di, static_cast<std::int32_t>(stride));
  const auto m00 = hn::Set(d, warp.m00);
  const auto m10 = hn::Set(d, warp.m10);
  const T* origin = image + warp.y * static_cast<std::ptrdiff_t>(stride) +
                    warp.x * static_cast<std::ptrdiff_t>(C);
  // Pixel of each sample of C vectors.
  HWY_ALIGN std::int32_t pixel_of[16 * C];
  for (std::size_t i = 0; i < C * N; ++i) pixel_of[i] = static_cast<std::int32_t>(i / C);
  PixelPlaces places;
  HWY_ALIGN std::int32_t next_lane[16];  // the last one has none, and none is asked for
  for (std::size_t j = 0; j < N; ++j)
    next_lane[j] = static_cast<std::int32_t>(std::min(j + 1, N - 1));
  const auto next = hn::SetTableIndices(di, next_lane);
  const auto half_x = static_cast<float>(shape.half_x);
  for (std::size_t row = 0; row < shape.rows(); ++row) {
    const float v = static_cast<float>(row) - static_cast<float>(shape.half_y);
    const auto row_x = hn::MulAdd(hn::Set(d, warp.m01), hn::Set(d, v), hn::Set(d, warp.fx));
    const auto row_y = hn::MulAdd(hn::Set(d, warp.m11), hn::Set(d, v), hn::Set(d, warp.fy));
    const bool last_row = row + 1 == shape.rows();
    for (std::size_t column = 0; column < shape.columns(); column += N) {
      const auto u = hn::Iota(d, static_cast<float>(column) - half_x);
      const auto x = hn::MulAdd(m00, u, row_x);
      const auto y = hn::MulAdd(m10, u, row_y);
      const auto x_floor = hn::Floor(x);
      const auto y_floor = hn::Floor(y);
      const auto fx = hn::Sub(x, x_floor);
      const auto fy = hn::Sub(y, y_floor);
      const auto offset = hn::Add(hn::Mul(hn::ConvertTo(di, x_floor), pixel_step),
                                  hn::Mul(hn::ConvertTo(di, y_floor), row_step));
      hn::Store(fx, d, places.fx);
      hn::Store(fy, d, places.fy);
      hn::Store(offset, di, places.offset);
      const std::size_t count = std::min(N, shape.columns() - column);
      if constexpr (!kWide) {
        SamplePixels<C, kWide>(origin, stride, places, 0, count, out);
      } else {
        const auto jump = hn::Ne(hn::Sub(hn::TableLookupLanes(offset, next), offset), pixel_step);
        std::uint8_t bits[8] = {};
        hn::StoreMaskBits(di, jump, bits);
        places.jumps = bits[0] | static_cast<std::uint32_t>(bits[1]) << 8;
        for (std::size_t k = 0; k * N < count * C; ++k) {
          const std::size_t first = k * N / C;
          const std::size_t end = std::min(((k + 1) * N - 1) / C + 1, count);
          const std::uint32_t inside = (1u << (end - 1)) - (1u << first);
          const bool whole = (k + 1) * N <= count * C || !last_row;
          if ((places.jumps & inside) != 0 || !whole) {
            SamplePixels<C, kWide>(origin, stride, places, first, end, out);
            continue;
          }
          const T* in = origin + places.offset[first] + (k * N - first * C);
          const auto pixel = hn::SetTableIndices(d, pixel_of + k * N);
          const auto wx = hn::TableLookupLanes(fx, pixel);
          const auto wy = hn::TableLookupLanes(fy, pixel);
          const auto above = Lerp(LoadSamples(d, in), LoadSamples(d, in + C), wx);
          const auto below = Lerp(LoadSamples(d, in + stride), LoadSamples(d, in + stride + C), wx);
          hn::StoreU(Lerp(above, below, wy), d, out + k * N);
        }
      }
      out += count * C;
    }
  }
  *out = 0.0f;
}

// The corners, by the arithmetic of the rows above: rounding is monotonic, so that no sample of the
// window lies outside of what its corners span.
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

template <class T>
HWY_INLINE void SampleWarped(const T* image, std::size_t image_width, std::size_t image_height,
                             const affine_sampling& warp, const window_shape& shape, float* out) {
  // Wide reads go on behind a pixel's right neighbour, which on the image's last row may lie behind
  // the image.
  const float reach = std::max(warp.m10, -warp.m10) * static_cast<float>(shape.half_x) +
                      std::max(warp.m11, -warp.m11) * static_cast<float>(shape.half_y) + 3.0f;
  const bool clear_of_last_row =
      HWY_TARGET != HWY_SCALAR && image_width >= 16 &&
      static_cast<float>(warp.y) + reach < static_cast<float>(image_height) - 1.0f;
  WithChannels(shape.channels, [&](auto channels) HWY_ATTR {
    constexpr std::size_t C = decltype(channels)::value;
    if constexpr (C >= 3) {
      if (clear_of_last_row) {
        return SampleAffineRows<C, true>(image, image_width, warp, shape, out);
      }
    }
    SampleAffineRows<C, false>(image, image_width, warp, shape, out);
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

void GradientProducts(const template_planes& level, const window_shape& shape, double sums[3]) {
  const Lanes d;
  WithChannels(shape.channels, [&](auto channels) HWY_ATTR {
    constexpr std::size_t C = decltype(channels)::value;
    Vector xx[C], xy[C], yy[C];
    for (std::size_t k = 0; k < C; ++k) xx[k] = xy[k] = yy[k] = hn::Zero(d);
    ForEachVector<C>(shape.samples(), [&](std::size_t i, std::size_t k, auto) HWY_ATTR {
      const auto gx = hn::LoadU(d, level.gx + i);
      const auto gy = hn::LoadU(d, level.gy + i);
      xx[k] = hn::MulAdd(gx, gx, xx[k]);
      xy[k] = hn::MulAdd(gx, gy, xy[k]);
      yy[k] = hn::MulAdd(gy, gy, yy[k]);
    });
    sums[0] = sums[1] = sums[2] = 0.0;
    for (std::size_t k = 0; k < C; ++k) {
      sums[0] += Total(xx[k]);
      sums[1] += Total(xy[k]);
      sums[2] += Total(yy[k]);
    }
  });
}

// Motion sums of both stages; the affine one has the four sums with u and v as well.
template <std::size_t C, bool kAffine, bool kColor, bool kPerChannel>
HWY_INLINE void Residual(const template_planes& level, const offset_planes& offsets,
                         const float* window, const window_shape& shape, const color_fit& color,
                         double* sums) {
  const Lanes d;
  constexpr std::size_t kMotion = kAffine ? 6 : 2;
  Vector gain[C], bias[C], tr[C], ones[C], x[C], y[C], motion[4];
  if constexpr (kColor) {
    SpreadChannels<C>(color.gain, gain);
    SpreadChannels<C>(color.bias, bias);
  }
  for (std::size_t k = 0; k < C; ++k) tr[k] = ones[k] = x[k] = y[k] = hn::Zero(d);
  for (auto& m : motion) m = hn::Zero(d);
  ForEachVector<C>(shape.samples(), [&](std::size_t i, std::size_t k, auto keep) HWY_ATTR {
    const auto t = hn::LoadU(d, level.t + i);
    auto sample = hn::LoadU(d, window + i);
    if constexpr (kColor) sample = hn::MulAdd(gain[k], sample, bias[k]);
    const auto r = hn::Sub(t, sample);
    const auto gx = hn::Mul(hn::LoadU(d, level.gx + i), r);
    const auto gy = hn::Mul(hn::LoadU(d, level.gy + i), r);
    x[k] = hn::Add(gx, x[k]);
    y[k] = hn::Add(gy, y[k]);
    if constexpr (kAffine) {
      const auto u = hn::LoadU(d, offsets.u + i);
      const auto v = hn::LoadU(d, offsets.v + i);
      motion[0] = hn::MulAdd(u, gx, motion[0]);
      motion[1] = hn::MulAdd(v, gx, motion[1]);
      motion[2] = hn::MulAdd(u, gy, motion[2]);
      motion[3] = hn::MulAdd(v, gy, motion[3]);
    }
    if constexpr (kPerChannel) {
      tr[k] = hn::MulAdd(t, r, tr[k]);
      ones[k] = hn::Add(keep(r), ones[k]);
    }
  });
  std::fill_n(sums, kMotion + (kPerChannel ? 2 * C : 0), 0.0);
  for (std::size_t k = 0; k < C; ++k) {
    sums[0] += Total(x[k]);
    sums[1] += Total(y[k]);
  }
  for (std::size_t m = 2; m < kMotion; ++m) sums[m] = Total(motion[m - 2]);
  if constexpr (kPerChannel) {
    AddByChannel<C>(tr, sums + kMotion, 2);
    AddByChannel<C>(ones, sums + kMotion + 1, 2);
  }
}

void TranslationResidual(const template_planes& level, const float* window,
                         const window_shape& shape, const color_fit& color, bool per_channel,
                         double* sums) {
  WithChannels(shape.channels, [&](auto channels) HWY_ATTR {
    constexpr std::size_t C = decltype(channels)::value;
    if (per_channel) {
      Residual<C, false, true, true>(level, {}, window, shape, color, sums);
    } else if (color.gain != nullptr) {
      Residual<C, false, true, false>(level, {}, window, shape, color, sums);
    } else {
      Residual<C, false, false, false>(level, {}, window, shape, color, sums);
    }
  });
}

void AffineResidual(const template_planes& level, const offset_planes& offsets, const float* window,
                    const window_shape& shape, const color_fit& color, double* sums) {
  WithChannels(shape.channels, [&](auto channels) HWY_ATTR {
    constexpr std::size_t C = decltype(channels)::value;
    if (color.gain != nullptr) {
      Residual<C, true, true, true>(level, offsets, window, shape, color, sums);
    } else {
      Residual<C, true, false, false>(level, offsets, window, shape, color, sums);
    }
  });
}

void TemplateProducts(const template_planes& level, const offset_planes& offsets,
                      const window_shape& shape, template_products& products) {
  const Lanes d;
  products = {};
  WithChannels(shape.channels, [&](auto channels) HWY_ATTR {
    constexpr std::size_t C = decltype(channels)::value;
    Vector gradient[3][6];
    Vector cross[4][3][C];
    Vector square[C], sum[C];
    for (auto& row : gradient) {
      for (auto& entry : row) entry = hn::Zero(d);
    }
    for (auto& row : cross) {
      for (auto& entry : row) {
        for (auto& channel : entry) channel = hn::Zero(d);
      }
    }
    for (std::size_t k = 0; k < C; ++k) square[k] = sum[k] = hn::Zero(d);
    ForEachVector<C>(shape.samples(), [&](std::size_t i, std::size_t k, auto) HWY_ATTR {
      const auto t = hn::LoadU(d, level.t + i);
      const auto gx = hn::LoadU(d, level.gx + i);
      const auto gy = hn::LoadU(d, level.gy + i);
      const auto u = hn::LoadU(d, offsets.u + i);
      const auto v = hn::LoadU(d, offsets.v + i);
      const Vector pairs[3] = {hn::Mul(gx, gx), hn::Mul(gx, gy), hn::Mul(gy, gy)};
      for (std::size_t p = 0; p < 3; ++p) {
        const auto pu = hn::Mul(pairs[p], u);
        const auto pv = hn::Mul(pairs[p], v);
        gradient[p][0] = hn::Add(pairs[p], gradient[p][0]);
        gradient[p][1] = hn::Add(pu, gradient[p][1]);
        gradient[p][2] = hn::Add(pv, gradient[p][2]);
        gradient[p][3] = hn::MulAdd(pu, u, gradient[p][3]);
        gradient[p][4] = hn::MulAdd(pu, v, gradient[p][4]);
        gradient[p][5] = hn::MulAdd(pv, v, gradient[p][5]);
      }
      const Vector factors[4] = {hn::Mul(gx, t), hn::Mul(gy, t), gx, gy};
      for (std::size_t p = 0; p < 4; ++p) {
        cross[p][0][k] = hn::Add(factors[p], cross[p][0][k]);
        cross[p][1][k] = hn::MulAdd(factors[p], u, cross[p][1][k]);
        cross[p][2][k] = hn::MulAdd(factors[p], v, cross[p][2][k]);
      }
      square[k] = hn::MulAdd(t, t, square[k]);
      sum[k] = hn::Add(t, sum[k]);
    });
    for (std::size_t p = 0; p < 3; ++p) {
      for (std::size_t q = 0; q < 6; ++q) products.gradient[p][q] = Total(gradient[p][q]);
    }
    for (std::size_t p = 0; p < 4; ++p) {
      for (std::size_t q = 0; q < 3; ++q) {
        double by_channel[C] = {};
        AddByChannel<C>(cross[p][q], by_channel, 1);
        for (std::size_t c = 0; c < C; ++c) products.cross[c][p][q] = by_channel[c];
      }
    }
    AddByChannel<C>(square, products.square, 1);
    AddByChannel<C>(sum, products.sum, 1);
  });
}

void ChannelEnergies(const float* t, const window_shape& shape, double* energies) {
  const Lanes d;
  WithChannels(shape.channels, [&](auto channels) HWY_ATTR {
    constexpr std::size_t C = decltype(channels)::value;
    Vector square[C];
    for (auto& s : square) s = hn::Zero(d);
    ForEachVector<C>(shape.samples(), [&](std::size_t i, std::size_t k, auto keep) HWY_ATTR {
      const auto x = keep(hn::LoadU(d, t + i));
      square[k] = hn::MulAdd(x, x, square[k]);
    });
    std::fill_n(energies, C, 0.0);
    AddByChannel<C>(square, energies, 1);
  });
}

void ChannelMeans(const float* window, const window_shape& shape, float* means) {
  const Lanes d;
  WithChannels(shape.channels, [&](auto channels) HWY_ATTR {
    constexpr std::size_t C = decltype(channels)::value;
    // Differences from the first pixel, so that a flat channel's mean has no rounding error.
    Vector pivot[C], sum[C];
    SpreadChannels<C>(window, pivot);
    for (auto& s : sum) s = hn::Zero(d);
    ForEachVector<C>(shape.samples(), [&](std::size_t i, std::size_t k, auto keep) HWY_ATTR {
      sum[k] = hn::Add(keep(hn::Sub(hn::LoadU(d, window + i), pivot[k])), sum[k]);
    });
    double totals[C] = {};
    AddByChannel<C>(sum, totals, 1);
    for (std::size_t c = 0; c < C; ++c) {
      means[c] = window[c] + static_cast<float>(totals[c] / static_cast<double>(shape.pixels()));
    }
  });
}

void CentredSquares(const float* x, const float* x_means, const window_shape& shape, double* xx) {
  const Lanes d;
  WithChannels(shape.channels, [&](auto channels) HWY_ATTR {
    constexpr std::size_t C = decltype(channels)::value;
    Vector mean[C], square[C];
    SpreadChannels<C>(x_means, mean);
    for (auto& s : square) s = hn::Zero(d);
    ForEachVector<C>(shape.samples(), [&](std::size_t i, std::size_t k, auto keep) HWY_ATTR {
      const auto e = keep(hn::Sub(hn::LoadU(d, x + i), mean[k]));
      square[k] = hn::MulAdd(e, e, square[k]);
    });
    std::fill_n(xx, C, 0.0);
    AddByChannel<C>(square, xx, 1);
  });
}

void CentredProducts(const float* x, const float* x_means, const float* y, const float* y_means,
                     const window_shape& shape, double* xy, double* yy) {
  const Lanes d;
  WithChannels(shape.channels, [&](auto channels) HWY_ATTR {
    constexpr std::size_t C = decltype(channels)::value;
    Vector x_mean[C], y_mean[C], product[C], square[C];
    SpreadChannels<C>(x_means, x_mean);
    SpreadChannels<C>(y_means, y_mean);
    for (std::size_t k = 0; k < C; ++k) product[k] = square[k] = hn::Zero(d);
    ForEachVector<C>(shape.samples(), [&](std::size_t i, std::size_t k, auto keep) HWY_ATTR {
      const auto e = hn::Sub(hn::LoadU(d, x + i), x_mean[k]);
      const auto f = keep(hn::Sub(hn::LoadU(d, y + i), y_mean[k]));
      product[k] = hn::MulAdd(e, f, product[k]);
      square[k] = hn::MulAdd(f, f, square[k]);
    });
    std::fill_n(xy, C, 0.0);
    std::fill_n(yy, C, 0.0);
    AddByChannel<C>(product, xy, 1);
    AddByChannel<C>(square, yy, 1);
  });
}

}  // namespace marrow::tracking::HWY_NAMESPACE
HWY_AFTER_NAMESPACE();

#if HWY_ONCE
namespace marrow::tracking {

HWY_EXPORT(SampleTranslatedFloats);
HWY_EXPORT(SampleTranslatedBytes);
HWY_EXPORT(SplitGradients);
HWY_EXPORT(AffineWindowInside);
HWY_EXPORT(SampleAffineFloats);
HWY_EXPORT(SampleAffineBytes);
HWY_EXPORT(GradientProducts);
HWY_EXPORT(TranslationResidual);
HWY_EXPORT(AffineResidual);
HWY_EXPORT(TemplateProducts);
HWY_EXPORT(ChannelEnergies);
HWY_EXPORT(ChannelMeans);
HWY_EXPORT(CentredSquares);
HWY_EXPORT(CentredProducts);

namespace kernels {

void SampleTranslated(const float* image, std::size_t image_width, std::size_t channels,
                      std::size_t x, std::size_t y, float fx, float fy, std::size_t columns,
                      std::size_t rows, float* out) {
  HWY_DYNAMIC_DISPATCH(SampleTranslatedFloats)
  (image, image_width, channels, x, y, fx, fy, columns, rows, out);
}

void SampleTranslated(const std::uint8_t* image, std::size_t image_width, std::size_t channels,
                      std::size_t x, std::size_t y, float fx, float fy, std::size_t columns,
                      std::size_t rows, float* out) {
  HWY_DYNAMIC_DISPATCH(SampleTranslatedBytes)
  (image, image_width, channels, x, y, fx, fy, columns, rows, out);
}

void SplitGradients(const float* block, const window_shape& shape, float* t, float* gx, float* gy) {
  HWY_DYNAMIC_DISPATCH(SplitGradients)(block, shape, t, gx, gy);
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

void GradientProducts(const template_planes& level, const window_shape& shape, double sums[3]) {
  HWY_DYNAMIC_DISPATCH(GradientProducts)(level, shape, sums);
}

void TranslationResidual(const template_planes& level, const float* window,
                         const window_shape& shape, const color_fit& color, bool per_channel,
                         double* sums) {
  HWY_DYNAMIC_DISPATCH(TranslationResidual)(level, window, shape, color, per_channel, sums);
}

void AffineResidual(const template_planes& level, const offset_planes& offsets, const float* window,
                    const window_shape& shape, const color_fit& color, double* sums) {
  HWY_DYNAMIC_DISPATCH(AffineResidual)(level, offsets, window, shape, color, sums);
}

void TemplateProducts(const template_planes& level, const offset_planes& offsets,
                      const window_shape& shape, template_products& products) {
  HWY_DYNAMIC_DISPATCH(TemplateProducts)(level, offsets, shape, products);
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
