#pragma once

#include <cstdint>
#include <vector>

#include "stabilization/progress.h"
#include "stabilization/solve_records.h"
#include "stabilization/solver_params.h"

namespace marrow::stabilization {

// A track's sample on one frame with the place where the stabilized result wants it.
struct Displacement {
  std::int32_t cellX = 0;  // grid cell that holds the source position
  std::int32_t cellY = 0;
  double fracX = 0;  // position inside the cell, 0 to 1
  double fracY = 0;
  double sourceX = 0;  // the track's position in the frame, pixels
  double sourceY = 0;
  double targetX = 0;  // the wanted position in the output frame
  double targetY = 0;
  double weight = 0;                  // non-negative
  const Trajectory* track = nullptr;  // owned by stabilizer_global
  std::int32_t nextIndex = -1;        // of the track's record in the next frame's list; -1 if none
  std::int32_t prevIndex = -1;
  bool outlier = false;  // set by the robust pass
};

// One list a frame of the clip. A track's records are linked from frame to frame by index.
using displacement_lists = std::vector<std::vector<Displacement>>;

// What the displacements of a solved clip are made from: for each track the frames from its first
// stabilized sample to its first frame without one. Across the start of a window, [first,
// overlap_end), the target moves from the window's overlap_rows to global.output, linearly in time.
// Tracks shorter than parameters.track_fade_minimum make no record. Of a long clip all records are
// far larger than what they come from, so that they are made for the frames in hand.
class blended_tracks {
 public:
  // A progress call goes ahead of each track. `global` must outlive this object.
  blended_tracks(
      const stabilizer_global& global, const std::vector<factorization_window>& windows,
      const SolverParamsRecord& parameters, const progress_functor& progress = [] {});

  std::size_t frame_count() const { return global_.frame_count; }

 private:
  friend class displacement_stream;
  struct span {
    std::int32_t first, end;
  };
  struct overlap {
    std::uint64_t first, end;
    std::vector<track_sample> rows;
  };

  const track_sample* stabilized(std::int32_t frame, const Trajectory& track) const;
  // The sample of the window that rules the frame; null where it has none.
  const track_sample* windowed(std::int32_t frame, const Trajectory& track) const;
  // Sets the target and may scale the weight; false leaves the frame without a record.
  bool complete(Displacement& record, std::int32_t frame) const;

  const stabilizer_global& global_;
  const std::int64_t fade_duration_;
  std::vector<overlap> overlaps_;
  std::vector<std::int32_t> owner_;  // of a frame's overlap, or -1
  std::vector<span> spans_;          // by trajectory; empty for one that makes no record
};

// Walks over the lists of a clip, one frame after the other. The tracks must outlive it.
class displacement_stream {
 public:
  explicit displacement_stream(const blended_tracks& tracks, std::int32_t first_frame = 0);

  // The list of the next frame. Links both to the list before, which this call or the walk's start
  // left: null for the first one, whose records then begin.
  std::vector<Displacement> next(std::vector<Displacement>* before);

 private:
  struct active {
    std::size_t trajectory;
    std::int32_t previous;  // index in the list before, or -1
  };

  const blended_tracks& tracks_;
  std::int32_t frame_;
  std::size_t next_trajectory_ = 0;
  std::vector<active> active_;  // by trajectory
};

// The displacements of a clip that is still being solved: for each track all frames whose window it
// takes part in. Each run of such frames fades and is linked as a track by itself, so one that
// lives on across a gap counts on both sides of it. Targets are whatever `output` holds and wait
// for refresh_targets.
displacement_lists member_displacements(const stabilizer_global& global,
                                        const std::vector<factorization_window>& windows,
                                        const SolverParamsRecord& parameters);

// On frames [first, end): drops the records whose stabilized sample is missing, closing the gap and
// keeping every link right, and sets the targets of the others to their sample.
void refresh_targets(displacement_lists& lists, const stabilizer_global& global, std::int32_t first,
                     std::int32_t end);

}  // namespace marrow::stabilization
