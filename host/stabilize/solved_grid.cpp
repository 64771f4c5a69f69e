#include "host/stabilize/solved_grid.h"

#include <algorithm>
#include <cmath>
#include <cstdint>

namespace calmframe::host {
namespace {

// The map of the unit square onto a quadrilateral, corners in the order (0,0), (1,0), (0,1), (1,1)
// (Heckbert, Fundamentals of Texture Mapping and Image Warping, 1989). As the effect takes it:
// affine, without the last corner's say, where in x or in y the corners are a parallelogram.
class SquareToQuad {
 public:
  explicit SquareToQuad(const std::array<Point, 4>& p) : origin_(p[0]) {
    const Point sum = {p[0].x - p[1].x + p[3].x - p[2].x, p[0].y - p[1].y + p[3].y - p[2].y};
    if (std::fabs(sum.x) < 1e-5 || std::fabs(sum.y) < 1e-5) {
      u_ = {p[1].x - p[0].x, p[1].y - p[0].y};
      v_ = {p[3].x - p[1].x, p[3].y - p[1].y};
      return;
    }
    const Point d1 = {p[1].x - p[3].x, p[1].y - p[3].y};
    const Point d2 = {p[2].x - p[3].x, p[2].y - p[3].y};
    const double determinant = d1.x * d2.y - d2.x * d1.y;
    g_ = (sum.x * d2.y - d2.x * sum.y) / determinant;
    h_ = (d1.x * sum.y - sum.x * d1.y) / determinant;
    u_ = {p[1].x - p[0].x + g_ * p[1].x, p[1].y - p[0].y + g_ * p[1].y};
    v_ = {p[2].x - p[0].x + h_ * p[2].x, p[2].y - p[0].y + h_ * p[2].y};
  }

  Point operator()(double u, double v) const {
    const double w = g_ * u + h_ * v + 1;
    return {(u_.x * u + v_.x * v + origin_.x) / w, (u_.y * u + v_.y * v + origin_.y) / w};
  }

 private:
  Point origin_, u_, v_;
  double g_ = 0, h_ = 0;
};

// Steps of an offset from that map. It is a float before it is steps.
constexpr float kStepsPerPixel = 256;

std::int32_t Steps(double offset) {
  constexpr float kMostSteps = 2147483520;  // the largest float that fits
  const float steps = static_cast<float>(offset) * kStepsPerPixel;
  if (std::isnan(steps)) return 0;
  return static_cast<std::int32_t>(std::round(std::clamp(steps, -kMostSteps, kMostSteps)));
}

}  // namespace

WarpGrid::WarpGrid(std::size_t columns, std::size_t rows)
    : vertices_(columns * rows),
      columns_(columns),
      rows_(rows),
      corners_{0, columns - 1, columns * (rows - 1), columns * rows - 1} {}

template <class Visit>
void WarpGrid::ForEach(const std::array<Point, 4>& corners, const Visit& visit) {
  const SquareToQuad quad(corners);
  for (std::size_t r = 0; r < rows_; ++r) {
    const double v = static_cast<double>(r) / static_cast<double>(rows_ - 1);
    for (std::size_t c = 0; c < columns_; ++c) {
      const double u = static_cast<double>(c) / static_cast<double>(columns_ - 1);
      visit(vertices_[r * columns_ + c], quad(u, v));
    }
  }
}

void WarpGrid::Take(const StoredWarp& warp) {
  const std::int32_t* next = warp.offsets.data();
  ForEach(warp.corners, [&](Point& vertex, Point flat) {
    vertex = {static_cast<double>(static_cast<float>(next[0]) / kStepsPerPixel) + flat.x,
              static_cast<double>(static_cast<float>(next[1]) / kStepsPerPixel) + flat.y};
    next += 2;
  });
  for (std::size_t i = 0; i < warp.corners.size(); ++i) corner(i) = warp.corners[i];
}

StoredWarp WarpGrid::Stored() {
  StoredWarp warp{{corner(0), corner(1), corner(2), corner(3)}, {}};
  warp.offsets.reserve(2 * vertices_.size());
  ForEach(warp.corners, [&](const Point& vertex, Point flat) {
    warp.offsets.push_back(Steps(vertex.x - flat.x));
    warp.offsets.push_back(Steps(vertex.y - flat.y));
  });
  return warp;
}

void WarpGrid::Rest(double width, double height) {
  const Point far = {width - 1, height - 1};
  ForEach({Point{}, {far.x, 0}, {0, far.y}, far},
          [](Point& vertex, const Point& flat) { vertex = flat; });
}

std::array<Point, 4> WarpGrid::CellOf(std::size_t corner) const {
  const std::size_t left = corner % 2 == 0 ? 0 : columns_ - 2;
  const std::size_t at = (corner < 2 ? 0 : rows_ - 2) * columns_ + left;
  return {vertices_[at], vertices_[at + 1], vertices_[at + columns_], vertices_[at + columns_ + 1]};
}

void OutlineBounds::Add(const Point* vertices, std::size_t columns, std::size_t rows) {
  for (std::size_t r = 0; r < rows; ++r) {
    const bool whole = r == 0 || r == rows - 1;
    for (std::size_t c = 0; c < columns; c += whole ? 1 : columns - 1) {
      const Point& p = vertices[r * columns + c];
      if (p.x < least.x) least.x = p.x;
      if (p.y < least.y) least.y = p.y;
      if (p.x > most.x) most.x = p.x;
      if (p.y > most.y) most.y = p.y;
    }
  }
}

OutlineBounds BoundsOf(const SolvedClip& clip) {
  OutlineBounds bounds;
  std::vector<Point> vertices;
  for (std::size_t f = 0; f < static_cast<std::size_t>(clip.frame_count); ++f) {
    clip.frames->ReadVertices(f, vertices);
    bounds.Add(vertices.data(), static_cast<std::size_t>(clip.columns),
               static_cast<std::size_t>(clip.rows));
  }
  return bounds;
}

double Tame(double coordinate) {
  constexpr double kFarthest = 1 << 30;
  return std::clamp(coordinate, -kFarthest, kFarthest);
}

}  // namespace calmframe::host
