#pragma once

#include <cstdint>

namespace calmframe::host {

// Rows of pixels as floats: four a pixel, alpha, red, green, blue, 1 for full, straight. A depth's
// values go through unchanged, there and back.

// `format`: HX_FORMAT_*, one that BytesPerPixel knows.
void LoadRow(std::uint32_t format, const void* pixels, int count, float* row);
// Rounds to nearest; integer formats clamp, and take what is not a number for 0.
void StoreRow(std::uint32_t format, const float* row, int count, void* pixels);

}  // namespace calmframe::host
