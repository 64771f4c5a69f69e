#include "host/stabilize/centred_bounds.h"

#include <algorithm>
#include <array>
#include <cmath>
#include <cstddef>
#include <limits>
#include <utility>

namespace calmframe::host {
namespace {

// Whether the effect draws nothing of a corner's cell in an output of that size: it draws within
// the bounds of a cell's vertices, but for a pixel.
bool IsHidden(const WarpGrid& grid, std::size_t corner, double width, double height) {
  constexpr double kRoom = 2;  // pixels
  const std::array<Point, 4> cell = grid.CellOf(corner);
  const auto all = [&cell](const auto& beyond) {
    return std::all_of(cell.begin(), cell.end(), beyond);
  };
  return all([](const Point& p) { return p.x < -kRoom; }) ||
         all([](const Point& p) { return p.y < -kRoom; }) ||
         all([=](const Point& p) { return p.x > width - 1 + kRoom; }) ||
         all([=](const Point& p) { return p.y > height - 1 + kRoom; });
}

// The least and the largest coordinate that bounds must have along an axis, for a frame of so many
// pixels, to place it in their middle; in square pixels, about the frame's first. See
// ShiftWithoutCrop.
struct Placement {
  double least, most;
  bool most_is_there;

  Placement(double bounds_least, double bounds_most, int square, int pixels) {
    constexpr double kRounding = 0.01;  // of vertices, more than it is
    constexpr double kSlack = 0.9;      // the bounds' size is rounded up, and its half down
    const double scale = static_cast<float>(static_cast<double>(pixels) / square);
    const double off = (pixels - 1) / 2.0 - (square - 1) / 2.0 * scale;
    // Not behind the frame's first pixel, for the sake of what WithWindows tells of that.
    const double before = std::ceil(std::max({-off, -bounds_least * scale - off + kRounding,
                                              bounds_most * scale + off - pixels - kSlack}));
    least = -(before + off) / scale;
    most = least + (pixels + 2 * before) / scale;
    most_is_there = std::abs(bounds_most - most) * scale < kSlack;
  }
};

}  // namespace

std::vector<Pull> FindPulls(const SolvedLayout& layout, const OutlineBounds& bounds,
                            const std::function<WarpGrid(std::size_t)>& grid_of) {
  constexpr double kWidest = 1 << 20;
  if (!(bounds.most.x - bounds.least.x < kWidest) || !(bounds.most.y - bounds.least.y < kWidest)) {
    return {};
  }
  const auto width = static_cast<int>(layout.square_width());
  const int height = layout.source_height;
  std::vector<Pull> pulls;
  const auto is_taken = [&](std::size_t frame, std::size_t corner) {
    return std::any_of(pulls.begin(), pulls.end(), [&](const Pull& pull) {
      return pull.frame == frame && pull.corner == corner;
    });
  };
  // Of two corners, each frame's on that side, the first that nobody sees; without one that which
  // goes least far.
  const auto add = [&](double Point::*axis, double to, std::array<std::size_t, 2> side) {
    Pull best{};
    double least = std::numeric_limits<double>::infinity();
    for (std::size_t f = 0; least > 0 && f < static_cast<std::size_t>(layout.frames); ++f) {
      WarpGrid grid = grid_of(f);
      for (const std::size_t corner : side) {
        if (is_taken(f, corner)) continue;
        const double from = std::exchange(grid.corner(corner).*axis, to);
        const double way = IsHidden(grid, corner, width, height) ? 0 : std::abs(to - from);
        grid.corner(corner).*axis = from;
        if (!(way < least)) continue;
        least = way;
        best = {f, corner, axis, to};
      }
    }
    if (std::isfinite(least)) pulls.push_back(best);
  };
  const Placement x(bounds.least.x, bounds.most.x, width, layout.source_width);
  const Placement y(bounds.least.y, bounds.most.y, height, height);
  add(&Point::x, x.least, {0, 2});
  add(&Point::y, y.least, {0, 1});
  if (!x.most_is_there) add(&Point::x, x.most, {1, 3});
  if (!y.most_is_there) add(&Point::y, y.most, {2, 3});
  return pulls;
}

}  // namespace calmframe::host
