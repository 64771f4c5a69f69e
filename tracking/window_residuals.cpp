#include "tracking/window_residuals.h"

#include <cstdint>

#undef HWY_TARGET_INCLUDE
#define HWY_TARGET_INCLUDE "tracking/window_residuals.cpp"
#include <hwy/foreach_target.h>
// After foreach_target.
#include <hwy/highway.h>

#include "tracking/window_vectors-inl.h"

HWY_BEFORE_NAMESPACE();
namespace marrow::tracking::HWY_NAMESPACE {

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

}  // namespace marrow::tracking::HWY_NAMESPACE
HWY_AFTER_NAMESPACE();

#if HWY_ONCE
namespace marrow::tracking {

HWY_EXPORT(TranslationResidualFloats);
HWY_EXPORT(TranslationResidualBytes);
HWY_EXPORT(AffineResidual);

namespace kernels {

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

}  // namespace kernels
}  // namespace marrow::tracking
#endif
