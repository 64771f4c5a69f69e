#pragma once

#include <algorithm>
#include <cmath>
#include <cstddef>

#include "platform/hx/hx_world.h"

// Pixels of any format, 0 to 1 a channel, straight alpha.
struct FakePixel {
  double a = 0, r = 0, g = 0, b = 0;
};

inline int FakePixelBytes(std::uint32_t format) {
  return format == HX_FORMAT_ARGBF ? 16 : format == HX_FORMAT_ARGB16 ? 8 : 4;
}

template <class T>
T* FakeChannels(const HX_World& world, int x, int y) {
  return reinterpret_cast<T*>(static_cast<char*>(world.data) + std::ptrdiff_t{world.row_bytes} * y +
                              std::ptrdiff_t{FakePixelBytes(world.format)} * x);
}

inline FakePixel LoadFakePixel(const HX_World& world, int x, int y) {
  if (world.format == HX_FORMAT_ARGBF) {
    const float* c = FakeChannels<float>(world, x, y);
    return {c[0], c[1], c[2], c[3]};
  }
  if (world.format == HX_FORMAT_ARGB16) {
    const std::uint16_t* c = FakeChannels<std::uint16_t>(world, x, y);
    return {c[0] / 32768.0, c[1] / 32768.0, c[2] / 32768.0, c[3] / 32768.0};
  }
  const std::uint8_t* c = FakeChannels<std::uint8_t>(world, x, y);
  const FakePixel p{c[0] / 255.0, c[1] / 255.0, c[2] / 255.0, c[3] / 255.0};
  return world.format == HX_FORMAT_BGRA8 ? FakePixel{p.b, p.g, p.r, p.a} : p;
}

inline void StoreFakePixel(const HX_World& world, int x, int y, const FakePixel& p) {
  if (world.format == HX_FORMAT_ARGBF) {
    const float to[4] = {float(p.a), float(p.r), float(p.g), float(p.b)};
    std::copy_n(to, 4, FakeChannels<float>(world, x, y));
  } else if (world.format == HX_FORMAT_ARGB16) {
    std::uint16_t* to = FakeChannels<std::uint16_t>(world, x, y);
    for (const double c : {p.a, p.r, p.g, p.b}) {
      *to++ = static_cast<std::uint16_t>(std::lround(c * 32768));
    }
  } else {
    std::uint8_t* to = FakeChannels<std::uint8_t>(world, x, y);
    const bool bgra = world.format == HX_FORMAT_BGRA8;
    for (const double c :
         {bgra ? p.b : p.a, bgra ? p.g : p.r, bgra ? p.r : p.g, bgra ? p.a : p.b}) {
      *to++ = static_cast<std::uint8_t>(std::lround(c * 255));
    }
  }
}
