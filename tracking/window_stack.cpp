#include "tracking/window_stack.h"

#include <algorithm>
#include <cmath>

#include "tracking/window_sampling.h"

namespace marrow::tracking {
namespace {

float LevelScale(std::size_t level) {
  return std::ldexp(1.0f, -static_cast<int>(level));
}

bool TemplateFits(float x, float y, const window_shape& shape, std::size_t width,
                  std::size_t height) {
  if (width < 2 * shape.half_x + 4 || height < 2 * shape.half_y + 5) return false;
  const float ix = std::floor(x);
  const float iy = std::floor(y);
  return ix >= static_cast<float>(shape.half_x + 1) &&
         ix <= static_cast<float>(width - shape.half_x - 3) &&
         iy >= static_cast<float>(shape.half_y + 1) &&
         iy <= static_cast<float>(height - shape.half_y - 4);
}

}  // namespace

WindowStack::WindowStack(std::size_t half_x, std::size_t half_y, std::size_t channels,
                         std::size_t levels)
    : shape{half_x, half_y, channels}, planes(levels * shape.plane_size()) {}

std::size_t CountWindowLevels(std::size_t levels, float x, float y, const window_shape& shape,
                              const ImagePyramid& pyramid) {
  levels = std::min(levels, pyramid.levels);
  for (std::size_t l = 0; l < levels; ++l) {
    if (!TemplateFits(x * LevelScale(l), y * LevelScale(l), shape, pyramid.LevelWidth(l),
                      pyramid.LevelHeight(l))) {
      return l;
    }
  }
  return levels;
}

void ExtractWindowLevel(std::size_t level, float x, float y, const ImagePyramid& pyramid,
                        WindowStack& stack) {
  const window_shape& shape = stack.shape;
  x *= LevelScale(level);
  y *= LevelScale(level);
  const float ix = std::floor(x);
  const float iy = std::floor(y);
  const level_image image = pyramid.Level(level);
  const translated_sampling place = {static_cast<std::size_t>(ix) - shape.half_x - 1,
                                     static_cast<std::size_t>(iy) - shape.half_y - 1, x - ix,
                                     y - iy};
  image.WithSamples([&](const auto* samples) {
    kernels::SampleTranslated(samples, image.width, shape.channels, place, shape.columns() + 2,
                              shape.rows() + 2,
                              stack.Level(level) - shape.stride() - shape.channels, shape.stride());
  });
}

std::size_t ExtractWindowStack(std::size_t levels, float x, float y, const ImagePyramid& pyramid,
                               WindowStack& stack) {
  stack.levels_built = CountWindowLevels(levels, x, y, stack.shape, pyramid);
  for (std::size_t l = 0; l < stack.levels_built; ++l) {
    ExtractWindowLevel(l, x, y, pyramid, stack);
  }
  return stack.levels_built;
}

}  // namespace marrow::tracking
