#pragma once

#include <cstdint>

#include "analysis/src/rational_time.h"

namespace kelp::effect {

// A time of the layer as the host takes it: `time` in 1/scale seconds, from one frame to the next
// `step`.
struct HostTime {
  std::int32_t time;
  std::int32_t step;
  std::uint32_t scale;
};

// Where frame `frame` of a run of frames of that duration lies. What does not fit in 31 bits loses
// precision. Throws boost::bad_rational where nothing is left of it.
HostTime FrameTime(std::int64_t frame, const analysis::RationalTime& duration);

// From absolute indices of the analysis to times of the layer.
struct FrameClock {
  std::int64_t layer_start = 0;     // index of the layer's first frame; may be negative
  analysis::RationalTime duration;  // of one frame of the analysis

  HostTime At(std::int64_t frame) const { return FrameTime(frame - layer_start, duration); }
};

}  // namespace kelp::effect
