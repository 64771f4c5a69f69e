#include "host/stabilize/track_paths.h"

#include <utility>

#include "host/stabilize/window/clip_windows.h"

namespace calmframe::host {

TrackRow RowInPlane(const PlaneFrame& frame, TrackRow row) {
  for (std::size_t s = 0; s < row.places.size(); ++s) {
    if (row.statuses[s] >= 0) row.places[s] = frame.At(row.places[s]);
  }
  return row;
}

void PathGatherer::Add(const TrackRow& row) {
  for (std::size_t s = 0; s < open_.size(); ++s) {
    if (row.statuses[s] != 0) End(s);
    if (row.statuses[s] < 0) continue;
    TrackPath& path = open_[s];
    if (path.points.empty()) path.first = frame_;
    path.points.push_back(row.places[s]);
    if (!IsInReach(path.points.back())) path.points.clear();
  }
  ++frame_;
}

std::vector<TrackPath> PathGatherer::Take() {
  for (std::size_t s = 0; s < open_.size(); ++s) End(s);
  return std::move(paths_);
}

void PathGatherer::End(std::size_t slot) {
  if (open_[slot].points.size() >= 5) paths_.push_back(open_[slot]);
  open_[slot].points.clear();
}

}  // namespace calmframe::host
