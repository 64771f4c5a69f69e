#pragma once

#include <cstddef>
#include <string>
#include <vector>

#include "host/media/clip.h"
#include "synthetic/scene.h"

namespace calmframe {

// A clip of info.frame_count frames, each drawn by draw(frame, pixels) into rows without a gap.
template <class Draw>
void WriteClip(const std::string& path, const media::ClipInfo& info, const Draw& draw,
               const media::EncodeSettings& settings = {}) {
  const auto writer = media::ClipWriter::Create(path, info, info.width, info.height, settings);
  std::vector<HX_Pixel8> pixels(static_cast<std::size_t>(info.width) * info.height);
  for (std::size_t f = 0; f < info.frame_count; ++f) {
    draw(static_cast<int>(f), pixels.data());
    writer->Write(f, pixels.data(), info.width * static_cast<std::ptrdiff_t>(sizeof(HX_Pixel8)));
  }
  writer->Finish();
}

// A walk down the street of that seed.
inline void WriteStreet(const std::string& path, const media::ClipInfo& info, unsigned seed) {
  synthetic::scene_options options;
  options.width = info.width;
  options.height = info.height;
  options.frame_count = static_cast<int>(info.frame_count);
  const synthetic::scene scene(synthetic::street(seed), synthetic::handheld_path({}), options);
  WriteClip(path, info, [&](int frame, HX_Pixel8* pixels) {
    scene.render(frame, pixels, static_cast<std::size_t>(info.width));
  });
}

inline media::ClipInfo Made(int width, int height, std::size_t frames, int rate,
                            media::Ratio pixel_aspect = {}) {
  media::ClipInfo info;
  info.width = width;
  info.height = height;
  info.frame_count = frames;
  info.frame_rate = {rate, 1};
  info.pixel_aspect = pixel_aspect;
  return info;
}

}  // namespace calmframe
