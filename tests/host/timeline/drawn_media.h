#pragma once

#include <cstdint>

#include "host/timeline/source.h"

namespace calmframe::host {

// Drawn media: pixel (x, y) of frame f is 8 bits of red x + 10 y, green f, blue 7, opaque.
inline SourceInfo DrawnInfo(int width, int height, std::int64_t frames) {
  SourceInfo info;
  info.width = width;
  info.height = height;
  info.frame_count = frames;
  info.pixel_aspect = {16, 15};
  info.content = tessel::utility::Guid::FromText("drawn frames");
  return info;
}
inline void DrawFrame(std::int64_t frame, Picture& picture) {
  FillPicture(picture, [&](int x, int y) {
    return HX_PixelFloat{1, static_cast<float>(x + 10 * y) / 255, static_cast<float>(frame) / 255,
                         7.0f / 255};
  });
}

}  // namespace calmframe::host
