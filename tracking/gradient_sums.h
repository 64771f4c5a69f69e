#pragma once

#include <cstddef>
#include <vector>

#include "tracking/gaussian_smoothing.h"

namespace marrow::tracking {

// The gradient matrix of each pixel's window, row by row from the top: sums over (2 half_win_x + 1)
// by (2 half_win_y + 1) pixels of Ix Ix, Iy Iy and Ix Iy, where Ix = I(x + 1, y) - I(x - 1, y) and
// Iy likewise, not halved. Running sums in 64-bit floats: the cost does not depend on the window,
// and strong texture leaves no trace in a 32-bit result once the window has passed it. The products
// of a row are formed anew when it leaves the window: that is cheaper than the memory to keep them.
class GradientSums {
 public:
  GradientSums(std::size_t half_win_x, std::size_t half_win_y, std::size_t max_width);

  // Starts on an image with rows `stride` samples apart. The windows of the region's pixels, and
  // one pixel about them, must lie inside the image, and the region may not be empty. The image
  // must stay unchanged until the last row is read.
  void Start(const float* image, std::size_t stride, const PixelRegion& region);

  // Sums of the region's next row: for each of its columns sum Ix Ix, sum Iy Iy, sum Ix Iy, 0.
  // Valid until the next call.
  const float* NextRow();

 private:
  void FormProducts(std::size_t y, float* products) const;

  std::size_t half_win_x_;
  std::size_t half_win_y_;
  const float* image_ = nullptr;
  std::size_t stride_ = 0;
  std::size_t first_column_ = 0;  // of the products
  std::size_t columns_ = 0;       // of the products: the region's and half a window on each side
  std::size_t y_ = 0;             // row of the next sums
  bool started_ = false;
  // Four numbers a column, the fourth 0.
  std::vector<float> entering_, leaving_, sums_;
  std::vector<double> column_sums_;
};

}  // namespace marrow::tracking
