#pragma once

#include <cstddef>
#include <limits>
#include <vector>

#include "tracking/folded_rows.h"

namespace marrow::tracking {

// Rows folded with a halo of one position, NaN where the image has no pixels.
class FoldedImage {
 public:
  FoldedImage(std::size_t width, std::size_t height)
      : folding_{width},
        stride_((folding_.positions() + 2) * RowFolding::kSegments),
        values_(stride_ * height, std::numeric_limits<float>::quiet_NaN()) {}

  // From an image of rows one after the other.
  explicit FoldedImage(const std::vector<float>& image, std::size_t width)
      : FoldedImage(width, image.size() / width) {
    const int positions = folding_.positions();
    for (std::size_t y = 0; y < image.size() / width; ++y) {
      for (int p = -1; p <= positions; ++p) {
        for (int segment = 0; segment < int(RowFolding::kSegments); ++segment) {
          const int x = segment * positions + p;
          if (x < 0 || x >= int(width)) continue;
          Row(y)[p * int(RowFolding::kSegments) + segment] = image[y * width + x];
        }
      }
    }
  }

  const RowFolding& folding() const { return folding_; }
  float* Row(std::size_t y) { return values_.data() + y * stride_ + RowFolding::kSegments; }

 private:
  RowFolding folding_;
  std::size_t stride_;
  std::vector<float> values_;
};

}  // namespace marrow::tracking
