#include "stabilization/transitions/transition_bundle.h"

namespace marrow::stabilization {

transition_bundle::transition_bundle(const stabilizer_global& global, trajectory_range range,
                                     std::int64_t first, std::int64_t end, std::int64_t min_count) {
  try {
    build(global, range, first, end, min_count);
  } catch (...) {
    failed = true;
  }
}

void transition_bundle::build(const stabilizer_global& global, trajectory_range range,
                              std::int64_t first, std::int64_t end, std::int64_t min_count) {
  part_ = find_sub_window(global, range, first, end, kLeastSpan, min_count);
  if (part_.empty()) return;
  tracks_ = part_tracks(global, range, part_);

  const std::size_t frames = static_cast<std::size_t>(part_.length());
  std::vector<point2> travel(frames, point2{0, 0});
  std::vector<int> pairs(frames, 0);
  for (const part_track& track : tracks_) {
    for (std::int64_t f = track.first; f + 1 < track.end; ++f) {
      const point2 from = input_position(global, f, track.feature);
      const point2 to = input_position(global, f + 1, track.feature);
      const std::size_t i = static_cast<std::size_t>(f + 1 - part_.first);
      travel[i].x += to.x - from.x;
      travel[i].y += to.y - from.y;
      ++pairs[i];
    }
  }
  cameras_.resize(frames);
  cameras_[0].variable = false;
  for (std::size_t i = 1; i < frames; ++i) {
    const double weight = pairs[i] > 0 ? 1.0 / pairs[i] : 0.0;
    cameras_[i].tx = cameras_[i - 1].tx + weight * travel[i].x;
    cameras_[i].ty = cameras_[i - 1].ty + weight * travel[i].y;
  }
  for (std::size_t t = 0; t < tracks_.size(); ++t) {
    const part_track& track = tracks_[t];
    const frame_motion& start = cameras_[static_cast<std::size_t>(track.first - part_.first)];
    const point2 seen = input_position(global, track.first, track.feature);
    points_[0].push_back({seen.x - start.tx, seen.y - start.ty});
    for (std::int64_t f = track.first; f < track.end; ++f) {
      observations_.push_back({static_cast<std::int32_t>(f - part_.first), 0,
                               static_cast<std::int32_t>(t),
                               input_position(global, f, track.feature)});
    }
  }
  setup_secondary_variables();
}

}  // namespace marrow::stabilization
