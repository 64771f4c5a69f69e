#include "host/stabilize/filled_plane.h"

#include <algorithm>
#include <array>
#include <cmath>
#include <cstdlib>
#include <utility>

#include "host/stabilize/seams.h"
#include "host/stabilize/window/clip_windows.h"

namespace calmframe::host {
namespace {

// An upright rectangle.
struct Box {
  double left, top, right, bottom;

  double area() const { return (right - left) * (bottom - top); }
};

using Regions = std::vector<std::vector<HalfPlane>>;

bool Holds(const std::vector<HalfPlane>& region, const Box& box) {
  return std::all_of(region.begin(), region.end(), [&box](const HalfPlane& side) {
    return side.nx * (side.nx > 0 ? box.right : box.left) +
               side.ny * (side.ny > 0 ? box.bottom : box.top) <=
           side.limit;
  });
}

// Area of a box that no region is seen to cover: a piece is covered where one region holds all of
// it, and is halved otherwise, so often.
double Uncovered(const Regions& regions, const Box& box, int halvings) {
  const auto holds = [&box](const auto& region) { return Holds(region, box); };
  if (std::any_of(regions.begin(), regions.end(), holds)) return 0;
  if (halvings == 0) return box.area();
  Box first = box, second = box;
  if (box.right - box.left > box.bottom - box.top) {
    first.right = second.left = (box.left + box.right) / 2;
  } else {
    first.bottom = second.top = (box.top + box.bottom) / 2;
  }
  return Uncovered(regions, first, halvings - 1) + Uncovered(regions, second, halvings - 1);
}

// In a window's coordinates, about its middle, pixels of the plane: along its sides.
Regions Seen(const Regions& regions, const Similarity& window) {
  const double scale = std::hypot(window.a, window.b);
  const double cosine = window.a / scale, sine = window.b / scale;
  Regions seen = regions;
  for (auto& region : seen) {
    for (HalfPlane& side : region) {
      side = {side.nx * cosine + side.ny * sine, side.ny * cosine - side.nx * sine,
              side.limit - side.nx * window.dx - side.ny * window.dy};
    }
  }
  return seen;
}

// Where a motion puts a frame of that size; empty where it is none.
std::vector<HalfPlane> RegionOf(const SolvedClip::Neighbour& neighbour, double width, double height,
                                double rim) {
  const Matrix& m = neighbour.plane_from_frame;
  std::array<Point, 4> corners;
  for (std::size_t i = 0; i < corners.size(); ++i) {
    const double x = i % 2 == 0 ? 0 : width - 1, y = i < 2 ? 0 : height - 1;
    if (!(m[6] * x + m[7] * y + m[8] > 0)) return {};
    const Point at = Apply(m, {x, y});
    corners[i] = {at.x - (width - 1) / 2, at.y - (height - 1) / 2};
  }
  return CoveredRegion({corners.data(), 2, 2}, rim);
}

}  // namespace

double RimOf(double cut, double feather, double boost) {
  // The feather is 2 q^2 up to q = 1/2, where q is 0 a pixel outside of the edge.
  const double needed = 1 / std::max(1.0, std::round(boost));
  const double q = needed <= 0.5 ? std::sqrt(needed / 2) : 1;
  constexpr double kUndrawn = 2;     // nearer to an edge than this the effect draws nothing
  constexpr double kSampling = 0.5;  // how far from its place a pixel is looked up
  return cut + std::max(kUndrawn, q * (feather + 1)) + kSampling;
}

FilledPlane::FilledPlane(const WarpedPlane& plane, const Filling& filling)
    : width_(plane.clip().width),
      height_(plane.clip().height),
      covered_(static_cast<std::size_t>(plane.clip().frame_count)) {
  const auto add = [](Regions& to, std::vector<HalfPlane> region) {
    if (!region.empty()) to.push_back(std::move(region));
  };
  fits_.resize(covered_.size());
  std::vector<SolvedClip::Neighbour> neighbours = NeighboursIn(plane.clip(), plane.warps());
  std::erase_if(neighbours, [&filling](const SolvedClip::Neighbour& neighbour) {
    return std::abs(neighbour.frame - neighbour.in) > filling.reach;
  });
  const auto order = [](const SolvedClip::Neighbour& neighbour) {
    return std::pair(neighbour.in, std::abs(neighbour.frame - neighbour.in));
  };
  std::stable_sort(neighbours.begin(), neighbours.end(),
                   [&](const auto& a, const auto& b) { return order(a) < order(b); });
  Seams seams(plane);
  auto neighbour = neighbours.begin();
  for (std::size_t f = 0; f < covered_.size(); ++f) {
    const PlaneFrame frame = plane.Frame(f);
    const std::vector<HalfPlane> own = CoveredRegion(frame.Warp(), filling.rim);
    add(covered_[f], own);
    add(fits_[f], own);
    std::array<bool, 4> torn_before{}, torn_after{};
    for (; neighbour != neighbours.end() && static_cast<std::size_t>(neighbour->in) == f;
         ++neighbour) {
      std::vector<HalfPlane> region = RegionOf(*neighbour, width_, height_, filling.rim);
      add(covered_[f], region);
      if (region.empty() || own.empty()) continue;
      // What lies behind one that is torn, further away, is hardly seen.
      auto& of_side = neighbour->frame < neighbour->in ? torn_before : torn_after;
      const std::array<bool, 4> by_this = seams.TornBy(*neighbour, frame, filling.reach);
      for (std::size_t side = 0; side < own.size(); ++side) {
        of_side[side] = of_side[side] || by_this[side];
        if (of_side[side]) region.push_back(own[side]);
      }
      add(fits_[f], std::move(region));
    }
  }
}

std::vector<HalfPlane> FilledPlane::RegionAround(std::size_t frame,
                                                 const Similarity& window) const {
  constexpr int kHalvings = 12;        // of a window: pieces of some pixels
  constexpr int kHalvingsOfStrip = 6;  // along a side
  constexpr int kSteps = 33;
  const double step = width_ / 200;
  const double scale = std::hypot(window.a, window.b);
  const Regions regions = Seen(fits_[frame], window);
  // What rounding puts outside of a region is none of its faults.
  constexpr double kRounding = 1e-3;
  Box box{-scale * width_ / 2 + kRounding, -scale * height_ / 2 + kRounding,
          scale * width_ / 2 - kRounding, scale * height_ / 2 - kRounding};
  if (Uncovered(regions, box, kHalvings) > 0) return {};
  struct Way {
    double Box::*side, Box::*opposite;
    double step;
    bool open = true;
  };
  Way ways[] = {{&Box::left, &Box::right, -step},
                {&Box::top, &Box::bottom, -step},
                {&Box::right, &Box::left, step},
                {&Box::bottom, &Box::top, step}};
  // All sides keep pace with each other: where one goes out first, the corners close the others'
  // way.
  for (int i = 0; i < kSteps; ++i) {
    for (Way& way : ways) {
      if (!way.open) continue;
      Box strip = box;
      strip.*way.opposite = box.*way.side;
      strip.*way.side += way.step;
      way.open = Uncovered(regions,
                           {std::min(strip.left, strip.right), std::min(strip.top, strip.bottom),
                            std::max(strip.left, strip.right), std::max(strip.top, strip.bottom)},
                           kHalvingsOfStrip) == 0;
      if (way.open) box.*way.side += way.step;
    }
  }
  const double cosine = window.a / scale, sine = window.b / scale;
  const auto half = [&](double x, double y, double limit) {
    const HalfPlane side{x * cosine - y * sine, x * sine + y * cosine, 0};
    return HalfPlane{side.nx, side.ny,
                     limit + kRounding + side.nx * window.dx + side.ny * window.dy};
  };
  return {half(0, -1, -box.top), half(1, 0, box.right), half(0, 1, box.bottom),
          half(-1, 0, -box.left)};
}

double FilledPlane::UncoveredShare(std::size_t frame, const Similarity& window) const {
  constexpr int kHalvings = 14;
  const double scale = std::hypot(window.a, window.b);
  const double x = scale * (width_ - 1) / 2, y = scale * (height_ - 1) / 2;
  const Box box{-x, -y, x, y};
  return Uncovered(Seen(covered_[frame], window), box, kHalvings) / box.area();
}

}  // namespace calmframe::host
