#pragma once

#include <cstddef>
#include <cstdint>
#include <span>
#include <vector>

#include "tracking/tracking_feature.h"

namespace marrow::tracking {

// The cells of a table as saved work has them, positions in whole steps and no correlations, in
// some 2 KB a row in place of 8. Each row is packed by itself and expanded for who asks.
class PackedCells {
 public:
  using Cell = tracking_feature<float>;
  static constexpr float kStep = 0.03125f;  // pixels

  explicit PackedCells(std::size_t slots) : slots_(slots) {}

  std::size_t slots() const { return slots_; }
  std::size_t rows() const { return rows_.size(); }

  // A row is appended by its positions, x of all slots in steps, then y, and gets its statuses
  // before it is read; new ones take the place of those that it has.
  void AppendPositions(std::span<const std::int32_t> steps);
  void SetStatuses(std::size_t row, std::span<const std::int32_t> statuses);
  // Appends what packed() or Pack gave, whatever it is; false, and nothing is appended, where that
  // is no row of as many slots.
  bool AppendPacked(std::vector<std::uint8_t> bytes);
  std::span<const std::uint8_t> packed(std::size_t row) const { return rows_[row]; }
  static std::vector<std::uint8_t> Pack(std::size_t row, std::span<const std::int32_t> steps,
                                        std::span<const std::int32_t> statuses);

  // Fills slots() cells, with correlations of 0.
  void Read(std::size_t row, Cell* cells) const;

 private:
  // By memory::PackWords: the positions; then the statuses, of which that of a seed of this row is
  // 1, and 1 what that would be.
  using Row = std::vector<std::uint8_t>;
  bool Unpack(std::span<const std::uint8_t> bytes, std::vector<std::int32_t>& words) const;

  std::size_t slots_;
  std::vector<Row> rows_;
};

}  // namespace marrow::tracking
