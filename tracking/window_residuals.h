#pragma once

#include <cstddef>
#include <cstdint>

#include "tracking/window_sampling.h"
#include "tracking/window_shape.h"

namespace marrow::tracking {

// T = gain * I + bias for each channel; null stands for gain 1 and bias 0.
struct color_fit {
  const float* gain = nullptr;
  const float* bias = nullptr;
};

namespace kernels {

// With r = T - (gain I + bias), I what SampleTranslated gives for the window at `place`, which goes
// no further than into registers: sums = {S(gx r), S(gy r)}, with a color fit followed by S(T r)
// and S(r) of each channel.
void TranslationResidual(const float* t, const float* image, std::size_t image_width,
                         std::size_t image_height, const translated_sampling& place,
                         const window_shape& shape, const color_fit& color, double* sums);
void TranslationResidual(const float* t, const std::uint8_t* image, std::size_t image_width,
                         std::size_t image_height, const translated_sampling& place,
                         const window_shape& shape, const color_fit& color, double* sums);

// As above for the affine Jacobian, of a window that was sampled before: {S(gx r), S(gy r),
// S(u gx r), S(v gx r), S(u gy r), S(v gy r)}, and the same with a color fit.
void AffineResidual(const float* t, const float* window, const window_shape& shape,
                    const color_fit& color, double* sums);

}  // namespace kernels
}  // namespace marrow::tracking
