#include "studio/worker/lasso.h"

#include <algorithm>
#include <cstddef>

namespace calmframe::studio {
namespace {

// By how often a ray to the right crosses an edge (Shimrat, Algorithm 112, 1962).
bool IsInside(const std::vector<host::Point>& corners, host::Point at) {
  if (corners.size() < 3) return true;
  bool inside = false;
  for (std::size_t i = 0, before = corners.size() - 1; i < corners.size(); before = i++) {
    const host::Point &a = corners[i], &b = corners[before];
    if ((a.y > at.y) != (b.y > at.y) && at.x < (b.x - a.x) * (at.y - a.y) / (b.y - a.y) + a.x) {
      inside = !inside;
    }
  }
  return inside;
}

}  // namespace

std::vector<LassoedTrack> TracksIn(const Lasso& lasso, const host::SolvedClip& clip, int fields) {
  const std::int64_t row = lasso.frame * fields - clip.first_frame;
  const std::int64_t first = lasso.any_frame ? 0 : std::max<std::int64_t>(row, 0);
  const std::int64_t end =
      lasso.any_frame ? clip.frame_count : std::min<std::int64_t>(row + fields, clip.frame_count);
  std::vector<LassoedTrack> found;
  std::vector<char> is_found(static_cast<std::size_t>(clip.slots), 0);  // a slot's track
  for (std::int64_t r = first; r < end; ++r) {
    const host::TrackRow tracks = clip.TracksOf(static_cast<std::size_t>(r));
    for (int slot = 0; slot < clip.slots; ++slot) {
      const auto cell = static_cast<std::size_t>(slot);
      char& is_known = is_found[cell];
      if (tracks.statuses[cell] > 0) is_known = 0;  // another one begins
      if (tracks.statuses[cell] < 0 || is_known) continue;
      const host::Point place{(tracks.places[cell].x + 0.5) / clip.source_width,
                              (tracks.places[cell].y + 0.5) / clip.source_height};
      if (!IsInside(lasso.corners, place)) continue;
      is_known = 1;
      found.push_back({{static_cast<std::int32_t>(clip.first_frame + r), slot}, place});
    }
  }
  return found;
}

}  // namespace calmframe::studio
