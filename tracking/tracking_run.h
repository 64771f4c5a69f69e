#pragma once

#include <cstddef>
#include <vector>

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

// Fills a table of source.frame_count() rows and selector.max_count slots, row after row, then
// removes short tracks. all_features is given its final dimensions before the first frame is read,
// so that another holder of the header sees a table that fills from the top. One thread, one
// feature after the other. Exceptions of the source pass through.
void TrackFrames(FrameSource& source, const SelectorParams& selector, const TrackerParams& tracker,
                 AllFeatures& all_features, std::vector<TrackingStatistics>* statistics = nullptr);

}  // namespace marrow::tracking
