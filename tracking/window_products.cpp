#include "tracking/window_products.h"

#undef HWY_TARGET_INCLUDE
#define HWY_TARGET_INCLUDE "tracking/window_products.cpp"
#include <hwy/foreach_target.h>
// After foreach_target.
#include <hwy/highway.h>

#include "tracking/window_vectors-inl.h"

HWY_BEFORE_NAMESPACE();
namespace marrow::tracking::HWY_NAMESPACE {

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

}  // namespace marrow::tracking::HWY_NAMESPACE
HWY_AFTER_NAMESPACE();

#if HWY_ONCE
namespace marrow::tracking {

HWY_EXPORT(GradientProducts);
HWY_EXPORT(TemplateProducts);

namespace kernels {

void GradientProducts(const float* t, const window_shape& shape, double sums[3]) {
  HWY_DYNAMIC_DISPATCH(GradientProducts)(t, shape, sums);
}

void TemplateProducts(const float* t, const window_shape& shape, template_products& products) {
  HWY_DYNAMIC_DISPATCH(TemplateProducts)(t, shape, products);
}

}  // namespace kernels
}  // namespace marrow::tracking
#endif
