#pragma once

#include <cstdint>
#include <vector>

#include "stabilization/models/matrix3.h"
#include "stabilization/models/similarity.h"
#include "stabilization/solve_records.h"

// What transition and lockdown windows have in common: which tracks and frames they solve, and how
// their result becomes records and stabilized positions. Frames count from the clip's start.
namespace marrow::stabilization {

// The least frames that a track must share with a stretch to count there.
inline constexpr std::int64_t kLeastSpan = 2;

struct frame_range {
  std::int64_t first = 0;
  std::int64_t end = 0;

  std::int64_t length() const { return end - first; }
  bool empty() const { return end <= first; }
};

// Positions in global.trajectories.
struct trajectory_range {
  std::size_t begin = 0;
  std::size_t end = 0;
};

// A trajectory cut to a stretch: alive on [first, end).
struct part_track {
  std::size_t trajectory = 0;
  std::size_t feature = 0;
  std::int64_t first = 0;
  std::int64_t end = 0;
};

// Skips the leading trajectories that end at or before `first` and stops at the first that starts
// at or past `end`: they are ordered by start.
trajectory_range live_trajectories(const stabilizer_global& global, std::int64_t first,
                                   std::int64_t end);

// The first run of frames of [first, end) on which at least min_count tracks live, among those that
// share at least min_span frames with [first, end). May be empty.
frame_range find_sub_window(const stabilizer_global& global, trajectory_range range,
                            std::int64_t first, std::int64_t end, std::int64_t min_span,
                            std::int64_t min_count);

// The tracks that share at least kLeastSpan frames with the part, in order.
std::vector<part_track> part_tracks(const stabilizer_global& global, trajectory_range range,
                                    const frame_range& part);

inline point2 input_position(const stabilizer_global& global, std::int64_t frame,
                             std::size_t feature) {
  const track_sample& s = global.input_at(static_cast<std::size_t>(frame), feature);
  return {s.x, s.y};
}

// Position and status 1 on the track's first frame in a solve, 0 after; the error stays.
void write_output(stabilizer_global& global, std::int64_t frame, std::size_t feature,
                  point2 position, bool first);

// Nothing where `frames` is empty.
void append_unsolved(std::vector<transition_record>& records, const frame_range& frames);
// motion: four numbers a frame.
void append_solved(std::vector<transition_record>& records, const frame_range& frames,
                   std::vector<double> motion);
// Takes every input sample that is live in output through its frame's map.
void apply_record(stabilizer_global& global, const transition_record& record);
// Leaves of each frame's motion the shift that it gives to `middle`, the picture's: origin and
// middle part by a rotation.
void reduce_to_shift(transition_record& record, point2 middle);
// The map that takes what `from` makes of a scene point to what `to` makes of it.
similarity map_between(const similarity& from, const similarity& to);

}  // namespace marrow::stabilization
