#include "platform/tessel/debug.h"
#include "stabilization/transitions/transition_bundle.h"
#include "stabilization/transitions/transition_tracks.h"
#include "stabilization/transitions/transitions.h"

namespace marrow::stabilization {

void lockdown_window(stabilizer_global& global, std::uint64_t first, std::uint64_t end,
                     const SolverParamsRecord& parameters, const similarity& target,
                     std::vector<transition_record>& records, const progress_functor& progress) {
  tessel::debug::Log("Lockdown window (%d : %d)", static_cast<int>(first), static_cast<int>(end));
  std::int64_t at = static_cast<std::int64_t>(first);
  const std::int64_t last = static_cast<std::int64_t>(end);
  const trajectory_range range = live_trajectories(global, at, last);
  progress();
  while (at < last) {
    transition_bundle bundle(global, range, at, last, parameters.transition_min_observations);
    if (bundle.failed || bundle.part().empty()) break;
    if (!bundle.solve(parameters.max_transition_iterations, progress)) break;
    progress();
    const frame_range part = bundle.part();
    append_unsolved(records, {at, part.first});
    tessel::debug::Log("Sub-lockdown window (%d : %d)", static_cast<int>(part.first),
                       static_cast<int>(part.end));

    std::vector<double> motion;
    for (const frame_motion& camera : bundle.cameras()) {
      const similarity map =
          map_between({camera.scale, camera.angle, camera.tx, camera.ty}, target);
      motion.insert(motion.end(), {map.scale, map.angle, map.tx, map.ty});
      progress();
    }
    for (std::size_t t = 0; t < bundle.tracks().size(); ++t) {
      const part_track& track = bundle.tracks()[t];
      const point2 still = transform(target, bundle.points()[t]);
      for (std::int64_t f = track.first; f < track.end; ++f) {
        write_output(global, f, track.feature, still, f == track.first);
      }
    }
    append_solved(records, part, std::move(motion));
    progress();
    apply_record(global, records.back());
    at = part.end;
  }
  append_unsolved(records, {at, last});
}

}  // namespace marrow::stabilization
