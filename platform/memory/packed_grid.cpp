#include "platform/memory/packed_grid.h"

#include "platform/memory/packed_words.h"

namespace memory {
namespace {

// Calls visit(i, expected) for one of each pair's words, row by row; `expected` reads what visit
// left in `words`.
template <class Visit>
void ForEachExpected(std::span<const std::int32_t> words, std::size_t of_pair, std::size_t columns,
                     Visit visit) {
  const auto at = [&](std::size_t i) { return static_cast<std::uint32_t>(words[i]); };
  const std::size_t row = 2 * columns;
  for (std::size_t first = 0; first < words.size(); first += row) {
    for (std::size_t i = first + of_pair; i < first + row; i += 2) {
      const bool has_left = i >= first + 2, has_above = first > 0;
      std::uint32_t expected = 0;
      if (has_left) expected += at(i - 2);
      if (has_above) expected += at(i - row);
      if (has_left && has_above) expected -= at(i - row - 2);
      visit(i, expected);
    }
  }
}

}  // namespace

void PackGrid(std::span<const std::int32_t> words, std::size_t columns,
              std::vector<std::uint8_t>& bytes) {
  std::vector<std::int32_t> residuals;
  residuals.reserve(words.size());
  for (const std::size_t of_pair : {0, 1}) {
    ForEachExpected(words, of_pair, columns, [&](std::size_t i, std::uint32_t expected) {
      residuals.push_back(
          static_cast<std::int32_t>(static_cast<std::uint32_t>(words[i]) - expected));
    });
  }
  PackWords(residuals, bytes);
}

bool UnpackGrid(std::span<const std::uint8_t> bytes, std::size_t columns,
                std::span<std::int32_t> words) {
  std::vector<std::int32_t> residuals(words.size());
  std::size_t place = 0, next = 0;
  if (!UnpackWords(bytes, place, residuals) || place != bytes.size()) return false;
  for (const std::size_t of_pair : {0, 1}) {
    ForEachExpected(words, of_pair, columns, [&](std::size_t i, std::uint32_t expected) {
      words[i] =
          static_cast<std::int32_t>(static_cast<std::uint32_t>(residuals[next++]) + expected);
    });
  }
  return true;
}

}  // namespace memory
