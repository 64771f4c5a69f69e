#pragma once

#include <boost/shared_ptr.hpp>
#include <cstddef>
#include <cstdint>
#include <memory>
#include <new>
#include <utility>
#include <vector>

#include "tracking/packed_cells.h"
#include "tracking/tracking_feature.h"

// The table of everything the analysis learned from the pixels: one row for each analysed frame,
// one column for each feature slot. Frame-major: the cell of frame f and slot s stands at f *
// feature_count + s, f counted from 0 in the run.
namespace marrow::tracking {

// Values of status. Above 0: a seed; the value is the frame's index in the run plus 1.
namespace feature_status {
inline constexpr std::int32_t kTracked = 0;
inline constexpr std::int32_t kEmpty = -1;
inline constexpr std::int32_t kLost = -2;      // by the translation stage
inline constexpr std::int32_t kRejected = -3;  // by verification, correlation not under the limit
inline constexpr std::int32_t kRejectedCorrelation =
    -4;                                            // by verification, or removed as too short
inline constexpr std::int32_t kDeletedSeed = -10;  // by the user
inline constexpr std::int32_t kDeletedTracked = -11;
}  // namespace feature_status

// Leaves values as their memory is where nothing is told of them. Of much memory the system gives
// pages only as they are written, so that a table of which a run fills the first rows alone costs
// no more than these.
template <class Value>
struct UnfilledAllocator : std::allocator<Value> {
  template <class Other>
  struct rebind {
    using other = UnfilledAllocator<Other>;
  };

  UnfilledAllocator() = default;
  template <class Other>
  UnfilledAllocator(const UnfilledAllocator<Other>&) noexcept {}

  void construct(Value* value) noexcept { ::new (static_cast<void*>(value)) Value; }
  template <class... Arguments>
  void construct(Value* value, Arguments&&... arguments) {
    std::construct_at(value, std::forward<Arguments>(arguments)...);
  }
};

// The cells of a table. Those of rows that a run has not come to hold anything.
using TrackCells = std::vector<tracking_feature<float>, UnfilledAllocator<tracking_feature<float>>>;

// The table: a small header that may be copied, over cells that all copies share.
struct AllFeatures {
  std::int32_t feature_count = 0;
  std::int32_t first_frame = 0;  // absolute index of row 0
  std::int32_t frame_count = 0;
  boost::shared_ptr<TrackCells> features;  // empty where the cells are packed
  boost::shared_ptr<const PackedCells> packed;

  AllFeatures();  // the empty table, with an empty vector of its own

  // Copies a row's feature_count cells, however they are kept.
  void ReadRow(std::size_t row, tracking_feature<float>* cells) const;
};

// All cells of a table, which are its own where they are not packed.
boost::shared_ptr<const TrackCells> CellsOf(const AllFeatures& table);

// One run of a feature through one slot: rows [first, last).
struct Trajectory {
  std::int32_t feature;
  std::int32_t reserved;  // never written
  std::int32_t first;
  std::int32_t last;
};

// The trajectories of a table, by seed frame, then by slot. A trajectory starts at each cell with
// status > 0 and ends at the next row of its slot whose status is not 0. Cell is any record with a
// `status`.
template <class Cell>
std::vector<Trajectory> BuildTrajectories(const Cell* cells, std::size_t feature_count,
                                          std::size_t frame_count);

// Marks every cell of trajectories shorter than the limit with x = 0 and status -4; y and
// correlation stay. 0 is off.
void RemoveShortTracks(AllFeatures& all_features, std::int32_t kill_tracks_shorter_than);

// The table of a run that had ended before row `rows`: a copy of its first rows, of which short
// tracks are removed again, since more of them end early. One that has no more rows stays.
void ShortenTable(AllFeatures& all_features, std::int64_t rows,
                  std::int32_t kill_tracks_shorter_than);

// ---- implementation ----

template <class Cell>
std::vector<Trajectory> BuildTrajectories(const Cell* cells, std::size_t feature_count,
                                          std::size_t frame_count) {
  std::vector<Trajectory> trajectories;
  // Position in `trajectories` of the slot's run that has not ended yet, or -1: one pass along
  // memory instead of a walk down a column for each seed.
  std::vector<std::ptrdiff_t> open(feature_count, -1);
  for (std::size_t f = 0; f < frame_count; ++f) {
    for (std::size_t s = 0; s < feature_count; ++s) {
      const std::int32_t status = cells[f * feature_count + s].status;
      if (status == 0) continue;
      if (open[s] >= 0) trajectories[open[s]].last = static_cast<std::int32_t>(f);
      open[s] = -1;
      if (status > 0) {
        open[s] = static_cast<std::ptrdiff_t>(trajectories.size());
        trajectories.push_back({static_cast<std::int32_t>(s), 0, static_cast<std::int32_t>(f),
                                static_cast<std::int32_t>(frame_count)});
      }
    }
  }
  return trajectories;
}

}  // namespace marrow::tracking
