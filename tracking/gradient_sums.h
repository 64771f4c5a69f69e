#pragma once

#include <cstddef>
#include <functional>
#include <vector>

#include "tracking/gaussian_smoothing.h"

namespace marrow::tracking {

// A row of gradient matrices: for each pixel the window's sums of Ix Ix, Iy Iy and Ix Iy.
struct gradient_sum_row {
  const float* xx;
  const float* yy;
  const float* xy;
};

// Row y of an image, from its column 0. Readers that go down an image ask for a row again while it
// is at most a given number of rows above the lowest one they have seen.
using ImageRows = std::function<const float*(std::size_t y)>;

// A row of an image and its neighbours, from the first pixel in use.
struct row_triple {
  const float* above;
  const float* row;
  const float* below;
};

// How GradientSums' three planes lie, plane p beginning p strides behind the first. Before the
// columns stand `window` zeroes; behind them there is room for a vector of any target.
struct gradient_sum_planes {
  std::size_t columns;        // the region's and half a window on each side
  std::size_t window;         // columns of a window
  std::size_t column_stride;  // of the sums over columns
  std::size_t sum_stride;     // of the sums over windows
};

// The gradient matrix of each pixel's window, row by row from the top: sums over (2 half_win_x + 1)
// by (2 half_win_y + 1) pixels of Ix Ix, Iy Iy and Ix Iy, where Ix = I(x + 1, y) - I(x - 1, y) and
// Iy likewise, not halved. Running sums in 64-bit floats: the cost does not depend on the window,
// and strong texture leaves no trace in a 32-bit result once the window has passed it. The products
// of a row are formed anew when it leaves the window: that is cheaper than the memory to keep them.
class GradientSums {
 public:
  GradientSums(std::size_t half_win_x, std::size_t half_win_y, std::size_t max_width);

  // How many of the last rows of an image must be at hand.
  std::size_t kept_rows() const { return 2 * half_win_y_ + 4; }

  // Starts on an image. The windows of the region's pixels, and one pixel about them, must lie
  // inside the image, and the region may not be empty.
  void Start(ImageRows rows, const PixelRegion& region);

  // Sums of the region's next row, valid until the next call.
  gradient_sum_row NextRow();

 private:
  row_triple RowsAbout(std::size_t y) const;

  std::size_t half_win_x_;
  std::size_t half_win_y_;
  gradient_sum_planes planes_;
  ImageRows rows_;
  std::size_t left_ = 0;        // first column of the first window
  std::size_t window_top_ = 0;  // first row of the windows of the row read last
  bool started_ = false;
  std::vector<double> column_sums_;  // over the rows of a window
  std::vector<float> sums_;          // of windows that end at a column
};

}  // namespace marrow::tracking
