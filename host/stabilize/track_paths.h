#pragma once

#include <cstddef>
#include <cstdint>
#include <vector>

#include "host/stabilize/warped_plane.h"

namespace calmframe::host {

// Where one feature is in consecutive frames.
struct TrackPath {
  std::size_t first = 0;  // frame
  std::vector<Point> points;
};

// A frame's tracks in the plane: a row of the table whose places are there where its statuses tell
// of a track.
TrackRow RowInPlane(const PlaneFrame& frame, TrackRow row);

// Gathers the paths of tracks that are not deleted and last five frames at least, from row to row.
class PathGatherer {
 public:
  explicit PathGatherer(int slots) : open_(static_cast<std::size_t>(slots)) {}

  // Of the next frame, in the plane.
  void Add(const TrackRow& row);
  // Behind the last one.
  std::vector<TrackPath> Take();

 private:
  void End(std::size_t slot);

  std::size_t frame_ = 0;
  std::vector<TrackPath> open_;  // by slot
  std::vector<TrackPath> paths_;
};

}  // namespace calmframe::host
