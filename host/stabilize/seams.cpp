#include "host/stabilize/seams.h"

#include <algorithm>
#include <cmath>
#include <cstddef>
#include <utility>

namespace calmframe::host {

const Seams::Row& Seams::RowOf(std::int32_t frame) {
  while (first_ + static_cast<std::int32_t>(rows_.size()) <= frame) {
    const std::int32_t next = first_ + static_cast<std::int32_t>(rows_.size());
    TrackRow tracks = plane_.clip().TracksOf(static_cast<std::size_t>(next));
    Row row{std::move(tracks.places), std::vector<std::int32_t>(tracks.statuses.size(), -1)};
    for (std::size_t s = 0; s < row.begins.size(); ++s) {
      const std::int32_t status = tracks.statuses[s];
      if (status > 0 || status == kDeletedTrackBegins) {
        row.begins[s] = next;
      } else if ((status == 0 || status == kDeletedTrackGoesOn) && !rows_.empty()) {
        row.begins[s] = rows_.back().begins[s];
      }
    }
    rows_.push_back(std::move(row));
    // The last row stays: the next one goes on from it.
    for (; rows_.size() > 1 && first_ < kept_from_; ++first_) rows_.pop_front();
  }
  return rows_[static_cast<std::size_t>(frame - first_)];
}

std::array<bool, 4> Seams::TornBy(const SolvedClip::Neighbour& neighbour, const PlaneFrame& in,
                                  int reach) {
  constexpr double kAlong = 0.2;
  // With 0.01 hardly anything was left to fill on a walking selfie, and with 0.03 a running clip
  // showed a quarter of some frames torn.
  constexpr double kElsewhere = 0.02;
  const SolvedClip& clip = plane_.clip();
  const Point middle = Middle(clip);
  const double right = clip.source_width - 1.0, bottom = clip.source_height - 1.0;
  const double square = (clip.width - 1) / right;
  kept_from_ = neighbour.in - reach;
  RowOf(std::max(neighbour.in, neighbour.frame));
  const Row &here = RowOf(neighbour.in), &there = RowOf(neighbour.frame);
  std::array<int, 4> tracks{}, elsewhere{};
  for (std::size_t s = 0; s < here.begins.size(); ++s) {
    if (here.begins[s] < 0 || here.begins[s] != there.begins[s]) continue;
    const Point& p = here.places[s];
    const std::array<bool, 4> along = {p.y<kAlong * bottom, p.x>(1 - kAlong) * right,
                                       p.y > (1 - kAlong) * bottom, p.x < kAlong * right};
    if (std::none_of(along.begin(), along.end(), [](bool is) { return is; })) continue;
    const Point at = in.At(p);
    const Point laid =
        Apply(neighbour.plane_from_frame, {there.places[s].x * square, there.places[s].y});
    const double off = std::hypot(laid.x - middle.x - at.x, laid.y - middle.y - at.y);
    for (std::size_t side = 0; side < 4; ++side) {
      if (!along[side]) continue;
      ++tracks[side];
      if (!(off < kElsewhere * clip.width)) ++elsewhere[side];
    }
  }
  std::array<bool, 4> torn{};
  for (std::size_t side = 0; side < 4; ++side) torn[side] = 2 * elsewhere[side] > tracks[side];
  return torn;
}

}  // namespace calmframe::host
