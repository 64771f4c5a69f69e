#include "host/stabilize/seams.h"

#include <algorithm>
#include <cmath>
#include <cstddef>

namespace calmframe::host {

Seams::Seams(const WarpedPlane& plane) : plane_(plane), begins_(plane.clip().statuses.size(), -1) {
  constexpr std::int32_t kBeginsDeleted = -10, kGoesOnDeleted = -11;
  const SolvedClip& clip = plane.clip();
  const auto slots = static_cast<std::size_t>(clip.slots);
  for (std::size_t i = 0; i < begins_.size(); ++i) {
    const std::int32_t status = clip.statuses[i];
    if (status > 0 || status == kBeginsDeleted) {
      begins_[i] = static_cast<std::int32_t>(i / slots);
    } else if ((status == 0 || status == kGoesOnDeleted) && i >= slots) {
      begins_[i] = begins_[i - slots];
    }
  }
}

std::array<bool, 4> Seams::TornBy(const SolvedClip::Neighbour& neighbour) const {
  constexpr double kAlong = 0.2;
  // With 0.01 hardly anything was left to fill on a walking selfie, and with 0.03 a running clip
  // showed a quarter of some frames torn.
  constexpr double kElsewhere = 0.02;
  const SolvedClip& clip = plane_.clip();
  const Point middle = Middle(clip);
  const double right = clip.source_width - 1.0, bottom = clip.source_height - 1.0;
  const double square = (clip.width - 1) / right;
  const auto slots = static_cast<std::size_t>(clip.slots);
  const auto in = static_cast<std::size_t>(neighbour.in);
  const auto frame = static_cast<std::size_t>(neighbour.frame);
  std::array<int, 4> tracks{}, elsewhere{};
  for (std::size_t here = in * slots, there = frame * slots; here < (in + 1) * slots;
       ++here, ++there) {
    if (begins_[here] < 0 || begins_[here] != begins_[there]) continue;
    const Point& p = clip.tracks[here];
    const std::array<bool, 4> along = {p.y<kAlong * bottom, p.x>(1 - kAlong) * right,
                                       p.y > (1 - kAlong) * bottom, p.x < kAlong * right};
    if (std::none_of(along.begin(), along.end(), [](bool is) { return is; })) continue;
    const Point at = plane_.At(in, p);
    const Point laid =
        Apply(neighbour.plane_from_frame, {clip.tracks[there].x * square, clip.tracks[there].y});
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
