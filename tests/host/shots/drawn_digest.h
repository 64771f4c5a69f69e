#pragma once

#include <algorithm>
#include <cmath>
#include <cstdint>
#include <functional>
#include <vector>

#include "host/shots/frame_digest.h"

namespace calmframe::host {

// Waves of many lengths and directions, of another picture for each seed: 0 to 255 with a deviation
// of some 40, over the plane in cells of a digest.
inline double Waves(int seed, double x, double y) {
  double value = 128;
  for (int k = 1; k <= 12; ++k) {
    const double angle = 2.4 * k * seed, length = 5 + 2.3 * ((k * 7 + seed * 3) % 11);
    value += 16 * std::sin(6.28318 / length * (x * std::cos(angle) + y * std::sin(angle)) + k);
  }
  return value;
}

// A frame of 320 x 180 whose pixels have that value at their place in cells.
inline FrameDigest DrawDigest(const std::function<double(double x, double y)>& value) {
  std::vector<std::uint8_t> luma(320 * 180);
  for (int i = 0; i < 320 * 180; ++i) {
    const double v = value((i % 320 + 0.5) / 5, (i / 320 + 0.5) / 5);
    luma[i] = static_cast<std::uint8_t>(std::lround(std::clamp(v, 0.0, 255.0)));
  }
  return DigestOf(LumaView{luma.data(), 320, 320, 180});
}

}  // namespace calmframe::host
