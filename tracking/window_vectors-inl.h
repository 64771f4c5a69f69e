// Per target: included once for each instruction set, hence no ordinary guard.
#if defined(MARROW_TRACKING_WINDOW_VECTORS_INL_H_) == defined(HWY_TARGET_TOGGLE)
#ifdef MARROW_TRACKING_WINDOW_VECTORS_INL_H_
#undef MARROW_TRACKING_WINDOW_VECTORS_INL_H_
#else
#define MARROW_TRACKING_WINDOW_VECTORS_INL_H_
#endif

#include <hwy/highway.h>

#include <cstddef>
#include <cstdint>
#include <type_traits>
#include <utility>

#include "tracking/window_shape.h"

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
namespace marrow::tracking {
namespace HWY_NAMESPACE {
// What the loops over a window's samples share: vectors, walks over rows, sums that do not depend
// on the vectors' width, and the steps of a bilinear sample.
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

}  // namespace HWY_NAMESPACE
}  // namespace marrow::tracking
HWY_AFTER_NAMESPACE();

#endif
