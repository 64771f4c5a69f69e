#include "tracking/track_store.h"

#include <algorithm>
#include <boost/make_shared.hpp>

namespace marrow::tracking {

AllFeatures::AllFeatures() : features(boost::make_shared<TrackCells>()) {}

void AllFeatures::ReadRow(std::size_t row, tracking_feature<float>* cells) const {
  if (packed) return packed->Read(row, cells);
  const auto slots = static_cast<std::size_t>(feature_count);
  std::copy_n(features->data() + row * slots, slots, cells);
}

boost::shared_ptr<const TrackCells> CellsOf(const AllFeatures& table) {
  if (!table.packed) return table.features;
  const auto slots = static_cast<std::size_t>(table.feature_count);
  const auto cells = boost::make_shared<TrackCells>(table.packed->rows() * slots);
  for (std::size_t row = 0; row < table.packed->rows(); ++row) {
    table.packed->Read(row, cells->data() + row * slots);
  }
  return cells;
}

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
