#pragma once

#include <cstddef>
#include <cstdint>
#include <memory>
#include <string>
#include <vector>

#include "platform/hx/hx_pixel.h"

namespace calmframe::media {

// 8-bit pixels, top row first, straight alpha.
struct PictureView {
  const HX_Pixel8* pixels = nullptr;
  std::ptrdiff_t row_bytes = 0;
  int width = 0, height = 0;
};

// Makes JPEGs, quickly rather than small. For one thread.
class JpegEncoder {
 public:
  JpegEncoder();
  ~JpegEncoder();

  // The pictures below each other, each over black and scaled to `width` by `height`. quantizer: 1
  // (best) to 31. Throws std::bad_alloc, and std::runtime_error where FFmpeg has no such encoder.
  std::string Encode(const std::vector<PictureView>& pictures, int width, int height,
                     int quantizer);

 private:
  struct State;
  const std::unique_ptr<State> state_;
};

}  // namespace calmframe::media
