#pragma once

#include "tracking/window_shape.h"

namespace marrow::tracking {

// The sums that make up the normal matrices of both stages.
struct template_products {
  // [gx gx, gx gy, gy gy][1, u, v, u u, u v, v v], over all channels.
  double gradient[3][6];
  // For each channel [gx T, gy T, gx, gy][1, u, v], and S(T T), S(T).
  double cross[kMaxChannels][4][3];
  double square[kMaxChannels];
  double sum[kMaxChannels];
};

namespace kernels {

// sums = {S(gx gx), S(gx gy), S(gy gy)}.
void GradientProducts(const float* t, const window_shape& shape, double sums[3]);

void TemplateProducts(const float* t, const window_shape& shape, template_products& products);

}  // namespace kernels
}  // namespace marrow::tracking
