#include "apps/calmframe/caption.h"

#include <algorithm>
#include <array>
#include <cstdint>

namespace calmframe {
namespace {

constexpr int kColumns = 6;  // of dots; five and a gap
constexpr int kRows = 7;

// Rows of dots, top first, the leftmost dot in bit 4.
struct Glyph {
  char letter;
  std::array<std::uint8_t, kRows> rows;
};
constexpr Glyph kGlyphs[] = {
    {'A', {0x0E, 0x11, 0x11, 0x1F, 0x11, 0x11, 0x11}},
    {'D', {0x1E, 0x11, 0x11, 0x11, 0x11, 0x11, 0x1E}},
    {'E', {0x1F, 0x10, 0x10, 0x1E, 0x10, 0x10, 0x1F}},
    {'H', {0x11, 0x11, 0x11, 0x1F, 0x11, 0x11, 0x11}},
    {'K', {0x11, 0x12, 0x14, 0x18, 0x14, 0x12, 0x11}},
    {'S', {0x0F, 0x10, 0x10, 0x0E, 0x01, 0x01, 0x1E}},
    {'T', {0x1F, 0x04, 0x04, 0x04, 0x04, 0x04, 0x04}},
    {'Y', {0x11, 0x11, 0x0A, 0x04, 0x04, 0x04, 0x04}},
};

bool Dot(std::string_view word, int column, int row) {
  if (column < 0 || row < 0 || row >= kRows || column % kColumns == kColumns - 1) return false;
  const auto place = static_cast<std::size_t>(column / kColumns);
  if (place >= word.size()) return false;
  for (const Glyph& glyph : kGlyphs) {
    if (glyph.letter != word[place]) continue;
    return (glyph.rows[static_cast<std::size_t>(row)] >> (4 - column % kColumns) & 1) != 0;
  }
  return false;
}

}  // namespace

std::unique_ptr<host::WorldBuffer> Caption(std::string_view word, int picture_height) {
  const int dot = std::max(1, picture_height / (20 * (kRows + 4)));
  const int columns = kColumns * static_cast<int>(word.size()) + 3;  // with a margin of two dots
  const int rows = kRows + 4;
  auto caption = std::make_unique<host::WorldBuffer>(columns * dot, rows * dot, HX_FORMAT_ARGB8);
  for (int y = 0; y < rows * dot; ++y) {
    HX_Pixel8* row = caption->row<HX_Pixel8>(y);
    for (int x = 0; x < columns * dot; ++x) {
      const std::uint8_t level = Dot(word, x / dot - 2, y / dot - 2) ? 255 : 0;
      row[x] = {255, level, level, level};
    }
  }
  return caption;
}

}  // namespace calmframe
