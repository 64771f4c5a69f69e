#pragma once

#include <compare>
#include <cstdint>

namespace calmframe::host {

// A place on a track: a frame of the source, counted in fields where it is interlaced, and the
// track's slot in it. Neither is below 0. Ordered by frame, then by slot.
struct TrackPoint {
  std::int32_t frame = 0, slot = 0;

  auto operator<=>(const TrackPoint&) const = default;
};

}  // namespace calmframe::host
