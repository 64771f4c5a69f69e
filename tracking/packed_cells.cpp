#include "tracking/packed_cells.h"

#include <utility>

#include "platform/memory/packed_words.h"

namespace marrow::tracking {
namespace {

// Seeds tell the frame's index plus 1, which few bits don't hold. Its own inverse.
std::int32_t Exchanged(std::int32_t status, std::size_t row) {
  const auto seed = static_cast<std::int32_t>(row + 1);
  if (status == seed) return 1;
  return status == 1 ? seed : status;
}

void AppendStatuses(std::size_t row, std::span<const std::int32_t> statuses,
                    std::vector<std::uint8_t>& bytes) {
  std::vector<std::int32_t> words(statuses.begin(), statuses.end());
  for (std::int32_t& word : words) word = Exchanged(word, row);
  memory::PackWords(words, bytes);
  bytes.shrink_to_fit();
}

}  // namespace

void PackedCells::AppendPositions(std::span<const std::int32_t> steps) {
  memory::PackWords(steps, rows_.emplace_back());
}

void PackedCells::SetStatuses(std::size_t row, std::span<const std::int32_t> statuses) {
  std::vector<std::int32_t> positions(2 * slots_);
  std::size_t behind_positions = 0;
  memory::UnpackWords(rows_[row], behind_positions, positions);
  rows_[row].resize(behind_positions);
  AppendStatuses(row, statuses, rows_[row]);
}

std::vector<std::uint8_t> PackedCells::Pack(std::size_t row, std::span<const std::int32_t> steps,
                                            std::span<const std::int32_t> statuses) {
  std::vector<std::uint8_t> bytes;
  memory::PackWords(steps, bytes);
  AppendStatuses(row, statuses, bytes);
  return bytes;
}

bool PackedCells::AppendPacked(std::vector<std::uint8_t> bytes) {
  std::vector<std::int32_t> words;
  if (!Unpack(bytes, words)) return false;
  rows_.push_back(std::move(bytes));
  return true;
}

bool PackedCells::Unpack(std::span<const std::uint8_t> bytes,
                         std::vector<std::int32_t>& words) const {
  // No memory is taken on a count's word alone.
  if (bytes.size() < memory::LeastPacked(3 * slots_)) return false;
  words.resize(3 * slots_);
  const std::span<std::int32_t> all(words);
  std::size_t place = 0;
  return memory::UnpackWords(bytes, place, all.first(2 * slots_)) &&
         memory::UnpackWords(bytes, place, all.last(slots_)) && place == bytes.size();
}

void PackedCells::Read(std::size_t row, Cell* cells) const {
  std::vector<std::int32_t> words;
  Unpack(rows_[row], words);
  for (std::size_t s = 0; s < slots_; ++s) {
    cells[s] = {static_cast<float>(words[s]) * kStep, static_cast<float>(words[slots_ + s]) * kStep,
                Exchanged(words[2 * slots_ + s], row), 0.0f};
  }
}

}  // namespace marrow::tracking
