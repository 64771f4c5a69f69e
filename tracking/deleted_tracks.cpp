#include "tracking/deleted_tracks.h"

#include <algorithm>
#include <boost/make_shared.hpp>
#include <limits>
#include <vector>

namespace marrow::tracking {
namespace {

bool IsSeed(std::int32_t status) {
  return status > 0 || status == feature_status::kDeletedSeed;
}

std::int32_t Marked(std::int32_t status, bool deleted) {
  if (deleted) {
    if (status > 0) return feature_status::kDeletedSeed;
    return status == feature_status::kTracked ? feature_status::kDeletedTracked : status;
  }
  if (status == feature_status::kDeletedSeed) return 1;
  return status == feature_status::kDeletedTracked ? feature_status::kTracked : status;
}

// visit(row, cells) for each row of the table.
template <class Visit>
void ForEachRow(const AllFeatures& table, const Visit& visit) {
  std::vector<tracking_feature<float>> cells(static_cast<std::size_t>(table.feature_count));
  for (std::int32_t row = 0; row < table.frame_count; ++row) {
    table.ReadRow(static_cast<std::size_t>(row), cells.data());
    visit(row, cells);
  }
}

std::vector<std::int32_t> StatusesOf(const std::vector<tracking_feature<float>>& cells) {
  std::vector<std::int32_t> statuses;
  for (const auto& cell : cells) statuses.push_back(cell.status);
  return statuses;
}

}  // namespace

TrackPoints SeedsOf(const AllFeatures& table, const TrackPoints& points) {
  TrackPoints seeds;
  if (points.empty()) return seeds;
  std::vector<std::int32_t> last(static_cast<std::size_t>(table.feature_count), -1);  // of a slot
  // Points ahead of the table are none; from there on they come by frame.
  auto point = points.lower_bound({table.first_frame, std::numeric_limits<std::int32_t>::min()});
  ForEachRow(table, [&](std::int32_t row, const auto& cells) {
    for (std::size_t slot = 0; slot < cells.size(); ++slot) {
      if (IsSeed(cells[slot].status)) last[slot] = row;
    }
    for (; point != points.end() && point->frame == table.first_frame + row; ++point) {
      if (point->slot < 0 || point->slot >= table.feature_count) continue;
      const std::int32_t seed = last[static_cast<std::size_t>(point->slot)];
      if (seed >= 0) seeds.insert({table.first_frame + seed, point->slot});
    }
  });
  return seeds;
}

AllFeatures ApplyDeletedTrackPoints(const AllFeatures& table, const TrackPoints& points) {
  const TrackPoints seeds = SeedsOf(table, points);
  AllFeatures result = table;
  boost::shared_ptr<PackedCells> marked_rows;  // of a packed table, from the first change on
  std::vector<char> deleted(static_cast<std::size_t>(table.feature_count), 0);  // a slot's track
  ForEachRow(table, [&](std::int32_t row, auto& cells) {
    bool changed = false;
    for (std::int32_t slot = 0; slot < table.feature_count; ++slot) {
      std::int32_t& status = cells[static_cast<std::size_t>(slot)].status;
      char& flag = deleted[static_cast<std::size_t>(slot)];
      if (IsSeed(status)) flag = seeds.count({table.first_frame + row, slot}) ? 1 : 0;
      const std::int32_t marked = Marked(status, flag != 0);
      changed = changed || marked != status;
      status = marked;
    }
    if (!changed) return;
    if (!table.packed) {
      if (result.features == table.features) {
        result.features = boost::make_shared<TrackCells>(*table.features);
      }
      std::copy(cells.begin(), cells.end(), result.features->begin() + row * table.feature_count);
      return;
    }
    if (!marked_rows) marked_rows = boost::make_shared<PackedCells>(*table.packed);
    marked_rows->SetStatuses(static_cast<std::size_t>(row), StatusesOf(cells));
  });
  if (marked_rows) result.packed = marked_rows;
  return result;
}

TrackPoints DeletedSeeds(const AllFeatures& table) {
  TrackPoints seeds;
  ForEachRow(table, [&](std::int32_t row, const auto& cells) {
    for (std::int32_t slot = 0; slot < table.feature_count; ++slot) {
      if (cells[static_cast<std::size_t>(slot)].status == feature_status::kDeletedSeed) {
        seeds.insert({table.first_frame + row, slot});
      }
    }
  });
  return seeds;
}

}  // namespace marrow::tracking
