#pragma once

#include <cstddef>
#include <vector>

#include "tracking/image_pyramid.h"
#include "tracking/window_kernels.h"

namespace marrow::tracking {

// The template of one feature: on each pyramid level the window around it and the window's
// gradients. The three planes of a level follow one another, each of shape.plane_size() floats:
// T, Gx(u, v) = B(u + 1, v) - B(u - 1, v) and Gy likewise, interleaved by channel, behind them
// zeroes.
struct WindowStack {
  WindowStack() = default;
  WindowStack(std::size_t half_x, std::size_t half_y, std::size_t channels, std::size_t levels);

  template_planes Level(std::size_t level) const {
    const std::size_t plane = shape.plane_size();
    const float* t = data.data() + 3 * level * plane;
    return {t, t + plane, t + 2 * plane};
  }

  window_shape shape;
  std::size_t levels_built = 0;
  std::vector<float> data;
};

// Floats of scratch that ExtractWindowLevel needs.
std::size_t WindowScratchSize(const window_shape& shape);

// On how many of the first `levels` levels of the pyramid a template around (x, y) fits. With ix,
// iy the whole part of the position on the level, it needs half_x + 1 <= ix <= w - half_x - 3 and
// half_y + 1 <= iy <= h - half_y - 4: the limits of the two axes differ.
std::size_t CountWindowLevels(std::size_t levels, float x, float y, const window_shape& shape,
                              const ImagePyramid& pyramid);

// Samples one level, on which the template must fit.
void ExtractWindowLevel(std::size_t level, float x, float y, const ImagePyramid& pyramid,
                        WindowStack& stack, float* scratch);

// Samples every level on which the template around (x, y), pixels of level 0, fits; the first on
// which it does not fit ends it. Returns and stores the number of levels.
std::size_t ExtractWindowStack(std::size_t levels, float x, float y, const ImagePyramid& pyramid,
                               WindowStack& stack, float* scratch);

}  // namespace marrow::tracking
