#pragma once

#include <cstddef>
#include <functional>
#include <vector>

#include "platform/memory/line_aligned.h"
#include "tracking/folded_rows.h"

namespace marrow::tracking {

// A folded row of gradient matrices: for each pixel the window's sums of Ix Ix, Iy Iy and Ix Iy.
struct gradient_sum_row {
  const float* xx;
  const float* yy;
  const float* xy;
};

// Row y of an image, folded, with a halo of one position. Readers that go down an image ask for a
// row again while it is at most a given number of rows above the lowest one they have seen.
using ImageRows = std::function<const float*(std::size_t y)>;

// The gradient matrix of each pixel's window, row by row from the top: sums over (2 half_win_x + 1)
// by (2 half_win_y + 1) pixels of Ix Ix, Iy Iy and Ix Iy, where Ix = I(x + 1, y) - I(x - 1, y) and
// Iy likewise, not halved.
//
// Sums of 32-bit floats that are only added, never taken away again: strong texture leaves no trace
// once the window has passed it, the sums of squares are never negative, and the cost hardly
// depends on the window. Along x each window is the end of one block and the beginning of the next,
// blocks as long as the window (van Herk 1992; Gil and Werman 1993). Along y that is done with the
// sums of kGroup rows each, which are kept; the rows of the groups that a window covers in part are
// formed anew from the image, which is cheaper than the memory to keep their products.
class GradientSums {
 public:
  GradientSums(std::size_t half_win_x, std::size_t half_win_y, std::size_t max_width);

  // How many of the last rows of an image must be at hand.
  std::size_t kept_rows() const { return window_y_ + 5; }

  // Starts on an image. NextRow gives `rows` rows from first_row on, at least one; their windows,
  // and one pixel about them, must lie inside the image.
  void Start(ImageRows image, std::size_t columns, std::size_t first_row, std::size_t rows);

  // Sums of the next row, valid until the next call. Of the columns whose windows, with one pixel
  // about them, do not lie inside the image, and behind the last one, the sums mean nothing.
  gradient_sum_row NextRow();
  void NextScores(float ratio, float* scores);

 private:
  // Rows of windows that are made together, and rows in a group.
  static constexpr std::size_t kGroup = 4;

  void FindRows(std::size_t first, std::size_t count, const float** rows) const;
  float* GroupSums(std::size_t slot) { return groups_.data() + slot * 3 * group_stride_; }
  void SumFirstGroups();
  void SumNextColumns();

  std::size_t window_x_, window_y_;
  std::size_t group_;  // rows in a group: kGroup, or 1 for low windows
  std::size_t whole_;  // groups that lie wholly inside the windows of a group of rows
  std::size_t group_stride_, column_stride_, sum_stride_;  // between planes
  ImageRows image_;
  std::size_t positions_ = 0;
  std::size_t window_top_ = 0;  // first row of the windows that come next
  std::size_t last_row_ = 0;    // that windows depend on
  std::size_t next_ = 0;        // row of the sums
  // By group of a block, three planes each: the sum from it to the end of its block, or, of those
  // that the windows have left, of the group one block on.
  memory::LineAlignedVector<float> groups_;
  memory::LineAlignedVector<float> block_start_;  // sum of the groups of the next block so far
  memory::LineAlignedVector<float> column_sums_;  // by row of a group, over the rows of a window
  memory::LineAlignedVector<float> ends_;         // along x: sums from a position to the end of its block
  memory::LineAlignedVector<float> sums_;
};

}  // namespace marrow::tracking
