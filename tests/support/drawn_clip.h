#pragma once

#include <cstddef>
#include <cstring>
#include <string>
#include <vector>

#include "host/media/clip.h"
#include "synthetic/scene.h"

namespace calmframe {

// A clip of info.frame_count frames, each drawn by draw(frame, pixels) into rows without a gap; the
// writer's warnings.
template <class Pixel = HX_Pixel8, class Draw>
std::vector<std::string> WriteClip(const std::string& path, const media::ClipInfo& info,
                                   const Draw& draw, const media::EncodeSettings& settings = {}) {
  const auto writer = media::ClipWriter::Create(path, info, info.width, info.height, settings);
  std::vector<Pixel> pixels(static_cast<std::size_t>(info.width) * info.height);
  for (std::size_t f = 0; f < info.frame_count; ++f) {
    draw(static_cast<int>(f), pixels.data());
    writer->Write(f, pixels.data(), info.width * static_cast<std::ptrdiff_t>(sizeof(Pixel)));
  }
  writer->Finish();
  return writer->warnings();
}

// A frame of a clip, in rows without a gap.
template <class Pixel = HX_Pixel8>
std::vector<Pixel> ReadFrame(media::ClipReader& reader, std::size_t frame) {
  const int width = reader.info().width;
  std::vector<Pixel> pixels(static_cast<std::size_t>(width) * reader.info().height);
  reader.Read(frame, pixels.data(), width * static_cast<std::ptrdiff_t>(sizeof(Pixel)));
  return pixels;
}

template <class Pixel>
bool SamePixels(const std::vector<Pixel>& a, const std::vector<Pixel>& b) {
  return a.size() == b.size() && std::memcmp(a.data(), b.data(), a.size() * sizeof(Pixel)) == 0;
}

// A walk down the street of that seed.
inline void WriteStreet(const std::string& path, const media::ClipInfo& info, unsigned seed,
                        const media::EncodeSettings& settings = {}) {
  synthetic::scene_options options;
  options.width = info.width;
  options.height = info.height;
  options.frame_count = static_cast<int>(info.frame_count);
  const synthetic::scene scene(synthetic::street(seed), synthetic::handheld_path({}), options);
  const auto draw = [&](int frame, HX_Pixel8* pixels) {
    scene.render(frame, pixels, static_cast<std::size_t>(info.width));
  };
  WriteClip(path, info, draw, settings);
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
