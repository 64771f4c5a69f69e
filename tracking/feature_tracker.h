#pragma once

#include <cstddef>
#include <vector>

#include "tracking/affine_state.h"
#include "tracking/correlation.h"
#include "tracking/image_pyramid.h"
#include "tracking/packed_cholesky.h"
#include "tracking/track_store.h"
#include "tracking/tracker_params.h"
#include "tracking/tracking_run.h"
#include "tracking/translation_solver.h"
#include "tracking/window_stack.h"

namespace marrow::tracking {

// Carries features from frame to frame (Lucas and Kanade 1981, in the inverse-compositional form of
// Baker and Matthews 2004), then judges each against the window it showed in its first frame
// (Shi and Tomasi 1994), so that the errors of the steps do not add up. Windows are square, of
// half_win_x. One thread; everything is allocated at construction. Rows are feature_count cells of
// the track table.
class FeatureTracker {
 public:
  FeatureTracker(const TrackerParams& params, std::size_t feature_count, std::size_t channels);

  // Keeps what the slots of all seeds (status above 0) show in their first frame.
  void InitialiseSeeds(const ImagePyramid& current, const tracking_feature<float>* row);

  // What it knows of its slots besides what the seeds showed; none without verification. A tracker
  // that was given the seeds of the tracks that live, each with the pyramid of its own frame, and
  // these, goes on to the same bits.
  std::vector<AffineState> States() const;
  void SetStates(const std::vector<AffineState>& states);

  // Follows each feature that lives in previous_row, for the first feature_count slots: writes x, y
  // and status kTracked to current_row, or status kLost; for the other slots status kEmpty. Counts
  // into statistics.translation.
  // What was tracked is then verified: the slot's first window is matched against this frame,
  // starting at the cell's position with the warp and colours of the frame before. Writes x, y and
  // correlation, or status kRejected (the correlation in the cell is not under the limit) or
  // kRejectedCorrelation. Counts into statistics.verification. Slot by slot, so that a feature's
  // second match finds the pixels of its first one in the cache.
  void TrackAndVerify(const ImagePyramid& previous, const ImagePyramid& current,
                      const tracking_feature<float>* previous_row,
                      tracking_feature<float>* current_row, std::size_t feature_count,
                      TrackingStatistics& statistics);

 private:
  // What depends on one level of a template alone, computed when it is first needed.
  enum class readiness : unsigned char { unknown, ready, singular };
  struct translation_level {
    bool singular = false;
    translation_normal normal;
  };
  struct affine_level {
    readiness normal_state = readiness::unknown;
    bool has_moments = false;
    channel_moments moments;
    packed_cholesky normal;
  };
  struct feature_slot {
    WindowStack stack;
    std::vector<affine_level> levels;
    std::size_t primary_channel = 0;
    AffineState state;
  };
  struct translation_stage;
  struct affine_stage;

  void TrackSlot(const ImagePyramid& previous, const ImagePyramid& current,
                 const tracking_feature<float>& from, tracking_feature<float>& to,
                 TrackingStatistics& statistics);
  void VerifySlot(const ImagePyramid& current, feature_slot& slot, tracking_feature<float>& cell,
                  TrackingStatistics& statistics);
  bool TrackFeature(const ImagePyramid& previous, const ImagePyramid& current,
                    const tracking_feature<float>& from, tracking_feature<float>& to,
                    TrackingStatistics& statistics);
  bool VerifyFeature(const ImagePyramid& current, feature_slot& slot, float limit,
                     tracking_feature<float>& cell, TrackingStatistics& statistics);

  std::size_t levels_;
  int max_iterations_;
  bool verification_;
  color_mode translation_mode_;
  color_mode affine_mode_;
  float min_correlation_;
  float dark_threshold_;
  solver_tolerances tolerances_;
  window_shape shape_;
  WindowStack sample_;  // of one level: the last sample
  WindowStack translation_stack_;
  std::vector<translation_level> translation_levels_;
  std::vector<feature_slot> slots_;  // empty without verification
};

}  // namespace marrow::tracking
