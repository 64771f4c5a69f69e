#pragma once

#include <array>
#include <cstdint>
#include <deque>
#include <vector>

#include "host/stabilize/warped_plane.h"

namespace calmframe::host {

// Whether what is laid behind a frame goes on from it: the same tracks lie at the same places.
// Somebody near who crosses an edge, and depth, make them differ; then he is seen twice. Refers to
// the plane.
class Seams {
 public:
  explicit Seams(const WarpedPlane& plane) : plane_(plane) {}

  // By a neighbour in the plane, for the top, right, bottom and left side of its frame, which is
  // `in`: whether most of the tracks in the fifth of the frame along that side lie elsewhere by two
  // hundredths of the width. Without any, none does. Frames are to be asked for in ascending order:
  // only what neighbours within `reach` frames call for is kept.
  std::array<bool, 4> TornBy(const SolvedClip::Neighbour& neighbour, const PlaneFrame& in,
                             int reach);

 private:
  struct Row {
    std::vector<Point> places;
    // Which track is in a slot: the row that it began in; -1 of none. Deleted ones count: they tell
    // what moves against the rest.
    std::vector<std::int32_t> begins;
  };
  const Row& RowOf(std::int32_t frame);

  const WarpedPlane& plane_;
  std::deque<Row> rows_;
  std::int32_t first_ = 0;  // frame of rows_'s first
  std::int32_t kept_from_ = 0;
};

}  // namespace calmframe::host
