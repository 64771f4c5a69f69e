#pragma once

#include <cstddef>
#include <string>

#include "platform/hx/hx_pixel.h"

namespace calmframe::report {

// 8-bit pixels, top row first, straight alpha; pixel_aspect: width : height of one.
struct PictureView {
  const HX_Pixel8* pixels = nullptr;
  std::ptrdiff_t row_bytes = 0;
  int width = 0, height = 0;
  double pixel_aspect = 1;
};

// A JPEG of `width` square pixels across, each the mean of what it covers, over black, as a data
// URL. Throws std::bad_alloc, and std::runtime_error where FFmpeg has no such encoder.
std::string DataUrlOf(const PictureView& picture, int width);

}  // namespace calmframe::report
