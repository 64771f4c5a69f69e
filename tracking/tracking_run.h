#pragma once

#include <cstddef>
#include <vector>

#include "tracking/affine_state.h"
#include "tracking/frame_source.h"
#include "tracking/selector_params.h"
#include "tracking/track_store.h"
#include "tracking/tracker_params.h"

namespace marrow::tracking {

// Counters of one frame. Histograms have pyramidal_levels + 1 entries: 0 counts failures, k + 1
// counts features whose successful attempt started at level k.
struct TrackingStatistics {
  std::size_t new_features = 0;
  std::vector<std::size_t> translation;
  std::vector<std::size_t> verification;
};

// Where a run stands between two rows: the table's first `rows` rows are whole, and the tracker
// knows this of its slots.
struct RunState {
  std::size_t rows = 0;
  std::vector<AffineState> slots;
};

// Sees a run's rows. Called on the run's thread.
class RunWatcher {
 public:
  virtual ~RunWatcher() = default;
  // Behind each row, whether to be told where the run stands. `rows` are whole by now.
  virtual bool Wants(std::size_t rows) = 0;
  virtual void Take(const RunState& state) = 0;
};

// Fills a table of source.frame_count() rows and selector.max_count slots, row after row, then
// removes short tracks. all_features is given its final dimensions before the first frame is read,
// so that another holder of the header sees a table that fills from the top. One thread, one
// feature after the other. Exceptions of the source pass through.
void TrackFrames(FrameSource& source, const SelectorParams& selector, const TrackerParams& tracker,
                 AllFeatures& all_features, std::vector<TrackingStatistics>* statistics = nullptr,
                 RunWatcher* watcher = nullptr);

// The same of a run that stood there before: all_features has its final dimensions and the rows
// that were whole, at least one and not all, as they were, bit for bit; so is what comes of it.
// Looks back at the frames in which the tracks that live began. Throws std::invalid_argument for a
// state of other settings.
void GoOnTracking(FrameSource& source, const SelectorParams& selector, const TrackerParams& tracker,
                  AllFeatures& all_features, const RunState& state, RunWatcher* watcher = nullptr);

}  // namespace marrow::tracking
