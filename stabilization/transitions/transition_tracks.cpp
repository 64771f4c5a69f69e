#include "stabilization/transitions/transition_tracks.h"

#include <algorithm>
#include <cmath>
#include <utility>

namespace marrow::stabilization {

trajectory_range live_trajectories(const stabilizer_global& global, std::int64_t first,
                                   std::int64_t end) {
  const auto& all = global.trajectories;
  trajectory_range range;
  while (range.begin < all.size() && all[range.begin].last <= first) ++range.begin;
  range.end = range.begin;
  while (range.end < all.size() && all[range.end].first < end) ++range.end;
  return range;
}

frame_range find_sub_window(const stabilizer_global& global, trajectory_range range,
                            std::int64_t first, std::int64_t end, std::int64_t min_span,
                            std::int64_t min_count) {
  if (end <= first) return {first, first};
  // A track adds one where it starts and takes it away where it ends.
  std::vector<std::int64_t> change(static_cast<std::size_t>(end - first) + 1);
  for (std::size_t t = range.begin; t < range.end; ++t) {
    const Trajectory& track = global.trajectories[t];
    const std::int64_t from = std::max<std::int64_t>(track.first, first);
    const std::int64_t to = std::min<std::int64_t>(track.last, end);
    if (to <= from || to - from < min_span) continue;
    ++change[static_cast<std::size_t>(from - first)];
    --change[static_cast<std::size_t>(to - first)];
  }
  frame_range part = {end, end};
  std::int64_t count = 0;
  for (std::int64_t f = first; f < end; ++f) {
    count += change[static_cast<std::size_t>(f - first)];
    const bool enough = count >= min_count;
    if (part.first == end) {
      if (enough) part.first = f;
    } else if (!enough) {
      part.end = f;
      break;
    }
  }
  return part;
}

std::vector<part_track> part_tracks(const stabilizer_global& global, trajectory_range range,
                                    const frame_range& part) {
  std::vector<part_track> tracks;
  for (std::size_t t = range.begin; t < range.end; ++t) {
    const Trajectory& track = global.trajectories[t];
    const std::int64_t first = std::max<std::int64_t>(track.first, part.first);
    const std::int64_t end = std::min<std::int64_t>(track.last, part.end);
    if (end - first < kLeastSpan) continue;
    tracks.push_back({t, static_cast<std::size_t>(track.feature), first, end});
  }
  return tracks;
}

void write_output(stabilizer_global& global, std::int64_t frame, std::size_t feature,
                  point2 position, bool first) {
  track_sample& sample = global.output_at(static_cast<std::size_t>(frame), feature);
  sample.x = static_cast<float>(position.x);
  sample.y = static_cast<float>(position.y);
  sample.status = first ? 1 : 0;
}

void append_unsolved(std::vector<transition_record>& records, const frame_range& frames) {
  if (frames.empty()) return;
  transition_record record;
  record.kind = transition_record::unsolved;
  record.first = static_cast<std::uint64_t>(frames.first);
  record.end = static_cast<std::uint64_t>(frames.end);
  for (std::int64_t f = frames.first; f < frames.end; ++f) {
    record.motion.insert(record.motion.end(), {1.0, 0.0, 0.0, 0.0});
  }
  records.push_back(std::move(record));
}

void append_solved(std::vector<transition_record>& records, const frame_range& frames,
                   std::vector<double> motion) {
  transition_record record;
  record.kind = transition_record::solved;
  record.first = static_cast<std::uint64_t>(frames.first);
  record.end = static_cast<std::uint64_t>(frames.end);
  record.motion = std::move(motion);
  records.push_back(std::move(record));
}

void apply_record(stabilizer_global& global, const transition_record& record) {
  for (std::uint64_t f = record.first; f < record.end; ++f) {
    const double* m = &record.motion[4 * (f - record.first)];
    const double c = m[0] * std::cos(m[1]);
    const double s = m[0] * std::sin(m[1]);
    for (std::size_t i = 0; i < global.feature_count; ++i) {
      track_sample& sample = global.output_at(f, i);
      if (sample.status < 0) continue;
      const track_sample& seen = global.input_at(f, i);
      const double x = seen.x;
      const double y = seen.y;
      sample.x = static_cast<float>(c * x - s * y + m[2]);
      sample.y = static_cast<float>(c * y + s * x + m[3]);
    }
  }
}

void reduce_to_shift(transition_record& record, point2 middle) {
  for (std::size_t i = 0; i + 3 < record.motion.size(); i += 4) {
    double* m = &record.motion[i];
    const point2 shift = displacement_of({m[0], m[1], m[2], m[3]}, middle);
    m[0] = 1.0;
    m[1] = 0.0;
    m[2] = shift.x;
    m[3] = shift.y;
  }
}

similarity map_between(const similarity& from, const similarity& to) {
  similarity map;
  map.scale = to.scale / from.scale;
  map.angle = to.angle - from.angle;
  const point2 moved = transform(map, {from.tx, from.ty});
  map.tx = to.tx - moved.x;
  map.ty = to.ty - moved.y;
  return map;
}

}  // namespace marrow::stabilization
