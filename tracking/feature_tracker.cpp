#include "tracking/feature_tracker.h"

#include <algorithm>
#include <limits>

#include "tracking/affine_solver.h"
#include "tracking/pyramid_search.h"

namespace marrow::tracking {
namespace {

void Count(std::vector<std::size_t>& histogram, std::size_t counter) {
  if (counter < histogram.size()) ++histogram[counter];
}

}  // namespace

// Most features are found on the finest level alone, so levels of the template are sampled and
// their matrices formed when an attempt first reaches them.
struct FeatureTracker::translation_stage {
  FeatureTracker& tracker;
  const ImagePyramid& previous;
  const ImagePyramid& current;
  float x, y;
  color_mode mode;
  std::size_t levels_sampled = 0;
  std::size_t levels_prepared = 0;

  void SampleTo(std::size_t level) {
    for (; levels_sampled <= level; ++levels_sampled) {
      ExtractWindowLevel(levels_sampled, x, y, previous, tracker.translation_stack_);
    }
  }

  int Solve(std::size_t level, AffineState& state) {
    SampleTo(level);
    const float* t = tracker.translation_stack_.Level(level);
    for (; levels_prepared <= level; ++levels_prepared) {
      translation_level& next = tracker.translation_levels_[levels_prepared];
      next.singular = !PrepareTranslation(tracker.translation_stack_.Level(levels_prepared),
                                          tracker.shape_, mode, next.normal);
    }
    const translation_level& prepared = tracker.translation_levels_[level];
    if (prepared.singular) return kLevelFailed;
    return SolveTranslation(t, tracker.shape_, prepared.normal, current.Level(level), mode,
                            tracker.tolerances_, tracker.max_iterations_, state,
                            tracker.sample_.Level(0));
  }

  float Correlation(std::size_t level) {
    return NormalisedCorrelation(tracker.shape_, tracker.translation_stack_.Level(level),
                                 tracker.sample_.Level(0));
  }
};

struct FeatureTracker::affine_stage {
  FeatureTracker& tracker;
  const ImagePyramid& current;
  feature_slot& slot;
  color_mode mode;

  int Solve(std::size_t level, AffineState& state) {
    if (mode != color_mode::none && mode != color_mode::joint) return kLevelFailed;
    affine_level& cached = slot.levels[level];
    const float* t = slot.stack.Level(level);
    if (cached.normal_state == readiness::unknown) {
      cached.normal_state =
          PrepareAffine(t, tracker.shape_, mode == color_mode::joint, cached.normal)
              ? readiness::ready
              : readiness::singular;
    }
    if (cached.normal_state == readiness::singular) return kLevelFailed;
    return SolveAffine(t, tracker.shape_, cached.normal, current.Level(level), mode,
                       tracker.tolerances_, tracker.max_iterations_, state,
                       tracker.sample_.Level(0));
  }

