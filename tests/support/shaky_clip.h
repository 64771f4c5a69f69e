#pragma once

#include <cmath>
#include <cstdint>
#include <functional>
#include <string>

#include "host/timeline/source.h"

namespace calmframe::host {

struct ShakyClip {
  int width = 320, height = 240;
  std::int64_t frames = 24;
  std::string name = "shaky clip";
  double tremor = 1;                                     // times that of the camera below
  HX_Ratio aspect = {1, 1};                              // of a pixel
  std::function<void(std::int64_t frame)> on_draw = {};  // on the thread that draws, first
};

// Value noise of a few scales over the plane, 0 to 1.
inline double Noise(double x, double y) {
  const auto lattice = [](std::int64_t i, std::int64_t j, std::uint32_t octave) {
    std::uint32_t h = static_cast<std::uint32_t>(i) * 0x9e3779b1u ^
                      static_cast<std::uint32_t>(j) * 0x85ebca77u ^ octave * 0xc2b2ae3du;
    h = (h ^ h >> 15) * 0x2c1b3c6du;
    h = (h ^ h >> 12) * 0x297a2d39u;
    return (h ^ h >> 15) / 4294967295.0;
  };
  double sum = 0;
  for (const std::uint32_t octave : {5u, 9u, 23u}) {
    const double u = x / octave, v = y / octave;
    const auto i = static_cast<std::int64_t>(std::floor(u)),
               j = static_cast<std::int64_t>(std::floor(v));
    const double a = u - static_cast<double>(i), b = v - static_cast<double>(j);
    sum += ((lattice(i, j, octave) * (1 - a) + lattice(i + 1, j, octave) * a) * (1 - b) +
            (lattice(i, j + 1, octave) * (1 - a) + lattice(i + 1, j + 1, octave) * a) * b) /
           3;
  }
  return sum;
}

// The camera pans and trembles.
inline SourcePtr MakeShakyClip(const ShakyClip& clip = {}) {
  SourceInfo info;
  info.width = clip.width;
  info.height = clip.height;
  info.pixel_aspect = clip.aspect;
  info.frame_count = clip.frames;
  info.content = tessel::utility::Guid::FromText(clip.name);
  return MakeDrawnSource(info, [clip](std::int64_t frame, Picture& picture) {
    if (clip.on_draw) clip.on_draw(frame);
    const auto t = static_cast<double>(frame);
    const double dx = clip.tremor * (1.5 * t + 5.0 * std::sin(2.1 * t)),
                 dy = clip.tremor * (4.0 * std::sin(1.7 * t + 1.0));
    FillPicture(picture, [=](int x, int y) {
      const auto value = static_cast<float>(Noise(x + dx, y + dy));
      return HX_PixelFloat{1.0f, value, value * 0.8f, 1.0f - value};
    });
  });
}

}  // namespace calmframe::host
