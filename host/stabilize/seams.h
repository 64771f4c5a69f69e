#pragma once

#include <array>
#include <cstdint>
#include <vector>

#include "host/stabilize/warped_plane.h"

namespace calmframe::host {

// Whether what is laid behind a frame goes on from it: the same tracks lie at the same places.
// Somebody near who crosses an edge, and depth, make them differ; then he is seen twice. Refers to
// the plane.
class Seams {
 public:
  explicit Seams(const WarpedPlane& plane);

  // By a neighbour in the plane, for the top, right, bottom and left side of its frame: whether
  // most of the tracks in the fifth of the frame along that side lie elsewhere by two hundredths of
  // the width. Without any, none does.
  std::array<bool, 4> TornBy(const SolvedClip::Neighbour& neighbour) const;

 private:
  const WarpedPlane& plane_;
  // Which track is in a cell of the clip's table: the row that it began in; -1 of none. Deleted
  // ones count: they tell what moves against the rest.
  std::vector<std::int32_t> begins_;
};

}  // namespace calmframe::host
