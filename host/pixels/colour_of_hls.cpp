#include <algorithm>
#include <cmath>
#include <cstdint>

#include "host/pixels/world_operations.h"

namespace calmframe::host {

HX_Pixel8 ColourOfHls(const int32_t hls[3]) {
  const double hue = hls[0] / 65536.0;
  const double value = std::clamp(hls[1] / 65536.0, 0.0, 1.0);
  const double saturation = std::clamp(hls[2] / 65536.0, 0.0, 1.0);
  // The hexcone (Smith, 1978): a component is full for a third of the circle, absent for a third,
  // with ramps of a sixth between.
  const auto component = [&](double sixth) {
    const double at = std::fmod(std::fmod(hue, 1.0) * 6.0 + sixth + 6.0, 6.0);
    const double missing = std::clamp(std::min(at, 4.0 - at), 0.0, 1.0);
    return static_cast<std::uint8_t>(std::lround(255.0 * value * (1.0 - saturation * missing)));
  };
  return {255, component(5.0), component(3.0), component(1.0)};
}

}  // namespace calmframe::host
