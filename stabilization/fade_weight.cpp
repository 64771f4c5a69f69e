#include "stabilization/fade_weight.h"

namespace marrow::stabilization {

double fade_weight(const fade_span& span, std::int64_t position, std::int64_t duration) {
  const std::int64_t length = span.length;
  std::int64_t flank = duration;
  double peak = 1.0;
  double divisor = static_cast<double>(duration);
  if ((span.at_clip_start || span.at_clip_end) && duration > length) {
    divisor = static_cast<double>(length);
    peak = static_cast<double>(length) / static_cast<double>(duration);
  } else if (2 * duration >= length) {
    divisor = static_cast<double>(length) * 0.5;
    peak = static_cast<double>(length) / static_cast<double>(2 * duration);
    flank = length / 2;
  }
  if (position < flank && !span.at_clip_start) {
    return static_cast<double>(position + 1) * peak / divisor;
  }
  if (position < length - flank || span.at_clip_end) return peak;
  return static_cast<double>(length - position) * peak / divisor;
}

}  // namespace marrow::stabilization
