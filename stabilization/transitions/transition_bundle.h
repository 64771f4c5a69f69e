#pragma once

#include "stabilization/transitions/sparse_bundle_adjuster3.h"
#include "stabilization/transitions/transition_tracks.h"

namespace marrow::stabilization {

// The bundle problem of the first stretch of [first, end) that has enough tracks: one camera a
// frame, the first one fixed, one scene point a track.
class transition_bundle : public sparse_bundle_adjuster3 {
 public:
  // A failure in here sets `failed`; nothing is thrown.
  transition_bundle(const stabilizer_global& global, trajectory_range range, std::int64_t first,
                    std::int64_t end, std::int64_t min_count);

  const frame_range& part() const { return part_; }
  const std::vector<part_track>& tracks() const { return tracks_; }  // point i is track i's

 private:
  void build(const stabilizer_global& global, trajectory_range range, std::int64_t first,
             std::int64_t end, std::int64_t min_count);

  frame_range part_;
  std::vector<part_track> tracks_;
};

}  // namespace marrow::stabilization
