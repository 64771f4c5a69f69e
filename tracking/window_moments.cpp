#include "tracking/window_moments.h"

#undef HWY_TARGET_INCLUDE
#define HWY_TARGET_INCLUDE "tracking/window_moments.cpp"
#include <hwy/foreach_target.h>
// After foreach_target.
#include <hwy/highway.h>

#include "tracking/window_vectors-inl.h"

HWY_BEFORE_NAMESPACE();
namespace marrow::tracking::HWY_NAMESPACE {

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
// k its place in RowSums. `keep` zeroes the lanes behind the row's last sample.
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

HWY_EXPORT(ChannelEnergies);
HWY_EXPORT(ChannelMeans);
HWY_EXPORT(CentredSquares);
HWY_EXPORT(CentredProducts);

namespace kernels {

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
