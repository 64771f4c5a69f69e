#pragma once

#include <array>
#include <cstddef>
#include <cstdint>

#include "platform/hx/hx_pixel.h"

namespace calmframe::host {

class Picture;

// An 8-bit frame as it lies in memory, borrowed. row_bytes: from a row to the one under it,
// negative in a bottom-up frame. Width and height are 1 at least.
struct ArgbView {
  const HX_Pixel8* top_row;
  std::ptrdiff_t row_bytes;
  int width, height;
};
struct LumaView {
  const std::uint8_t* top_row;
  std::ptrdiff_t row_bytes;
  int width, height;
  bool limited_range = false;  // black is 16 and white 235, else 0 and 255
};

// Of a picture of kind argb8, for as long as it lives.
ArgbView ViewOf(const Picture& picture);

// What the search for shots keeps of a frame: its luma in cells and its colours, some 4 KB. Alpha
// counts for nothing. The same pixels give the same digest.
struct FrameDigest {
  // As many cells in any frame: they are as wide as its 64th part, whatever its shape.
  static constexpr int kColumns = 64, kRows = 36;
  static constexpr int kHalfColumns = kColumns / 2, kHalfRows = kRows / 2;
  // A part of the frame in cells, right and bottom left out.
  struct Area {
    int left = 0, top = 0, right = 0, bottom = 0;
    bool IsEmpty() const { return right <= left || bottom <= top; }
    int size() const { return IsEmpty() ? 0 : (right - left) * (bottom - top); }
    bool operator==(const Area&) const = default;
  };

  // Rec. 601 luma, 0 black to 255 white, row after row; a little smoothed, so that a motion by half
  // a cell changes little. In `half` each cell is the mean of four.
  std::array<std::uint8_t, kColumns * kRows> cells;
  std::array<std::uint8_t, kHalfColumns * kHalfRows> half;
  // Rec. 601 chroma as `half`, of few of the pixels: what is blue and what is red beyond grey, -128
  // to 127. Nought of luma alone.
  std::array<std::int8_t, kHalfColumns * kHalfRows> blue, red;
  // Without black bars along its edges. Empty: all of the frame is black.
  Area area;
};

// Reads a fixed number of the pixels, evenly spread, of a frame of any size: some 0.1 ms.
FrameDigest DigestOf(const ArgbView& frame);
FrameDigest DigestOf(const LumaView& frame);

}  // namespace calmframe::host
