#pragma once

#include <algorithm>
#include <boost/make_shared.hpp>
#include <cstdint>
#include <utility>
#include <vector>

#include "stabilization/warp/cp_warper.h"
#include "stabilization/warp/frame_map.h"

namespace kelp::effect {

// One record a frame that moves the rest grid; solved, as far as anybody can tell. With a map of
// that radius, each frame lies by its own shift in every other's output too.
inline boost::shared_ptr<const marrow::stabilization::CPWarper> ShiftingWarper(
    int width, int height, const std::vector<marrow::stabilization::point2>& shifts,
    std::int32_t map_radius = 0) {
  const auto warper = boost::make_shared<marrow::stabilization::CPWarper>(
      static_cast<std::int32_t>(shifts.size()), width, height);
  for (const auto& shift : shifts) {
    const auto record = boost::make_shared<marrow::stabilization::VarVector>(warper->gridCols(),
                                                                             warper->gridRows());
    for (std::size_t i = 0; i < record->values.size(); i += 2) {
      const auto vertex = static_cast<std::int32_t>(i / 2);
      record->values[i] = (vertex % record->cols) * warper->cellWidth() + shift.x;
      record->values[i + 1] = (vertex / record->cols) * warper->cellHeight() + shift.y;
    }
    warper->storeFrameWarp(*record);
  }
  marrow::stabilization::MtoNMap::entries_t entries;
  const auto count = static_cast<std::int32_t>(shifts.size());
  for (std::int32_t M = 0; M < count; ++M) {
    for (std::int32_t N = std::max(M - map_radius, 0); N <= std::min(M + map_radius, count - 1);
         ++N) {
      const auto& shift = shifts[static_cast<std::size_t>(M)];
      if (M != N) entries[{M, N}] = {1, 0, shift.x, 0, 1, shift.y, 0, 0, 1};
    }
  }
  warper->setFrameMap(
      boost::make_shared<marrow::stabilization::MtoNMap>(count, map_radius, std::move(entries)));
  return warper;
}

}  // namespace kelp::effect
