#include "host/stabilize/warped_plane.h"

#include <algorithm>
#include <cmath>

namespace calmframe::host {

Point Middle(const SolvedClip& clip) {
  return {(clip.width - 1) / 2.0, (clip.height - 1) / 2.0};
}

WarpedPlane::WarpedPlane(const SolvedClip& clip, Warps warps)
    : clip_(clip),
      vertices_(warps == Warps::solved ? clip.vertices : GridAtRest(clip)),
      of_frame_(warps == Warps::solved
                    ? vertices_.size() / static_cast<std::size_t>(clip.frame_count)
                    : 0) {
  const Point middle = Middle(clip);
  for (Point& vertex : vertices_) {
    vertex.x -= middle.x;
    vertex.y -= middle.y;
  }
}

Point WarpedPlane::At(std::size_t frame, Point source) const {
  const WarpView warp = Warp(frame);
  const double u = source.x / (clip_.source_width - 1.0) * (clip_.columns - 1);
  const double v = source.y / (clip_.source_height - 1.0) * (clip_.rows - 1);
  const int c = static_cast<int>(std::clamp(u, 0.0, clip_.columns - 2.0));
  const int r = static_cast<int>(std::clamp(v, 0.0, clip_.rows - 2.0));
  const double fx = u - c, fy = v - r;
  const auto mix = [&](double Point::*axis) {
    return (warp.at(c, r).*axis * (1 - fx) + warp.at(c + 1, r).*axis * fx) * (1 - fy) +
           (warp.at(c, r + 1).*axis * (1 - fx) + warp.at(c + 1, r + 1).*axis * fx) * fy;
  };
  return {mix(&Point::x), mix(&Point::y)};
}

double WarpedPlane::Scale(std::size_t frame) const {
  const WarpView warp = Warp(frame);
  double twice = 0;
  const auto add = [&](const Point& p, const Point& q) { twice += p.x * q.y - q.x * p.y; };
  for (int c = 0; c + 1 < warp.columns; ++c) {
    add(warp.at(c, 0), warp.at(c + 1, 0));
    add(warp.at(c + 1, warp.rows - 1), warp.at(c, warp.rows - 1));
  }
  for (int r = 0; r + 1 < warp.rows; ++r) {
    add(warp.at(warp.columns - 1, r), warp.at(warp.columns - 1, r + 1));
    add(warp.at(0, r + 1), warp.at(0, r));
  }
  const double area = (clip_.width - 1.0) * (clip_.height - 1.0);
  return std::sqrt(std::max(twice / 2 / area, 0.0));
}

}  // namespace calmframe::host
