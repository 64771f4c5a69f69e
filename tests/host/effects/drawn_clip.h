#pragma once

#include <boost/make_shared.hpp>
#include <cstdint>
#include <string>

#include "host/timeline/layer.h"
#include "host/timeline/source.h"

namespace calmframe::host {

inline constexpr int kClipWidth = 33, kClipHeight = 20, kClipFrames = 10;

// Opaque; red tells the frame, green the column, blue the row, a 255th for each.
inline HX_PixelFloat ClipColour(std::int64_t frame, int x, int y) {
  return {1.0f, static_cast<float>(frame * 20) / 255.0f, static_cast<float>(x) / 255.0f,
          static_cast<float>(y) / 255.0f};
}

inline SourcePtr MakeDrawnClip() {
  SourceInfo info;
  info.width = kClipWidth;
  info.height = kClipHeight;
  info.frame_count = kClipFrames;
  info.content = tessel::utility::Guid::FromText("drawn clip");
  return MakeDrawnSource(info, [](std::int64_t frame, Picture& picture) {
    FillPicture(picture, [frame](int x, int y) { return ClipColour(frame, x, y); });
  });
}

inline boost::shared_ptr<Layer> MakeDrawnLayer() {
  return boost::make_shared<Layer>(MakeDrawnClip());
}

}  // namespace calmframe::host
