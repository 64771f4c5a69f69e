#pragma once

#include <cstddef>

#include "platform/memory/line_aligned.h"
#include "tracking/image_pyramid.h"
#include "tracking/window_shape.h"

namespace marrow::tracking {

// The template of one feature: on each pyramid level the window around it with its border, a plane
// of shape.plane_size() floats. What the planes hold beside these is 0.
struct WindowStack {
  WindowStack() = default;
  WindowStack(std::size_t half_x, std::size_t half_y, std::size_t channels, std::size_t levels);

  // The window's first sample.
  float* Level(std::size_t level) {
    return planes.data() + level * shape.plane_size() + shape.plane_start();
  }
  const float* Level(std::size_t level) const {
    return planes.data() + level * shape.plane_size() + shape.plane_start();
  }

  window_shape shape;
  std::size_t levels_built = 0;
  memory::LineAlignedVector<float> planes;
};

// On how many of the first `levels` levels of the pyramid a template around (x, y) fits. With ix,
// iy the whole part of the position on the level, it needs half_x + 1 <= ix <= w - half_x - 3 and
// half_y + 1 <= iy <= h - half_y - 4: the limits of the two axes differ.
std::size_t CountWindowLevels(std::size_t levels, float x, float y, const window_shape& shape,
                              const ImagePyramid& pyramid);

// Samples one level, on which the template must fit.
void ExtractWindowLevel(std::size_t level, float x, float y, const ImagePyramid& pyramid,
                        WindowStack& stack);

// Samples every level on which the template around (x, y), pixels of level 0, fits; the first on
// which it does not fit ends it. Returns and stores the number of levels.
std::size_t ExtractWindowStack(std::size_t levels, float x, float y, const ImagePyramid& pyramid,
                               WindowStack& stack);

}  // namespace marrow::tracking
