#include "platform/memory/packed_words.h"

#include <algorithm>
#include <bit>
#include <cstring>

namespace memory {
namespace {

constexpr std::size_t kGroup = 16;
constexpr std::size_t kMostBits = 32;

std::uint32_t Folded(std::int32_t word) {
  return static_cast<std::uint32_t>(word) << 1 ^ static_cast<std::uint32_t>(word >> 31);
}

std::int32_t Unfolded(std::uint32_t folded) {
  return static_cast<std::int32_t>(folded >> 1 ^ (0u - (folded & 1)));
}

std::size_t BytesOf(std::size_t count, std::size_t bits) {
  return (count * bits + 7) / 8;
}

}  // namespace

void PackWords(std::span<const std::int32_t> words, std::vector<std::uint8_t>& bytes) {
  for (std::size_t first = 0; first < words.size(); first += kGroup) {
    const auto group = words.subspan(first, std::min(kGroup, words.size() - first));
    std::uint32_t any = 0;
    for (const std::int32_t word : group) any |= Folded(word);
    const auto bits = static_cast<std::size_t>(std::bit_width(any));
    bytes.push_back(static_cast<std::uint8_t>(bits));
    std::uint64_t waiting = 0;
    std::size_t filled = 0;
    for (const std::int32_t word : group) {
      waiting |= std::uint64_t{Folded(word)} << filled;
      for (filled += bits; filled >= 8; filled -= 8, waiting >>= 8) {
        bytes.push_back(static_cast<std::uint8_t>(waiting));
      }
    }
    if (filled > 0) bytes.push_back(static_cast<std::uint8_t>(waiting));
  }
}

bool UnpackWords(std::span<const std::uint8_t> bytes, std::size_t& place,
                 std::span<std::int32_t> words) {
  // Behind a group's bytes there is room for a load of eight.
  std::uint8_t group[kGroup * kMostBits / 8 + 8] = {};
  for (std::size_t first = 0; first < words.size(); first += kGroup) {
    const std::size_t count = std::min(kGroup, words.size() - first);
    if (place >= bytes.size()) return false;
    const std::size_t bits = bytes[place++];
    const std::size_t size = BytesOf(count, bits);
    if (bits > kMostBits || size > bytes.size() - place) return false;
    std::memcpy(group, bytes.data() + place, size);
    place += size;
    const std::uint64_t mask = (std::uint64_t{1} << bits) - 1;
    for (std::size_t i = 0; i < count; ++i) {
      std::uint64_t loaded;
      std::memcpy(&loaded, group + i * bits / 8, sizeof loaded);
      words[first + i] = Unfolded(static_cast<std::uint32_t>(loaded >> i * bits % 8 & mask));
    }
  }
  return true;
}

}  // namespace memory
