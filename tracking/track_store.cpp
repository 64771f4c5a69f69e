#include "tracking/track_store.h"

#include <boost/make_shared.hpp>

namespace marrow::tracking {

AllFeatures::AllFeatures() : features(boost::make_shared<TrackCells>()) {}

void RemoveShortTracks(AllFeatures& all_features, std::int32_t kill_tracks_shorter_than) {
  if (kill_tracks_shorter_than == 0) return;
  const std::size_t feature_count = static_cast<std::size_t>(all_features.feature_count);
  auto& cells = *all_features.features;
  for (const Trajectory& track : BuildTrajectories(
           cells.data(), feature_count, static_cast<std::size_t>(all_features.frame_count))) {
    if (track.last - track.first >= kill_tracks_shorter_than) continue;
    for (std::int32_t f = track.first; f < track.last; ++f) {
      auto& cell = cells[static_cast<std::size_t>(f) * feature_count +
                         static_cast<std::size_t>(track.feature)];
      cell.x = 0.0f;
      cell.status = feature_status::kRejectedCorrelation;
    }
  }
}

void ShortenTable(AllFeatures& all_features, std::int64_t rows,
                  std::int32_t kill_tracks_shorter_than) {
  if (rows >= all_features.frame_count) return;
  const auto& cells = *all_features.features;
  all_features.features = boost::make_shared<TrackCells>(
      cells.begin(), cells.begin() + rows * all_features.feature_count);
  all_features.frame_count = static_cast<std::int32_t>(rows);
  RemoveShortTracks(all_features, kill_tracks_shorter_than);
}

}  // namespace marrow::tracking
