#pragma once

#include "tracking/window_shape.h"

namespace marrow::tracking::kernels {

// S(t t) of each channel.
void ChannelEnergies(const float* t, const window_shape& shape, double* energies);

// Mean of each channel; exact for a flat channel.
void ChannelMeans(const float* window, const window_shape& shape, float* means);

// Sums about the given means for each channel: S(x x), and with y S(x y) and S(y y).
void CentredSquares(const float* x, const float* x_means, const window_shape& shape, double* xx);
void CentredProducts(const float* x, const float* x_means, const float* y, const float* y_means,
                     const window_shape& shape, double* xy, double* yy);

}  // namespace marrow::tracking::kernels
