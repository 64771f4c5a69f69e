#pragma once

#include <cstddef>
#include <cstdint>

// From a frame's 8-bit pixels to the working images of selector and tracker, all top-down and
// without padding.
namespace marrow::tracking {

// A frame of 4 bytes a pixel: alpha, red, green, blue.
struct ArgbFrame {
  const std::uint8_t* top_row;
  std::ptrdiff_t row_bytes;  // from a row to the one under it; negative in a bottom-up frame
  std::size_t width;
  std::size_t height;
};

// width * height bytes: (9798 R + 19235 G + 3735 B + 2^14) >> 15, which is Rec. 601 luma.
void LumaFromArgb(const ArgbFrame& frame, std::uint8_t* luma);

// width * height bytes: 1 where alpha is above 127, else 0.
void MaskFromArgb(const ArgbFrame& frame, std::uint8_t* mask);

// width * height * 3 floats: red, green, blue from 0 to 255, interleaved, whatever alpha is.
void ColorFromArgb(const ArgbFrame& frame, float* color);

// Colour, in bytes, and luma in one walk. True if the whole mask would be 1.
bool ColorAndLumaFromArgb(const ArgbFrame& frame, std::uint8_t* color, std::uint8_t* luma);

// A row of the colours' next pyramid level from the frame's row over it, which has `width` pixels,
// at least 3: what ReduceRow makes of ColorFromArgb's row, to the bit.
void ReducedColorFromArgb(const std::uint8_t* row, std::size_t width, float* destination);

void FloatsFromBytes(const std::uint8_t* bytes, std::size_t count, float* floats);

}  // namespace marrow::tracking
