#pragma once

#include <cstdint>
#include <map>
#include <utility>

#include "stabilization/models/matrix3.h"

namespace marrow::stabilization {

// The motions from a source frame M to the output of a nearby frame N, all fitted at the end of a
// solve so that renders need no tracks. Read-only once built, from any thread.
class MtoNMap {
 public:
  // (M, N), ordered by M and then N.
  using entries_t = std::map<std::pair<std::int32_t, std::int32_t>, matrix3>;

  // Made by CPWarper::makeFrameMap, or read from a project.
  MtoNMap(std::int32_t frameCount, std::int32_t radius, entries_t entries);

  // False when M equals N or where there is no entry.
  bool lookup(std::int32_t M, std::int32_t N, matrix3& output_n_from_source_m) const;

  std::int32_t frameCount() const { return frameCount_; }
  std::int32_t radius() const { return radius_; }
  const entries_t& entries() const { return entries_; }

 private:
  std::int32_t frameCount_;
  std::int32_t radius_;
  entries_t entries_;
};

}  // namespace marrow::stabilization
