#include <algorithm>

#include "platform/tessel/debug.h"
#include "stabilization/fade_weight.h"
#include "stabilization/transitions/transition_bundle.h"
#include "stabilization/transitions/transition_refiner.h"
#include "stabilization/transitions/transition_smoother.h"
#include "stabilization/transitions/transition_tracks.h"
#include "stabilization/transitions/transitions.h"
#include "stabilization/transitions/wild_steps.h"

namespace marrow::stabilization {
namespace {

// Tracks that must live on a frame for the smoother to take it in.
constexpr std::int64_t kLeastTracks = 2;
// How much more a frame counts that is solved already and that the path must join up with.
constexpr double kOverlapFrameWeight = 100.0;
constexpr double kEndFrameWeight = 10.0;
// Fewer live tracks than these don't turn or resize a frame where tracks are not all trusted.
constexpr std::int64_t kLeastToTurn = 6;

struct transition {
  stabilizer_global& global;
  const SolverParamsRecord& parameters;
  const int width;
  const int height;
  const bool translation_only;
  std::vector<transition_record>& records;
  const progress_functor& progress;
  const trajectory_range range;
  const std::int64_t end;

  // Both solve one chunk and return where the next one starts; `end` where nothing is left to do.
  std::int64_t smooth(std::int64_t chunk_first, std::int64_t chunk_end);
  std::int64_t bundle_and_refine(std::int64_t chunk_first, std::int64_t chunk_end, bool is_first);

  bool trusts_all_tracks() const { return parameters.transition_bisquare_sigma == kTrustAllTracks; }

  // No track has a stabilized place on the frame before: there the picture is as it was shot.
  bool starts_afresh(std::int64_t frame) const {
    if (frame == 0) return false;
    const auto row =
        global.output.begin() + (frame - 1) * static_cast<std::ptrdiff_t>(global.feature_count);
    return std::all_of(row, row + static_cast<std::ptrdiff_t>(global.feature_count),
                       [](const track_sample& sample) { return sample.status < 0; });
  }

  // On every frame of [first, end) the track's output sample is there and none after `start`
  // begins anew.
  bool unbroken(std::size_t feature, std::int64_t start, std::int64_t stop,
                bool starts_there) const {
    for (std::int64_t f = start; f < stop; ++f) {
      const std::int32_t status = global.output_at(static_cast<std::size_t>(f), feature).status;
      if (f == start && starts_there ? status < 1 : status != 0) return false;
    }
    return true;
  }

