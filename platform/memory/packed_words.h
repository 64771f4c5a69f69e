#pragma once

#include <cstddef>
#include <cstdint>
#include <span>
#include <vector>

namespace memory {

// Words that are mostly near 0, above or below, in few bytes: groups of 16, each a byte that tells
// how many bits its widest word takes and then all 16 in so many. A word counts as signed, 0, -1,
// 1, -2 ... being the narrowest. Any words come back as they were.

// Bytes that so many words take at least: whoever has fewer need take no memory for the words.
constexpr std::size_t LeastPacked(std::size_t words) {
  return (words + 15) / 16;
}

// Appends to `bytes`.
void PackWords(std::span<const std::int32_t> words, std::vector<std::uint8_t>& bytes);

// Fills `words` from what lies at bytes[place] on, and moves `place` behind it. False where the
// bytes end early or are none that PackWords makes; `words` then hold anything.
bool UnpackWords(std::span<const std::uint8_t> bytes, std::size_t& place,
                 std::span<std::int32_t> words);

}  // namespace memory
