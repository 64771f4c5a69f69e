#pragma once

#include <cstdint>
#include <vector>

#include "stabilization/crop/cropper.h"

namespace marrow::stabilization {

struct crop_size {
  std::int32_t width = 0;
  std::int32_t height = 0;
};

// Replaces the frames' rectangles by windows of one size whose centres follow the rectangles'
// centres smoothed in time, and returns that size. The filter is a Gaussian exp(-d^2 / sigma^2) of
// d frames, cut at 4 sigma and at the clip's ends; with `bilateral` each axis is also weighted by
// exp(-e^2 / bilateral_sigma^2) of the centres' distance e in pixels (Tomasi and Manduchi,
// Bilateral Filtering for Gray and Color Images, 1998). With `constant` every frame gets the
// intersection of all. An empty list is left alone.
crop_size smooth_crop_path(std::vector<crop_rect>& rects, bool bilateral, float sigma,
                           float bilateral_sigma, bool constant);

}  // namespace marrow::stabilization
