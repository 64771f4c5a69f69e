#include "tracking/tracking_run.h"

#include <algorithm>
#include <map>
#include <stdexcept>
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

// A run with all that it needs from row to row.
class Run {
 public:
  Run(FrameSource& source, const SelectorParams& selector_params,
      const TrackerParams& tracker_params, AllFeatures& all_features)
      : source_(source),
        table_(all_features),
        slots_(static_cast<std::size_t>(selector_params.max_count)),
        levels_(tracker_params.pyramidal_levels),
        selector_(selector_params),
        tracker_(tracker_params, slots_, kChannels),
        previous_(source.width(), source.height(), kChannels, levels_, source.first_level()),
        current_(source.width(), source.height(), kChannels, levels_, source.first_level()) {
    selector_.Configure(source.width(), source.height());
  }

  TrackingStatistics Row(std::size_t t) {
    tracking_feature<float>* const row = RowOf(t);
    std::fill_n(row, slots_, tracking_feature<float>{});
    TrackingStatistics frame{0, std::vector<std::size_t>(levels_ + 1),
                             std::vector<std::size_t>(levels_ + 1)};
    const auto load_candidates = [&] {
      source_.LoadLuma(t, selector_.luma());
      source_.LoadMask(t, selector_.mask());
      selector_.ComputeCandidates();
    };

    if (t == 0) {
      for (std::size_t s = 0; s < slots_; ++s) row[s].status = feature_status::kEmpty;
      load_candidates();
      selector_.SelectFirst();
    } else {
      source_.LoadColorPyramid(t, current_, scratch_);
      tracker_.TrackAndVerify(previous_, current_, row - slots_, row, slots_, frame);
      load_candidates();
      const auto free_slots = static_cast<std::size_t>(
          std::count_if(row, row + slots_, [](const auto& cell) { return cell.status < 0; }));
      selector_.SelectAvoiding(row, slots_, free_slots);
    }
    frame.new_features =
        FillSlots(selector_.selected, static_cast<std::int32_t>(t) + 1, slots_, row);
    if (t == 0) source_.LoadColorPyramid(t, current_, scratch_);
    tracker_.InitialiseSeeds(current_, row);
    std::swap(previous_, current_);
    return frame;
  }

  // As Row left it behind the state's last row.
  void StandAt(const RunState& state) {
    std::map<std::size_t, std::vector<std::size_t>> begun;  // slots by the row of their seed
    for (std::size_t s = 0; s < slots_; ++s) {
      std::size_t t = state.rows - 1;
      if (RowOf(t)[s].status < 0) continue;
      while (t > 0 && RowOf(t)[s].status == feature_status::kTracked) --t;
      begun[t].push_back(s);
    }
    for (const auto& [t, slots] : begun) {
      std::vector<tracking_feature<float>> seeds(slots_);
      for (auto& cell : seeds) cell.status = feature_status::kEmpty;
      for (const std::size_t s : slots) seeds[s] = RowOf(t)[s];
      source_.LookBack(t, current_, scratch_);
      tracker_.InitialiseSeeds(current_, seeds.data());
    }
    source_.LookBack(state.rows - 1, previous_, scratch_);
    tracker_.SetStates(state.slots);
  }

  // Rows [first, end).
  void Rows(std::size_t first, std::size_t end, std::vector<TrackingStatistics>* statistics,
            RunWatcher* watcher) {
    for (std::size_t t = first; t < end; ++t) {
      TrackingStatistics frame = Row(t);
      if (statistics != nullptr) statistics->push_back(std::move(frame));
      if (watcher != nullptr && watcher->Wants(t + 1)) watcher->Take({t + 1, tracker_.States()});
    }
  }

 private:
  tracking_feature<float>* RowOf(std::size_t t) { return table_.features->data() + t * slots_; }

  FrameSource& source_;
  AllFeatures& table_;
  const std::size_t slots_;
  const std::size_t levels_;
  FeatureSelector selector_;
  FeatureTracker tracker_;
  ImagePyramid previous_, current_;
  std::vector<float> scratch_;
};

}  // namespace

void TrackFrames(FrameSource& source, const SelectorParams& selector_params,
                 const TrackerParams& tracker_params, AllFeatures& all_features,
                 std::vector<TrackingStatistics>* statistics, RunWatcher* watcher) {
  const std::size_t frame_count = source.frame_count();
  const auto feature_count = static_cast<std::size_t>(selector_params.max_count);
  all_features.feature_count = static_cast<std::int32_t>(feature_count);
  all_features.frame_count = static_cast<std::int32_t>(frame_count);
  *all_features.features = TrackCells(feature_count * frame_count);
  if (statistics != nullptr) statistics->clear();
  if (frame_count == 0) return;
  Run(source, selector_params, tracker_params, all_features)
      .Rows(0, frame_count, statistics, watcher);
  RemoveShortTracks(all_features, tracker_params.kill_tracks_shorter_than);
}

void GoOnTracking(FrameSource& source, const SelectorParams& selector_params,
                  const TrackerParams& tracker_params, AllFeatures& all_features,
                  const RunState& state, RunWatcher* watcher) {
  const std::size_t frame_count = source.frame_count();
  const std::size_t states = tracker_params.affine_verification ? selector_params.max_count : 0;
  if (state.rows < 1 || state.rows >= frame_count || state.slots.size() != states ||
      all_features.features->size() != frame_count * selector_params.max_count) {
    throw std::invalid_argument("a run of other settings");
  }
  Run run(source, selector_params, tracker_params, all_features);
  run.StandAt(state);
  run.Rows(state.rows, frame_count, nullptr, watcher);
  RemoveShortTracks(all_features, tracker_params.kill_tracks_shorter_than);
}

}  // namespace marrow::tracking
