#include "host/effects/layer_time.h"

#include <algorithm>
#include <cmath>
#include <limits>
#include <numeric>

#include "platform/hx/hx_types.h"

namespace calmframe::host {
namespace {

constexpr std::int64_t kLimit = std::numeric_limits<std::int32_t>::max();

// a * b / c, to the nearest (halves up), in more than 64 bits.
std::int64_t MulDiv(std::int64_t a, std::int64_t b, std::int64_t c) {
  const auto twice = static_cast<__int128>(a) * b * 2 + c;
  const auto divisor = static_cast<__int128>(c) * 2;
  __int128 result = twice / divisor;
  if (twice % divisor < 0) --result;
  return static_cast<std::int64_t>(result);
}

}  // namespace

LayerTime::LayerTime(const LayerState& layer)
    : ticks_per_frame_(std::max<std::int64_t>(layer.ticks_per_frame, 1)),
      start_frame_(layer.start_frame),
      length_(std::max(layer.length, 0)) {
  const std::int64_t common = std::gcd(ticks_per_frame_, HX_TICKS_PER_SECOND);
  const int fields = layer.field_type == HX_FIELD_PROGRESSIVE ? 1 : 2;
  std::int64_t scale = fields * (HX_TICKS_PER_SECOND / common);
  std::int64_t step = fields * (ticks_per_frame_ / common);
  // A frame more than the layer, and as many again for what is asked around it.
  const std::int64_t frames = 2 * (std::int64_t{length_} + 1);
  if (step > kLimit / frames) {
    scale =
        std::max<std::int64_t>(1, MulDiv(kLimit / frames, HX_TICKS_PER_SECOND, ticks_per_frame_));
    step = std::max<std::int64_t>(1, MulDiv(ticks_per_frame_, scale, HX_TICKS_PER_SECOND));
  }
  scale_ = static_cast<std::uint32_t>(std::min(scale, kLimit));
  step_ = static_cast<std::int32_t>(std::min(step, kLimit));
}

std::int32_t LayerTime::OfFrame(std::int64_t frame, bool second_field) const {
  const auto twice = (static_cast<__int128>(frame) * 2 + second_field) * ticks_per_frame_ * scale_;
  __int128 time = twice / (2 * HX_TICKS_PER_SECOND);
  if (twice % (2 * HX_TICKS_PER_SECOND) > 0) ++time;
  return static_cast<std::int32_t>(std::clamp<__int128>(time, -kLimit, kLimit));
}

std::int64_t LayerTime::MediaTicks(std::int64_t time, std::uint32_t scale) const {
  return ticks_per_frame_ * start_frame_ +
         MulDiv(time, HX_TICKS_PER_SECOND, std::max<std::uint32_t>(scale, 1));
}

}  // namespace calmframe::host
