#include "tracking/tracking_run.h"

#include <algorithm>
#include <utility>

#include "tracking/feature_selector.h"
#include "tracking/feature_tracker.h"
#include "tracking/image_pyramid.h"

namespace marrow::tracking {
namespace {

constexpr std::size_t kChannels = 3;

// The selected features go into the slots without a live one, from slot 0 upward.
std::size_t FillSlots(const std::vector<FeatureSelector::Feature>& selected,
                      std::int32_t seed_status, std::size_t feature_count,
                      tracking_feature<float>* row) {
  std::size_t next = 0;
  for (std::size_t s = 0; s < feature_count && next < selected.size(); ++s) {
    if (row[s].status >= 0) continue;
    row[s] = {selected[next].x, selected[next].y, seed_status, 0.0f};
    ++next;
  }
  return next;
}

}  // namespace

void TrackFrames(FrameSource& source, const SelectorParams& selector_params,
                 const TrackerParams& tracker_params, AllFeatures& all_features,
                 std::vector<TrackingStatistics>* statistics) {
  const std::size_t frame_count = source.frame_count();
  const auto feature_count = static_cast<std::size_t>(selector_params.max_count);
  all_features.feature_count = static_cast<std::int32_t>(feature_count);
  all_features.frame_count = static_cast<std::int32_t>(frame_count);
  *all_features.features = TrackCells(feature_count * frame_count);
  if (statistics != nullptr) statistics->clear();
  if (frame_count == 0) return;

  const std::size_t levels = tracker_params.pyramidal_levels;
  FeatureSelector selector(selector_params);
  selector.Configure(source.width(), source.height());
  FeatureTracker tracker(tracker_params, feature_count, kChannels);
  ImagePyramid previous(source.width(), source.height(), kChannels, levels, source.first_level());
  ImagePyramid current(source.width(), source.height(), kChannels, levels, source.first_level());
  std::vector<float> scratch;

  for (std::size_t t = 0; t < frame_count; ++t) {
    tracking_feature<float>* row = all_features.features->data() + t * feature_count;
    std::fill_n(row, feature_count, tracking_feature<float>{});
    TrackingStatistics frame{0, std::vector<std::size_t>(levels + 1),
                             std::vector<std::size_t>(levels + 1)};
    const auto load_candidates = [&] {
      source.LoadLuma(t, selector.luma());
      source.LoadMask(t, selector.mask());
      selector.ComputeCandidates();
    };

    if (t == 0) {
      for (std::size_t s = 0; s < feature_count; ++s) row[s].status = feature_status::kEmpty;
      load_candidates();
      selector.SelectFirst();
    } else {
      source.LoadColorPyramid(t, current, scratch);
      tracker.TrackAndVerify(previous, current, row - feature_count, row, feature_count, frame);
      load_candidates();
      const auto free_slots = static_cast<std::size_t>(std::count_if(
          row, row + feature_count, [](const auto& cell) { return cell.status < 0; }));
      selector.SelectAvoiding(row, feature_count, free_slots);
    }
    frame.new_features =
        FillSlots(selector.selected, static_cast<std::int32_t>(t) + 1, feature_count, row);
    if (t == 0) source.LoadColorPyramid(t, current, scratch);
    tracker.InitialiseSeeds(current, row);
    std::swap(previous, current);
    if (statistics != nullptr) statistics->push_back(std::move(frame));
  }
  RemoveShortTracks(all_features, tracker_params.kill_tracks_shorter_than);
}

}  // namespace marrow::tracking
