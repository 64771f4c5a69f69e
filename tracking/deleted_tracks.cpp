#include "tracking/deleted_tracks.h"

#include <boost/make_shared.hpp>

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

// visit(frame, slot, index) for each cell, along memory; frames are absolute.
template <class Visit>
void ForEachCell(const AllFeatures& table, const Visit& visit) {
  std::size_t index = 0;
  for (std::int32_t row = 0; row < table.frame_count; ++row) {
    for (std::int32_t slot = 0; slot < table.feature_count; ++slot) {
      visit(table.first_frame + row, slot, index++);
    }
  }
}

}  // namespace

TrackPoints SeedsOf(const AllFeatures& table, const TrackPoints& points) {
  TrackPoints seeds;
  for (const TrackPoint& point : points) {
    if (point.slot < 0 || point.slot >= table.feature_count) continue;
    std::int64_t row = std::int64_t{point.frame} - table.first_frame;
    if (row < 0 || row >= table.frame_count) continue;
    const auto status = [&] {
      return (*table.features)[static_cast<std::size_t>(row * table.feature_count + point.slot)]
          .status;
    };
    while (row >= 0 && !IsSeed(status())) --row;
    if (row < 0) continue;
    seeds.insert({static_cast<std::int32_t>(table.first_frame + row), point.slot});
  }
  return seeds;
}

AllFeatures ApplyDeletedTrackPoints(const AllFeatures& table, const TrackPoints& points) {
  const TrackPoints seeds = SeedsOf(table, points);
  AllFeatures result = table;
  std::vector<char> deleted(static_cast<std::size_t>(table.feature_count), 0);  // a slot's track
  ForEachCell(table, [&](std::int32_t frame, std::int32_t slot, std::size_t index) {
    const std::int32_t status = (*table.features)[index].status;
    char& flag = deleted[static_cast<std::size_t>(slot)];
    if (IsSeed(status)) flag = seeds.count({frame, slot}) ? 1 : 0;
    const std::int32_t marked = Marked(status, flag != 0);
    if (marked == status) return;
    if (result.features == table.features) {
      result.features = boost::make_shared<TrackCells>(*table.features);
    }
    (*result.features)[index].status = marked;
  });
  return result;
}

TrackPoints DeletedSeeds(const AllFeatures& table) {
  TrackPoints seeds;
  ForEachCell(table, [&](std::int32_t frame, std::int32_t slot, std::size_t index) {
    if ((*table.features)[index].status == feature_status::kDeletedSeed) {
      seeds.insert({frame, slot});
    }
  });
  return seeds;
}

}  // namespace marrow::tracking
