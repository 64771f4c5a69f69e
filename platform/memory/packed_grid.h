#pragma once

#include <cstddef>
#include <cstdint>
#include <span>
#include <vector>

namespace memory {

// Pairs of words over a grid, row by row, of which neighbours differ little: what is packed are the
// first words of all pairs, then the second ones, each less what a plane through its neighbours
// left, above and above left has there (0 outside of the grid), modulo 2^32, by PackWords.

// Appends to `bytes`. `words`: two a pair, `columns` pairs a row.
void PackGrid(std::span<const std::int32_t> words, std::size_t columns,
              std::vector<std::uint8_t>& bytes);

// Fills `words`. False where `bytes` are not just what PackGrid makes of so many; `words` then hold
// anything.
bool UnpackGrid(std::span<const std::uint8_t> bytes, std::size_t columns,
                std::span<std::int32_t> words);

}  // namespace memory
