#include "host/shots/frame_digest.h"

#include <algorithm>
#include <cassert>

#include "host/timeline/picture.h"

namespace calmframe::host {
namespace {

constexpr int kWide = FrameDigest::kColumns, kHigh = FrameDigest::kRows;
// Pixels that are read of a cell. Of 32 the noise of a camera, some 5 of 255, leaves 1; a power of
// two in all, so that a sum of lumas is a mean by a shift.
constexpr int kAcross = 8, kDown = 4;
// The cells of a bar are black, as far as a coder keeps that, and lie no further from each other
// than this, in 255ths.
constexpr int kBlack = 24, kBarRange = 3;

using Cells = std::array<std::uint8_t, kWide * kHigh>;

// Where the samples of an axis lie: in the middles of `count` even parts.
template <std::size_t count>
std::array<int, count> Places(int size) {
  std::array<int, count> places;
  for (std::size_t i = 0; i < count; ++i) {
    places[i] = static_cast<int>((2 * i + 1) * static_cast<std::size_t>(size) / (2 * count));
  }
  return places;
}

// luma_of(row, x): 0 to 255, times `unit`; `row` from row_of(y).
template <class RowOf, class LumaOf>
Cells MeansOf(int width, int height, int unit, const RowOf& row_of, const LumaOf& luma_of) {
  const auto columns = Places<static_cast<std::size_t>(kWide * kAcross)>(width);
  const auto rows = Places<static_cast<std::size_t>(kHigh * kDown)>(height);
  const int whole = unit * kAcross * kDown;
  Cells cells;
  for (int y = 0; y < kHigh; ++y) {
    std::array<std::int32_t, kWide> sums{};
    for (int j = 0; j < kDown; ++j) {
      const auto* const row = row_of(rows[static_cast<std::size_t>(y * kDown + j)]);
      for (std::size_t x = 0; x < sums.size(); ++x) {
        std::int32_t sum = 0;
        for (std::size_t i = 0; i < kAcross; ++i) sum += luma_of(row, columns[x * kAcross + i]);
        sums[x] += sum;
      }
    }
    for (std::size_t x = 0; x < sums.size(); ++x) {
      const int mean = (sums[x] + whole / 2) / whole;
      cells[static_cast<std::size_t>(y * kWide) + x] =
          static_cast<std::uint8_t>(std::clamp(mean, 0, 255));
    }
  }
  return cells;
}

// The frame without the black lines along its four edges.
FrameDigest::Area WithoutBars(const Cells& cells) {
  const auto at = [&](int x, int y) {
    return static_cast<int>(cells[static_cast<std::size_t>(y * kWide + x)]);
  };
  FrameDigest::Area area{0, 0, kWide, kHigh};
  const auto row_is = [&](int y, int value) {
    for (int x = 0; x < kWide; ++x) {
      if (std::abs(at(x, y) - value) > kBarRange) return false;
    }
    return value <= kBlack;
  };
  const auto column_is = [&](int x, int value) {
    for (int y = area.top; y < area.bottom; ++y) {
      if (std::abs(at(x, y) - value) > kBarRange) return false;
    }
    return value <= kBlack;
  };
  while (area.top < kHigh && row_is(area.top, at(0, 0))) ++area.top;
  while (area.bottom > area.top && row_is(area.bottom - 1, at(0, kHigh - 1))) --area.bottom;
  if (area.IsEmpty()) return {};
  while (area.left < kWide && column_is(area.left, at(0, area.top))) ++area.left;
  while (area.right > area.left && column_is(area.right - 1, at(kWide - 1, area.top))) {
    --area.right;
  }
  // The cell that is half bar, and what the smoothing spreads.
  constexpr int kEdge = 2;
  if (area.top > 0) area.top += kEdge;
  if (area.bottom < kHigh) area.bottom -= kEdge;
  if (area.left > 0) area.left += kEdge;
  if (area.right < kWide) area.right -= kEdge;
  return area.IsEmpty() ? FrameDigest::Area{} : area;
}

// Weights 1, 2, 1 across and down; the edge's cells are repeated.
Cells Smoothed(const Cells& cells) {
  std::array<int, kWide * kHigh> across;
  for (int y = 0; y < kHigh; ++y) {
    const std::uint8_t* const row = cells.data() + y * kWide;
    int* const out = across.data() + y * kWide;
    for (int x = 0; x < kWide; ++x) {
      out[x] = row[std::max(x - 1, 0)] + 2 * row[x] + row[std::min(x + 1, kWide - 1)];
    }
  }
  Cells smooth;
  for (int y = 0; y < kHigh; ++y) {
    const int* const above = across.data() + std::max(y - 1, 0) * kWide;
    const int* const here = across.data() + y * kWide;
    const int* const below = across.data() + std::min(y + 1, kHigh - 1) * kWide;
    for (int x = 0; x < kWide; ++x) {
      smooth[static_cast<std::size_t>(y * kWide + x)] =
          static_cast<std::uint8_t>((above[x] + 2 * here[x] + below[x] + 8) >> 4);
    }
  }
  return smooth;
}

FrameDigest DigestOfCells(const Cells& cells) {
  FrameDigest digest;
  digest.blue.fill(0);
  digest.red.fill(0);
  digest.area = WithoutBars(cells);
  digest.cells = Smoothed(cells);
  for (int y = 0; y < FrameDigest::kHalfRows; ++y) {
    const std::uint8_t* const row = digest.cells.data() + 2 * y * kWide;
    std::uint8_t* const out = digest.half.data() + y * FrameDigest::kHalfColumns;
    for (int x = 0; x < FrameDigest::kHalfColumns; ++x) {
      const int sum = row[2 * x] + row[2 * x + 1] + row[kWide + 2 * x] + row[kWide + 2 * x + 1];
      out[x] = static_cast<std::uint8_t>((sum + 2) >> 2);
    }
  }
  return digest;
}

}  // namespace

ArgbView ViewOf(const Picture& picture) {
  assert(picture.kind() == PixelKind::argb8);
  return {picture.row<HX_Pixel8>(0),
          picture.top_down() ? picture.row_bytes() : -picture.row_bytes(), picture.width(),
          picture.height()};
}

FrameDigest DigestOf(const ArgbView& frame) {
  // 256ths of .299, .587 and .114.
  constexpr int kRed = 77, kGreen = 150, kBlue = 29;
  const auto* const top = reinterpret_cast<const std::uint8_t*>(frame.top_row);
  const auto row_of = [&](int y) {
    return reinterpret_cast<const HX_Pixel8*>(top + y * frame.row_bytes);
  };
  const auto luma_of = [](const HX_Pixel8* row, int x) {
    return kRed * row[x].red + kGreen * row[x].green + kBlue * row[x].blue;
  };
  FrameDigest digest =
      DigestOfCells(MeansOf(frame.width, frame.height, kRed + kGreen + kBlue, row_of, luma_of));
  // Four pixels, in the middles of the four cells: shots are told apart by the colour of whole
  // parts.
  const auto columns = Places<kWide>(frame.width);
  const auto rows = Places<kHigh>(frame.height);
  for (std::size_t k = 0; k < digest.blue.size(); ++k) {
    const std::size_t x = k % FrameDigest::kHalfColumns, y = k / FrameDigest::kHalfColumns;
    int red = 0, blue = 0, luma = 0;
    for (std::size_t i = 0; i < 4; ++i) {
      const HX_Pixel8* const row = row_of(rows[2 * y + i / 2]);
      const int column = columns[2 * x + i % 2];
      red += row[column].red;
      blue += row[column].blue;
      luma += luma_of(row, column);
    }
    // 256ths of .564 and .713; the luma has 256ths already.
    constexpr int kToBlue = 144, kToRed = 183;
    digest.blue[k] = static_cast<std::int8_t>((kToBlue * (256 * blue - luma)) / (4 << 16));
    digest.red[k] = static_cast<std::int8_t>((kToRed * (256 * red - luma)) / (4 << 16));
  }
  return digest;
}

FrameDigest DigestOf(const LumaView& frame) {
  // Limited range: 219 steps from black to white, so a step is 255 of 219.
  const int black = frame.limited_range ? 16 : 0;
  const int step = frame.limited_range ? 255 : 1;
  return DigestOfCells(MeansOf(
      frame.width, frame.height, frame.limited_range ? 219 : 1,
      [&](int y) { return frame.top_row + y * frame.row_bytes; },
      [=](const std::uint8_t* row, int x) { return step * (row[x] - black); }));
}

}  // namespace calmframe::host
