#pragma once

#include <compare>
#include <cstddef>
#include <cstdint>
#include <set>

#include "platform/tessel/guid.h"
#include "tracking/deleted_tracks.h"

namespace kelp::analysis::effect {

// The points on tracks that the user deleted, as a parameter of the host keeps them; which tracks
// they mean is SeedsOf's matter. A key has the absolute frame in its upper 32 bits and the slot in
// its lower ones, so that keys sort by frame, then by slot; frames are never below 0.
class DeletedTrackPoints {
 public:
  using Key = std::uint64_t;
  static Key KeyOf(const marrow::tracking::TrackPoint& point);

  DeletedTrackPoints() = default;
  explicit DeletedTrackPoints(const marrow::tracking::TrackPoints& points);
  DeletedTrackPoints(const DeletedTrackPoints&) = default;
  DeletedTrackPoints& operator=(const DeletedTrackPoints&) = default;
  virtual ~DeletedTrackPoints() = default;

  // The flat form: the keys in order, 8 little-endian bytes each. Read from bytes, keys may come in
  // any order; bytes behind the last whole key are not looked at.
  DeletedTrackPoints(const void* flat, std::size_t size);
  std::size_t FlatSize() const { return keys_.size() * sizeof(Key); }
  void Flatten(void* flat) const;

  // Of the keys; nil for the empty set.
  tessel::utility::Guid Identity() const;

  bool empty() const { return keys_.empty(); }
  const std::set<Key>& keys() const { return keys_; }
  void Add(const marrow::tracking::TrackPoint& point) { keys_.insert(KeyOf(point)); }
  marrow::tracking::TrackPoints Points() const;

  bool operator==(const DeletedTrackPoints& other) const { return keys_ == other.keys_; }
  // Key by key.
  auto operator<=>(const DeletedTrackPoints& other) const { return keys_ <=> other.keys_; }

 private:
  std::set<Key> keys_;
};

}  // namespace kelp::analysis::effect
