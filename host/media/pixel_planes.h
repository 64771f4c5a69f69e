#pragma once

#include <cstddef>
#include <cstdint>

namespace calmframe::media {

// Pixels of 8 bits, alpha first, and planes of their channels: alpha, red, green, blue. No memory
// past `count` is touched, any alignment. The instruction set never shows.

// Without an alpha plane (null) pixels are opaque.
void PackPixels(const std::uint8_t* const (&planes)[4], std::size_t count, std::uint8_t* pixels);

// Without an alpha plane pixels stand over black: colours times alpha / 255, rounded to nearest.
void UnpackPixels(const std::uint8_t* pixels, std::size_t count, std::uint8_t* const (&planes)[4]);

}  // namespace calmframe::media
