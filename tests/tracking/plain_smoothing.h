#pragma once

#include <algorithm>
#include <vector>

#include "tracking/gaussian_smoothing.h"

namespace marrow::tracking::testing {

// Smooths a region of an image, along x, then along y, as one would write it down: edge pixels of
// the region repeat; middle tap first, then pairs outwards.
inline std::vector<float> PlainSmoothing(std::vector<float> image, int stride, const PixelRegion& r,
                                         const std::vector<float>& kernel) {
  const int radius = kernel.size() / 2, x0 = r.x0, x1 = r.x1, y0 = r.y0, y1 = r.y1;
  for (const bool along_x : {true, false}) {
    const std::vector<float> source = image;
    for (int y = y0; y < y1; ++y) {
      for (int x = x0; x < x1; ++x) {
        const auto at = [&](int k) {
          return along_x ? source[y * stride + std::clamp(x + k, x0, x1 - 1)]
                         : source[std::clamp(y + k, y0, y1 - 1) * stride + x];
        };
        float sum = kernel[radius] * at(0);
        for (int k = 1; k <= radius; ++k) sum += kernel[radius + k] * (at(-k) + at(k));
        image[y * stride + x] = sum;
      }
    }
  }
  return image;
}

}  // namespace marrow::tracking::testing
