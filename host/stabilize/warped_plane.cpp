#include "host/stabilize/warped_plane.h"

#include <algorithm>
#include <cmath>
#include <limits>
#include <memory>
#include <utility>
#include <vector>

namespace calmframe::host {

Point Middle(const SolvedClip& clip) {
  return {(clip.width - 1) / 2.0, (clip.height - 1) / 2.0};
}

namespace {

PlaneFrame::Vertices AboutMiddle(const SolvedClip& clip, std::vector<Point> vertices) {
  const Point middle = Middle(clip);
  for (Point& vertex : vertices) {
    vertex.x -= middle.x;
    vertex.y -= middle.y;
  }
  return std::make_shared<const std::vector<Point>>(std::move(vertices));
}

}  // namespace

WarpedPlane::WarpedPlane(const SolvedClip& clip, Warps warps)
    : clip_(clip), rest_(warps == Warps::none ? AboutMiddle(clip, GridAtRest(clip)) : nullptr) {}

PlaneFrame WarpedPlane::Frame(std::size_t frame) const {
  return {clip_, rest_ ? rest_ : AboutMiddle(clip_, clip_.VerticesOf(frame))};
}

Point PlaneFrame::At(Point source) const {
  const WarpView warp = Warp();
  const double u = source.x / (clip_->source_width - 1.0) * (clip_->columns - 1);
  const double v = source.y / (clip_->source_height - 1.0) * (clip_->rows - 1);
  const int c = static_cast<int>(std::clamp(u, 0.0, clip_->columns - 2.0));
  const int r = static_cast<int>(std::clamp(v, 0.0, clip_->rows - 2.0));
  const double fx = u - c, fy = v - r;
  const auto mix = [&](double Point::*axis) {
    return (warp.at(c, r).*axis * (1 - fx) + warp.at(c + 1, r).*axis * fx) * (1 - fy) +
           (warp.at(c, r + 1).*axis * (1 - fx) + warp.at(c + 1, r + 1).*axis * fx) * fy;
  };
  return {mix(&Point::x), mix(&Point::y)};
}

// Newton's method; from cell to cell the slope hardly changes.
Point PlaneFrame::SourceAt(Point plane) const {
  constexpr int kMostSteps = 30;
  constexpr double kNear = 1e-3;  // pixels
  Point source{(clip_->source_width - 1) / 2.0, (clip_->source_height - 1) / 2.0};
  for (int step = 0; step < kMostSteps; ++step) {
    const Point at = At(source), right = At({source.x + 1, source.y}),
                down = At({source.x, source.y + 1});
    const double xx = right.x - at.x, yx = right.y - at.y;
    const double xy = down.x - at.x, yy = down.y - at.y;
    const double determinant = xx * yy - xy * yx;
    if (!(determinant > 0)) break;
    const Point off{plane.x - at.x, plane.y - at.y};
    const Point by{(off.x * yy - off.y * xy) / determinant,
                   (off.y * xx - off.x * yx) / determinant};
    source = {source.x + by.x, source.y + by.y};
    if (std::hypot(by.x, by.y) < kNear) return source;
  }
  constexpr double kNone = std::numeric_limits<double>::quiet_NaN();
  return {kNone, kNone};
}

double PlaneFrame::Scale() const {
  const WarpView warp = Warp();
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
  const double area = (clip_->width - 1.0) * (clip_->height - 1.0);
  return std::sqrt(std::max(twice / 2 / area, 0.0));
}

}  // namespace calmframe::host