  smoothing_track gather(const part_track& track, std::int64_t base, std::int64_t part_first) const;
};

// The track's samples with its fade as their smoothness weight. base: the problem's frame 0.
smoothing_track transition::gather(const part_track& track, std::int64_t base,
                                   std::int64_t part_first) const {
  const Trajectory& whole = global.trajectories[track.trajectory];
  std::int64_t start = track.first;
  if (whole.first < base) {
    if (unbroken(track.feature, base, part_first, false)) start = base;
  } else if (whole.first < part_first) {
    if (unbroken(track.feature, whole.first, part_first, true)) start = whole.first;
  }
  const std::int64_t duration = parameters.transition_fade_duration;
  const fade_span span = {track.end - start, std::max<std::int64_t>(whole.first, base) == 0,
                          track.end == static_cast<std::int64_t>(global.frame_count)};
  smoothing_track gathered;
  gathered.first = start - base;
  for (std::int64_t f = start; f < track.end; ++f) {
    const track_sample& solved = global.output_at(static_cast<std::size_t>(f), track.feature);
    gathered.points.push_back(f < part_first ? point2{solved.x, solved.y}
                                             : input_position(global, f, track.feature));
    gathered.smoothness_weight.push_back(fade_weight(span, f - start, duration) *
                                         static_cast<double>(duration));
  }
  gathered.data_weight = gathered.smoothness_weight;
  return gathered;
}

std::int64_t transition::smooth(std::int64_t chunk_first, std::int64_t chunk_end) {
  const frame_range part =
      find_sub_window(global, range, chunk_first, chunk_end, kLeastSpan, kLeastTracks);
  if (part.empty()) {
    append_unsolved(records, {chunk_first, end});
    return end;
  }
  const bool from_identity = !trusts_all_tracks() && starts_afresh(part.first);
  // Every chunk reaches back over frames that are solved by then, be it by the chunk before it.
  const std::int64_t overlap =
      from_identity ? 0
                    : std::clamp<std::int64_t>(parameters.transition_tail_overlap, 0, chunk_first);
  std::vector<double> frame_weights(
      static_cast<std::size_t>(overlap + std::max<std::int64_t>(0, chunk_end - chunk_first)), 1.0);
  std::fill_n(frame_weights.begin(), overlap, kOverlapFrameWeight);
  const std::vector<double> smoothness(frame_weights.size(), parameters.transition_stab_lambda);
  append_unsolved(records, {chunk_first, part.first});

  const std::int64_t base = part.first - overlap;
  const std::int64_t frames = part.end - base;
  const std::vector<part_track> members = part_tracks(global, range, part);
  std::vector<smoothing_track> tracks;
  std::vector<std::int64_t> count(static_cast<std::size_t>(frames), 0);
  for (const part_track& member : members) {
    tracks.push_back(gather(member, base, part.first));
    for (std::int64_t g = tracks.back().first; g < tracks.back().end(); ++g) {
      ++count[static_cast<std::size_t>(g)];
    }
  }
  const double largest = static_cast<double>(*std::max_element(count.begin(), count.end()));
  for (std::size_t g = 0; g < count.size(); ++g) {
    if (count[g] > 0) frame_weights[g] *= largest / static_cast<double>(count[g]);
  }
  for (smoothing_track& track : tracks) {
    for (std::size_t i = 0; i < track.points.size(); ++i) {
      const std::size_t g = static_cast<std::size_t>(track.first) + i;
      track.data_weight[i] *= frame_weights[g];
      track.smoothness_weight[i] *= smoothness[g];
    }
  }

  std::vector<bool> held;
  if (!trusts_all_tracks()) {
    weigh_down_wild_steps(tracks, frames, parameters.transition_bisquare_sigma * width / 1000);
    for (std::int64_t g = 0; g < frames; ++g) {
      const bool all = from_identity && g == 0;
      const bool few = all || count[static_cast<std::size_t>(g)] < kLeastToTurn;
      held.insert(held.end(), {few, few, all, all});
    }
  }

  std::vector<double> motion;
  for (std::int64_t g = 0; g < frames; ++g) motion.insert(motion.end(), {1.0, 0.0, 0.0, 0.0});
  transition_smoother smoother(frames, tracks, std::move(held));
  if (!smoother.solve(motion, parameters.max_transition_iterations, progress)) {
    append_unsolved(records, part);
    return part.end;
  }
  motion.erase(motion.begin(), motion.begin() + static_cast<std::ptrdiff_t>(4 * overlap));
  for (const part_track& member : members) {
    for (std::int64_t f = member.first; f < member.end; ++f) {
      const frame_unknowns map(&motion[static_cast<std::size_t>(4 * (f - part.first))]);
      write_output(global, f, member.feature, map(input_position(global, f, member.feature)),
                   f == member.first);
    }
  }
  tessel::debug::Log("Sub-transition window (%d : %d)", static_cast<int>(part.first),
                     static_cast<int>(part.end));
  append_solved(records, part, std::move(motion));
  if (translation_only) {
    reduce_to_shift(records.back(), middle_of(width, height));
    apply_record(global, records.back());
  }
  return part.end;
}

std::int64_t transition::bundle_and_refine(std::int64_t chunk_first, std::int64_t chunk_end,
                                           bool is_first) {
  transition_bundle bundle(global, range, chunk_first, chunk_end,
                           parameters.transition_min_observations);
  if (bundle.failed || bundle.part().empty() ||
      !bundle.solve(parameters.max_transition_iterations, progress)) {
    append_unsolved(records, {chunk_first, end});
    return end;
  }
  const frame_range part = bundle.part();
  tessel::debug::Log("Sub-transition window (%d : %d)\n", static_cast<int>(part.first),
                     static_cast<int>(part.end));

  std::vector<double> frame_weights(static_cast<std::size_t>(part.length()), 1.0);
  frame_weights.back() = kEndFrameWeight;
  if (!is_first) frame_weights.front() = kEndFrameWeight;
  std::vector<refiner_track> tracks;
  for (std::size_t t = 0; t < bundle.tracks().size(); ++t) {
    const part_track& member = bundle.tracks()[t];
    refiner_track track;
    track.first = member.first - part.first;
    track.point = bundle.points()[t];
    for (std::int64_t f = member.first; f < member.end; ++f) {
      track.observations.push_back(input_position(global, f, member.feature));
    }
    const std::int64_t before = part.first - 2;
    if (before >= 0 && global.trajectories[member.trajectory].first <= before &&
        unbroken(member.feature, before, part.first, false)) {
      const track_sample& e1 = global.output_at(static_cast<std::size_t>(before), member.feature);
      const track_sample& e2 =
          global.output_at(static_cast<std::size_t>(before + 1), member.feature);
      track.continues = true;
      track.two_before = {e1.x, e1.y};
      track.one_before = {e2.x, e2.y};
    }
    tracks.push_back(std::move(track));
  }
  std::vector<double> refined;
  for (const frame_motion& camera : bundle.cameras()) {
    refined.insert(refined.end(), {camera.scale, camera.angle, camera.tx, camera.ty});
  }
  transition_refiner refiner(frame_weights, tracks, parameters.smoothness_lambda,
                             parameters.smoothness_lambda);
  if (!refiner.solve(refined, parameters.max_transition_iterations, progress)) {
    append_unsolved(records, {chunk_first, end});
    return end;
  }

  std::vector<double> motion;
  for (std::size_t i = 0; i < bundle.cameras().size(); ++i) {
    const frame_motion& camera = bundle.cameras()[i];
    const double* r = &refined[4 * i];
    const similarity map =
        map_between({camera.scale, camera.angle, camera.tx, camera.ty}, {r[0], r[1], r[2], r[3]});
    motion.insert(motion.end(), {map.scale, map.angle, map.tx, map.ty});
  }
  for (std::size_t t = 0; t < tracks.size(); ++t) {
    const part_track& member = bundle.tracks()[t];
    for (std::int64_t f = member.first; f < member.end; ++f) {
      const frame_unknowns map(&refined[static_cast<std::size_t>(4 * (f - part.first))]);
      write_output(global, f, member.feature, map(tracks[t].point), f == member.first);
    }
  }
  append_unsolved(records, {chunk_first, part.first});
  append_solved(records, part, std::move(motion));
  progress();
  if (translation_only) reduce_to_shift(records.back(), middle_of(width, height));
  apply_record(global, records.back());
  progress();
  return part.end;
}

}  // namespace

void transition_window(stabilizer_global& global, std::uint64_t first, std::uint64_t end,
                       const SolverParamsRecord& parameters, int width, int height,
                       bool translation_only, std::vector<transition_record>& records,
                       const progress_functor& progress) {
  tessel::debug::Log("Transition window (%d : %d)", static_cast<int>(first), static_cast<int>(end));
  if (first == end) return;
  const std::int64_t window_first = static_cast<std::int64_t>(first);
  const std::int64_t window_end = static_cast<std::int64_t>(end);
  transition solve{
      global,           parameters, width,    height,
      translation_only, records,    progress, live_trajectories(global, window_first, window_end),
      window_end};
  progress();
  std::int64_t chunk_first = window_first;
  bool is_first = true;
  while (chunk_first < window_end) {
    std::int64_t chunk_end =
        chunk_first + std::min(window_end - chunk_first, parameters.transition_max_duration);
    if (window_end - chunk_end == 1) chunk_end = window_end;  // no track spans a single frame
    chunk_first = parameters.use_new_solver
                      ? solve.smooth(chunk_first, chunk_end)
                      : solve.bundle_and_refine(chunk_first, chunk_end, is_first);
    is_first = false;
  }
}

}  // namespace marrow::stabilization
