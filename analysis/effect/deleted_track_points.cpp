#include "analysis/effect/deleted_track_points.h"

#include <cstring>
#include <vector>

#include "analysis/src/mix_hash_guid.h"

namespace kelp::analysis::effect {

using marrow::tracking::TrackPoint;
using marrow::tracking::TrackPoints;

DeletedTrackPoints::Key DeletedTrackPoints::KeyOf(const TrackPoint& point) {
  return Key{static_cast<std::uint32_t>(point.frame)} << 32 |
         static_cast<std::uint32_t>(point.slot);
}

DeletedTrackPoints::DeletedTrackPoints(const TrackPoints& points) {
  for (const TrackPoint& point : points) Add(point);
}

DeletedTrackPoints::DeletedTrackPoints(const void* flat, std::size_t size) {
  for (std::size_t at = 0; at + sizeof(Key) <= size; at += sizeof(Key)) {
    Key key;
    std::memcpy(&key, static_cast<const char*>(flat) + at, sizeof key);
    keys_.insert(key);
  }
}

void DeletedTrackPoints::Flatten(void* flat) const {
  char* to = static_cast<char*>(flat);
  for (const Key key : keys_) {
    std::memcpy(to, &key, sizeof key);
    to += sizeof key;
  }
}

tessel::utility::Guid DeletedTrackPoints::Identity() const {
  MixHashGuid mix("DeletedTrackPoints");
  for (const Key key : keys_) mix.AddValue(key);
  return mix.Finish();
}

TrackPoints DeletedTrackPoints::Points() const {
  TrackPoints points;
  for (const Key key : keys_) {
    points.insert({static_cast<std::int32_t>(key >> 32), static_cast<std::int32_t>(key)});
  }
  return points;
}

}  // namespace kelp::analysis::effect
