#pragma once

#include <compare>
#include <cstdint>
#include <set>

#include "tracking/track_store.h"

// Tracks that the user deleted: a deleted track keeps its place and its positions in the table, and
// its statuses tell that nobody is to read it.
namespace marrow::tracking {

// A cell of a table by its absolute frame. Ordered by frame, then by slot.
struct TrackPoint {
  std::int32_t frame;
  std::int32_t slot;

  auto operator<=>(const TrackPoint&) const = default;
};
using TrackPoints = std::set<TrackPoint>;

// The seeds of the tracks that the points lie on. A point stands for the last track that was seeded
// in its slot at or before its frame, deleted or not, even when that track has ended; one outside
// the table, or before its slot's first seed, for none.
TrackPoints SeedsOf(const AllFeatures& table, const TrackPoints& points);

// The table in which exactly the tracks that the points lie on are deleted, whatever is deleted in
// the given one: their seeds are kDeletedSeed, their further cells kDeletedTracked. A seed that
// comes back has status 1, whichever it had. The given cells stay as they are; where nothing
// changes, the result shares them.
AllFeatures ApplyDeletedTrackPoints(const AllFeatures& table, const TrackPoints& points);

// The seeds of the tracks that are deleted in the table.
TrackPoints DeletedSeeds(const AllFeatures& table);

}  // namespace marrow::tracking
