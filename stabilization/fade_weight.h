#pragma once

#include <cstdint>

namespace marrow::stabilization {

// A stretch of consecutive frames along which a track counts. A side that touches the clip's own
// start or end is open: there the track was cut by the clip and does not fade.
struct fade_span {
  std::int64_t length = 0;  // frames
  bool at_clip_start = false;
  bool at_clip_end = false;
};

// The weight, 0 to 1, of a track on frame `position` of its span, 0 <= position < length: a
// trapezoid whose flanks have `duration` frames, so that a new or a dying track never pulls all at
// once. The first and the last sample of a flank weigh 1 / duration, not 0. A span too short for
// its flanks has a lower peak in proportion to its length: length / duration where a side is open
// and duration > length, else length / (2 duration) where 2 duration >= length.
double fade_weight(const fade_span& span, std::int64_t position, std::int64_t duration);

// The same on frame `frame` of a track that lives over [first, last) of a clip of frame_count
// frames; 0 throughout for tracks shorter than `minimum`.
inline double fade_weight(std::int64_t first, std::int64_t last, std::int64_t frame_count,
                          std::int64_t frame, std::int64_t duration, std::int64_t minimum) {
  if (last - first < minimum) return 0.0;
  return fade_weight({last - first, first == 0, last == frame_count}, frame - first, duration);
}

}  // namespace marrow::stabilization
