#pragma once

#include <algorithm>
#include <cstddef>
#include <functional>
#include <vector>

#include "platform/memory/line_aligned.h"
#include "tracking/folded_rows.h"

namespace marrow::tracking {

// Row y of an image, folded, with a halo of one position. Readers that go down an image ask for a
// row again while it is at most a given number of rows above the lowest one they have seen.
using ImageRows = std::function<const float*(std::size_t y)>;

// What GradientSums makes a group of rows of windows from, along y alone. Sums are three planes, a
// stride apart.
struct column_window {
  std::size_t count;             // of values in a row, a multiple of RowFolding::kSegments
  const float* const* leaving;   // image rows from the one above the first window
  const float* const* entering;  // from the one above those below the first window's whole groups
  const float* ends;         // from its first whole group to the block's end; null: there is none
  const float* block_start;  // of its whole groups in the next block; null: there is none
  float* group;              // where the first group of the entering rows goes,
  float* next_block_start;   // and the next block as far as that group; both as `ends`
  std::size_t group_stride;
  float* sums;  // row after row
  std::size_t sum_stride;
};

// Scores of the gradient matrix of each pixel's window, row by row from the top. A matrix has the
// sums over (2 half_win_x + 1) by (2 half_win_y + 1) pixels of Ix Ix, Iy Iy and Ix Iy, where
// Ix = I(x + 1, y) - I(x - 1, y) and Iy likewise, not halved.
//
// Sums of 32-bit floats to which is only added: strong texture leaves no trace once the window has
// passed it, the sums of squares are never negative, and the cost hardly depends on the window.
// Along x a window is the end of one block and the beginning of the next, blocks as long as the
// window (van Herk 1992; Gil and Werman 1993). Along y that is done with sums of a few rows each,
// the groups, and only those are kept; what a window has of a group in part is formed anew from the
// image, which is cheaper than the memory for the products of all rows.
class GradientSums {
 public:
  GradientSums(std::size_t half_win_x, std::size_t half_win_y, std::size_t max_width);

  // How many of the last rows of an image must be at hand.
  std::size_t kept_rows() const { return window_y_ + std::max<std::size_t>(group_, 2) + 1; }

  // Starts on an image. `rows` rows can be asked for, from first_row on, at least one; their
  // windows, and one pixel about them, must lie inside the image.
  void Start(ImageRows image, std::size_t columns, std::size_t first_row, std::size_t rows);

  // The next row's scores (CornerScore), as many values as there are in a folded row. Where a
  // window, with one pixel about it, does not lie inside the image, and behind the last column,
  // they mean nothing.
  void NextScores(float eig_ratio_threshold, float* scores);

 private:
  void FindRows(std::size_t first, std::size_t count, const float** rows) const;
  float* GroupSums(std::size_t slot) { return groups_.data() + slot * 3 * group_stride_; }
  void SumFirstGroups();
  void SumNextColumns();
  const float* NextColumnSums();

  std::size_t window_x_, window_y_;
  std::size_t group_;  // rows in a group; so many rows of windows are made together
  std::size_t rest_;   // rows of a window over whole groups
  std::size_t whole_;  // groups that lie wholly inside all windows of a group of rows
  std::size_t group_stride_, column_stride_;  // between planes
  ImageRows image_;
  std::size_t positions_ = 0;
  std::size_t window_top_ = 0;  // first row of the windows that come next
  std::size_t last_row_ = 0;    // that windows depend on
  std::size_t next_ = 0;        // counts the rows that were given out
  // Blocks are as long as `whole_`. By group of a block: the sum from it to the end of its block,
  // or, once windows have left it, the group one block on.
  memory::LineAlignedVector<float> groups_;
  memory::LineAlignedVector<float> block_start_;  // sum of the groups of the next block so far
  memory::LineAlignedVector<float> column_sums_;  // along y alone, by row of a group
  memory::LineAlignedVector<float> ends_;         // along x: from a position to its block's end
};

}  // namespace marrow::tracking
