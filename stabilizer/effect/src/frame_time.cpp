#include "stabilizer/effect/src/frame_time.h"

#include <algorithm>
#include <boost/rational.hpp>
#include <limits>
#include <numeric>

namespace kelp::effect {
namespace {

constexpr std::int64_t kMost = std::numeric_limits<std::int32_t>::max();

void Fit(std::int64_t& numerator, std::int64_t& denominator) {
  while (numerator > kMost || numerator < -kMost || denominator > kMost) {
    numerator = numerator / 2 + (numerator % 2 > 0 ? 1 : 0);
    denominator /= 2;
    if (denominator == 0) throw boost::bad_rational();
    const std::int64_t divisor = std::gcd(numerator, denominator);
    numerator /= divisor;
    denominator /= divisor;
  }
  if (denominator <= 0) throw boost::bad_rational();
}

}  // namespace

HostTime FrameTime(std::int64_t frame, const analysis::RationalTime& duration) {
  std::int64_t step = duration.numerator, step_scale = duration.denominator;
  Fit(step, step_scale);
  std::int64_t time = std::clamp(frame, -kMost, kMost) * step, scale = step_scale;
  Fit(time, scale);
  step = std::max<std::int64_t>(step * scale / step_scale, 1);
  return {static_cast<std::int32_t>(time), static_cast<std::int32_t>(std::min(step, kMost)),
          static_cast<std::uint32_t>(scale)};
}

}  // namespace kelp::effect
