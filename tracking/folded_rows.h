#pragma once

#include <cstddef>
#include <cstdint>

namespace marrow::tracking {

// How a row of pixels is folded: cut into kSegments pieces of equal length that lie side by side.
// Position p holds pixel p of every segment, as kSegments values one after the other, so that
// neighbours along x are kSegments values apart. Whatever the width of a vector, loads are aligned
// with each other, nothing moves between lanes, and a sum that runs along x runs in all segments
// at once. The last segment may reach past the columns.
struct RowFolding {
  static constexpr std::size_t kSegments = 16;

  std::size_t columns = 0;

  std::size_t positions() const { return (columns + kSegments - 1) / kSegments; }
  // Where a column lies in a folded row, and the column that lies there.
  std::size_t IndexOf(std::size_t column) const {
    return column % positions() * kSegments + column / positions();
  }
  std::size_t ColumnAt(std::size_t index) const {
    return index % kSegments * positions() + index / kSegments;
  }
};

// Values from one folded row to the next that have room for this many positions: an odd number of
// positions, so that the same position of several rows does not fall on the same few cache sets.
inline std::size_t FoldedStride(std::size_t positions) {
  return (positions | 1) * RowFolding::kSegments;
}

// Positions that FoldRow may write beyond the row's own, and bytes that it may read.
inline constexpr std::size_t kFoldingSlack = 15;

// Folds a row of bytes into floats. `row` holds kSegments * positions of them.
void FoldRow(const std::uint8_t* row, std::size_t positions, float* folded);

// Writes `halo` positions before and behind a folded row, so that each segment goes on into its
// neighbours; `left` stands before the first segment and `right` behind the last. The halo may be
// longer than a segment.
void FillHalo(float* folded, std::size_t positions, std::size_t halo, float left, float right);

}  // namespace marrow::tracking
