#include "stabilization/displacements.h"

#include <algorithm>

#include "stabilization/fade_weight.h"

namespace marrow::stabilization {
namespace {

constexpr std::int32_t kNoWindow = -1;

// Which window rules each frame; a later window takes the frame from an earlier one.
template <class EndOf>
std::vector<std::int32_t> window_of_frame(std::size_t frame_count,
                                          const std::vector<factorization_window>& windows,
                                          EndOf end_of) {
  std::vector<std::int32_t> owner(frame_count, kNoWindow);
  for (std::size_t w = 0; w < windows.size(); ++w) {
    const std::size_t end = std::min<std::size_t>(end_of(windows[w]), frame_count);
    for (std::size_t f = windows[w].first; f < end; ++f) owner[f] = static_cast<std::int32_t>(w);
  }
  return owner;
}

displacement_lists empty_lists(const stabilizer_global& global) {
  // Room for every sample of every track, so that lists of half a gigabyte are never copied.
  std::vector<std::ptrdiff_t> starts_less_ends(global.frame_count + 1);
  for (const Trajectory& track : global.trajectories) {
    ++starts_less_ends[static_cast<std::size_t>(track.first)];
    --starts_less_ends[static_cast<std::size_t>(track.last)];
  }
  displacement_lists lists(global.frame_count);
  std::ptrdiff_t alive = 0;
  for (std::size_t f = 0; f < lists.size(); ++f) {
    alive += starts_less_ends[f];
    lists[f].reserve(static_cast<std::size_t>(alive));
  }
  return lists;
}

// Appends one track's records over [first, end). complete(record, frame) sets the target and may
// scale the weight; false leaves the frame without a record.
template <class Complete>
void append_track(displacement_lists& lists, const stabilizer_global& global,
                  const Trajectory& track, std::int32_t first, std::int32_t end,
                  const SolverParamsRecord& parameters, Complete complete) {
  const std::int32_t length = end - first;
  if (length < 1 || length < parameters.track_fade_minimum) return;
  const fade_span span = {length, first == 0,
                          static_cast<std::uint64_t>(end) == global.frame_count};
  std::int32_t previous = -1;
  for (std::int32_t f = first; f < end; ++f) {
    const track_sample& source = global.input_at(f, track.feature);
    Displacement record;
    record.sourceX = source.x;
    record.sourceY = source.y;
    record.weight = fade_weight(span, f - first, parameters.track_fade_duration);
    record.track = &track;
    record.prevIndex = previous;
    if (!complete(record, f)) {
      if (previous >= 0) lists[f - 1][previous].nextIndex = -1;
      previous = -1;
      continue;
    }
    if (f + 1 < end) record.nextIndex = static_cast<std::int32_t>(lists[f + 1].size());
    previous = static_cast<std::int32_t>(lists[f].size());
    lists[f].push_back(record);
  }
}

}  // namespace

blended_tracks::blended_tracks(const stabilizer_global& global,
                               const std::vector<factorization_window>& windows,
                               const SolverParamsRecord& parameters,
                               const progress_functor& progress)
    : global_(global),
      fade_duration_(parameters.track_fade_duration),
      owner_(window_of_frame(global.frame_count, windows,
                             [](const factorization_window& w) { return w.overlap_end; })) {
  for (const factorization_window& window : windows) {
    overlaps_.push_back({window.first, window.overlap_end, window.overlap_rows});
  }
  spans_.reserve(global.trajectories.size());
  for (const Trajectory& track : global.trajectories) {
    progress();
    std::int32_t first = track.first;
    while (first < track.last && !stabilized(first, track)) ++first;
    std::int32_t end = first;
    while (end < track.last &&
           (owner_[end] == kNoWindow ? stabilized(end, track) : windowed(end, track))) {
      ++end;
    }
    if (end - first < std::max(parameters.track_fade_minimum, 1)) end = first;
    spans_.push_back({first, end});
  }
}

const track_sample* blended_tracks::stabilized(std::int32_t frame, const Trajectory& track) const {
  const track_sample& sample = global_.output_at(frame, track.feature);
  return sample.status < 0 ? nullptr : &sample;
}

const track_sample* blended_tracks::windowed(std::int32_t frame, const Trajectory& track) const {
  const overlap& window = overlaps_[owner_[frame]];
  const std::size_t i = (frame - window.first) * global_.feature_count + track.feature;
  if (i >= window.rows.size() || window.rows[i].status < 0) return nullptr;
  return &window.rows[i];
}

bool blended_tracks::complete(Displacement& record, std::int32_t frame) const {
  const bool alone = owner_[frame] == kNoWindow;
  const track_sample* s = stabilized(frame, *record.track);
  const track_sample* w = alone ? nullptr : windowed(frame, *record.track);
  if (!s && !w) return false;
  if (alone) {
    record.targetX = s->x;
    record.targetY = s->y;
    return true;
  }
  const overlap& window = overlaps_[owner_[frame]];
  const double t =
      static_cast<double>(window.end - frame) / static_cast<double>(window.end - window.first + 1);
  if (s && w) {
    record.targetX = t * w->x + (1 - t) * s->x;
    record.targetY = t * w->y + (1 - t) * s->y;
    return true;
  }
  const track_sample& only = w ? *w : *s;
  record.targetX = only.x;
  record.targetY = only.y;
  record.weight *= w ? t : 1 - t;
  return true;
}

displacement_stream::displacement_stream(const blended_tracks& tracks, std::int32_t first_frame)
    : tracks_(tracks), frame_(first_frame) {}

std::vector<Displacement> displacement_stream::next(std::vector<Displacement>* before) {
  const stabilizer_global& global = tracks_.global_;
  const auto& trajectories = global.trajectories;
  std::erase_if(
      active_, [&](const active& track) { return tracks_.spans_[track.trajectory].end <= frame_; });
  for (; next_trajectory_ < trajectories.size() && trajectories[next_trajectory_].first <= frame_;
       ++next_trajectory_) {
    if (tracks_.spans_[next_trajectory_].end > frame_) active_.push_back({next_trajectory_, -1});
  }
  std::vector<Displacement> list;
  list.reserve(active_.size());
  for (active& track : active_) {
    const auto [first, end] = tracks_.spans_[track.trajectory];
    if (frame_ < first) continue;
    Displacement record;
    record.track = &trajectories[track.trajectory];
    const track_sample& source = global.input_at(frame_, record.track->feature);
    record.sourceX = source.x;
    record.sourceY = source.y;
    const fade_span span = {end - first, first == 0,
                            static_cast<std::uint64_t>(end) == global.frame_count};
    record.weight = fade_weight(span, frame_ - first, tracks_.fade_duration_);
    record.prevIndex = before ? track.previous : -1;
    track.previous = -1;
    if (!tracks_.complete(record, frame_)) continue;
    track.previous = static_cast<std::int32_t>(list.size());
    if (record.prevIndex >= 0) (*before)[record.prevIndex].nextIndex = track.previous;
    list.push_back(record);
  }
  ++frame_;
  return list;
}

displacement_lists member_displacements(const stabilizer_global& global,
                                        const std::vector<factorization_window>& windows,
                                        const SolverParamsRecord& parameters) {
  const std::vector<std::int32_t> owner = window_of_frame(
      global.frame_count, windows, [](const factorization_window& w) { return w.end; });
  displacement_lists lists = empty_lists(global);
  for (std::size_t i = 0; i < global.trajectories.size(); ++i) {
    const Trajectory& track = global.trajectories[i];
    const auto member = [&](std::int32_t f) {
      return owner[f] != kNoWindow && windows[owner[f]].takes_part(i);
    };
    for (std::int32_t first = track.first, end = first; first < track.last; first = end + 1) {
      end = first;
      while (end < track.last && member(end)) ++end;
      append_track(lists, global, track, first, end, parameters,
                   [&](Displacement& record, std::int32_t f) {
                     const track_sample& sample = global.output_at(f, track.feature);
                     record.targetX = sample.x;
                     record.targetY = sample.y;
                     return true;
                   });
    }
  }
  return lists;
}

void refresh_targets(displacement_lists& lists, const stabilizer_global& global, std::int32_t first,
                     std::int32_t end) {
  std::vector<std::int32_t> moved_to;
  for (std::int32_t f = first; f < end; ++f) {
    std::vector<Displacement>& list = lists[f];
    moved_to.assign(list.size(), -1);
    std::int32_t kept = 0;
    for (std::size_t i = 0; i < list.size(); ++i) {
      const track_sample& sample = global.output_at(f, list[i].track->feature);
      if (sample.status < 0) continue;
      list[i].targetX = sample.x;
      list[i].targetY = sample.y;
      moved_to[i] = kept;
      list[kept++] = list[i];
    }
    if (static_cast<std::size_t>(kept) == list.size()) continue;
    list.resize(kept);
    if (f > 0) {
      for (Displacement& neighbour : lists[f - 1]) {
        if (neighbour.nextIndex >= 0) neighbour.nextIndex = moved_to[neighbour.nextIndex];
      }
    }
    if (static_cast<std::size_t>(f) + 1 < lists.size()) {
      for (Displacement& neighbour : lists[f + 1]) {
        if (neighbour.prevIndex >= 0) neighbour.prevIndex = moved_to[neighbour.prevIndex];
      }
    }
  }
}

}  // namespace marrow::stabilization