  float Correlation(std::size_t level) {
    affine_level& cached = slot.levels[level];
    const float* t = slot.stack.Level(level);
    if (!cached.has_moments) {
      cached.moments = ChannelMoments(t, tracker.shape_);
      cached.has_moments = true;
    }
    return NormalisedCorrelation(tracker.shape_, t, cached.moments, tracker.sample_.Level(0));
  }
};

FeatureTracker::FeatureTracker(const TrackerParams& params, std::size_t feature_count,
                               std::size_t channels)
    : levels_(params.pyramidal_levels),
      max_iterations_(static_cast<int>(
          std::min<std::uint64_t>(params.max_iterations, std::numeric_limits<int>::max()))),
      verification_(params.affine_verification),
      translation_mode_(static_cast<color_mode>(params.color_correction_translation)),
      affine_mode_(static_cast<color_mode>(params.color_correction_affine)),
      min_correlation_(static_cast<float>(params.tolerance_min_correlation)),
      dark_threshold_(static_cast<float>(params.tolerance_primary_color_threshold)),
      tolerances_{static_cast<float>(params.tolerance_translation),
                  static_cast<float>(params.tolerance_affine),
                  static_cast<float>(params.tolerance_color_lambda),
                  static_cast<float>(params.tolerance_color_delta)},
      shape_{params.half_win_x, params.half_win_x, channels},
      sample_(shape_.half_x, shape_.half_y, channels, 1),
      translation_stack_(shape_.half_x, shape_.half_y, channels, levels_),
      translation_levels_(levels_) {
  if (!verification_) return;
  slots_.resize(feature_count);
  for (feature_slot& slot : slots_) {
    slot.stack = WindowStack(shape_.half_x, shape_.half_y, channels, levels_);
    slot.levels.resize(levels_);
  }
}

std::vector<AffineState> FeatureTracker::States() const {
  std::vector<AffineState> states;
  for (const feature_slot& slot : slots_) states.push_back(slot.state);
  return states;
}

void FeatureTracker::SetStates(const std::vector<AffineState>& states) {
  for (std::size_t s = 0; s < slots_.size(); ++s) slots_[s].state = states.at(s);
}

void FeatureTracker::TrackAndVerify(const ImagePyramid& previous, const ImagePyramid& current,
                                    const tracking_feature<float>* previous_row,
                                    tracking_feature<float>* current_row, std::size_t feature_count,
                                    TrackingStatistics& statistics) {
  for (std::size_t s = 0; s < feature_count; ++s) {
    TrackSlot(previous, current, previous_row[s], current_row[s], statistics);
    if (verification_) VerifySlot(current, slots_[s], current_row[s], statistics);
  }
}

void FeatureTracker::TrackSlot(const ImagePyramid& previous, const ImagePyramid& current,
                               const tracking_feature<float>& from, tracking_feature<float>& to,
                               TrackingStatistics& statistics) {
  if (from.status < 0) {
    to.status = feature_status::kEmpty;
  } else if (TrackFeature(previous, current, from, to, statistics)) {
    to.status = feature_status::kTracked;
  } else {
    to.status = feature_status::kLost;
    Count(statistics.translation, 0);
  }
}

bool FeatureTracker::TrackFeature(const ImagePyramid& previous, const ImagePyramid& current,
                                  const tracking_feature<float>& from, tracking_feature<float>& to,
                                  TrackingStatistics& statistics) {
  WindowStack& stack = translation_stack_;
  stack.levels_built = CountWindowLevels(levels_, from.x, from.y, shape_, previous);
  if (stack.levels_built == 0) return false;
  translation_stage stage{*this, previous, current, from.x, from.y, translation_mode_};
  stage.SampleTo(0);
  float limit = min_correlation_;
  if (FindPrimaryChannel(stack.Level(0), shape_, dark_threshold_) != 0) {
    stage.mode = color_mode::none;
    limit = kAnyCorrelation;
  }
  AffineState state(from.x, from.y);
  const search_result result =
      SearchPyramid(stage, stack.levels_built, limit, max_iterations_, state);
  if (!result.found()) return false;
  Count(statistics.translation, static_cast<std::size_t>(result.start_level) + 1);
  to.x = from.x + state.dx;
  to.y = from.y + state.dy;
  return true;
}

void FeatureTracker::InitialiseSeeds(const ImagePyramid& current,
                                     const tracking_feature<float>* row) {
  for (std::size_t s = 0; s < slots_.size(); ++s) {
    if (row[s].status <= 0) continue;
    feature_slot& slot = slots_[s];
    ExtractWindowStack(levels_, row[s].x, row[s].y, current, slot.stack);
    for (affine_level& level : slot.levels) {
      level.normal_state = readiness::unknown;
      level.has_moments = false;
    }
    slot.primary_channel = slot.stack.levels_built == 0
                               ? 0
                               : FindPrimaryChannel(slot.stack.Level(0), shape_, dark_threshold_);
    slot.state = AffineState(row[s].x, row[s].y);
  }
}

void FeatureTracker::VerifySlot(const ImagePyramid& current, feature_slot& slot,
                                tracking_feature<float>& cell, TrackingStatistics& statistics) {
  if (cell.status != feature_status::kTracked) return;
  slot.state.dx = cell.x - slot.state.x;
  slot.state.dy = cell.y - slot.state.y;
  const float limit = slot.primary_channel != 0 ? kAnyCorrelation : min_correlation_;
  if (VerifyFeature(current, slot, limit, cell, statistics)) return;
  cell.status =
      limit > cell.correlation ? feature_status::kRejectedCorrelation : feature_status::kRejected;
  Count(statistics.verification, 0);
}

bool FeatureTracker::VerifyFeature(const ImagePyramid& current, feature_slot& slot, float limit,
                                   tracking_feature<float>& cell, TrackingStatistics& statistics) {
  affine_stage stage{*this, current, slot,
                     slot.primary_channel != 0 ? color_mode::none : affine_mode_};
  const search_result result = SearchPyramid(
      stage, std::min(slot.stack.levels_built, current.levels), limit, max_iterations_, slot.state);
  if (!result.found()) return false;
  cell.correlation = result.start_level == 0 && result.correlation_tested ? result.correlation
                                                                          : stage.Correlation(0);
  if (cell.correlation < limit) return false;
  Count(statistics.verification, static_cast<std::size_t>(result.start_level) + 1);
  cell.x = slot.state.x + slot.state.dx;
  cell.y = slot.state.y + slot.state.dy;
  return true;
}

}  // namespace marrow::tracking
