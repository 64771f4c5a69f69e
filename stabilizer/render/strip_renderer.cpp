#include "stabilizer/render/strip_renderer.h"

#include <algorithm>
#include <array>
#include <cmath>
#include <cstring>
#include <limits>
#include <tuple>

namespace marrow::render {

using stabilization::matrix3;
using stabilization::point2;

namespace {

// Tall enough that few cells are set up twice, low enough to keep many processors busy.
constexpr std::int64_t band_rows = 64;

constexpr double flattest = 1e30;  // slope of an edge; a product with a coordinate stays finite

// One directed edge of a quadrilateral; the inside lies where cross >= 0.
struct edge {
  point2 from;
  double dx;
  double dy;
  double slope;  // dx / dy, where that is of use

  double cross(double x, double y) const { return dx * (y - from.y) - dy * (x - from.x); }

  // Cuts [x0, x1) down to the x of row y that are inside; test_x[x] is the plane's x. Each rounding
  // in cross() is monotone in x, so what passes is one stretch, and only its end has to be looked
  // for, from about where the edge meets the row.
  void cut(double zoom, const double* test_x, double y, std::int64_t& x0, std::int64_t& x1) const {
    const auto inside = [&](std::int64_t x) { return cross(test_x[x], y) >= 0; };
    if (x0 >= x1) return;
    if (dy == 0) {
      if (!inside(x0)) x1 = x0;
      return;
    }
    const double meet = (from.x + slope * (y - from.y)) * zoom + 1;
    auto x = static_cast<std::int64_t>(
        std::clamp(meet, static_cast<double>(x0), static_cast<double>(x1)));
    if (dy > 0) {  // a stretch that begins at x0; find the first x past it
      while (x < x1 && inside(x)) ++x;
      while (x > x0 && !inside(x - 1)) --x;
      x1 = x;
    } else {  // a stretch that ends at x1; find its first x
      while (x < x1 && !inside(x)) ++x;
      while (x > x0 && inside(x - 1)) --x;
      x0 = x;
    }
  }
  // The same, quicker where the row seldom meets the edge.
  void cutSeldom(double zoom, const double* test_x, double y, std::int64_t& x0,
                 std::int64_t& x1) const {
    if (x0 >= x1 || (cross(test_x[x0], y) >= 0 && cross(test_x[x1 - 1], y) >= 0)) return;
    cut(zoom, test_x, y, x0, x1);
  }

  // Squared distance of the edge's line.
  double distance2(double x, double y) const {
    const double length2 = dx * dx + dy * dy;
    if (length2 == 0) return 0;
    const double c = cross(x, y);
    return c * c / length2;
  }
};

edge between(point2 a, point2 b) {
  const double slope = (b.x - a.x) / (b.y - a.y);
  return {a, b.x - a.x, b.y - a.y, std::fabs(slope) < flattest ? slope : 0.0};
}

}  // namespace

// What of a cell has to be drawn, in the zoomed plane.
template <class Pixel>
struct StripRenderer<Pixel>::cell {
  std::int32_t c;
  std::int32_t r;
  std::int64_t x0;
  std::int64_t x1;
  std::int64_t y0;
  std::int64_t y1;
  matrix3 square_from_plane;
  std::array<edge, 4> edges;  // top, right, bottom, left
  std::array<bool, 4> owned;  // outer edges of the grid
  bool border;
};

// A row's runs that are not drawn yet, and which pixels of a band have been given some.
template <class Pixel>
struct StripRenderer<Pixel>::band_runs {
  struct span {
    int y;
    int x0;
    int x1;
  };
  struct run_of_cell {
    const cell* q;
    std::int64_t x0;
    int count;
  };

  // Joins what follows right on.
  void add(int y, int x0, int x1) {
    if (!spans.empty() && spans.back().y == y && spans.back().x1 == x0) {
      spans.back().x1 = x1;
    } else {
      spans.push_back({y, x0, x1});
    }
  }

  std::array<run_of_cell, 128> runs;
  std::size_t count = 0;
  std::vector<span> spans;
};

namespace {

// Null where the source has two columns and two rows to interpolate between, or nothing.
template <class Pixel>
std::unique_ptr<WorldX<Pixel>> widened(const WorldX<Pixel>& source) {
  const int width = source.width(), height = source.height();
  if (width < 1 || height < 1 || (width > 1 && height > 1)) return nullptr;
  auto twice = std::make_unique<WorldX<Pixel>>(std::max(width, 2), std::max(height, 2));
  for (int y = 0; y < twice->height(); ++y) {
    for (int x = 0; x < twice->width(); ++x) {
      twice->row(y)[x] = source.row(std::min(y, height - 1))[std::min(x, width - 1)];
    }
  }
  return twice;
}

template <class Pixel>
source_plane plane(const WorldX<Pixel>& source, double max_x, double max_y) {
  return {reinterpret_cast<const unsigned char*>(source.data()),
          source.row_bytes(),
          source.width(),
          source.height(),
          max_x,
          max_y};
}

}  // namespace

template <class Pixel>
StripRenderer<Pixel>::StripRenderer(const FrameMesh& mesh, const WorldX<Pixel>& source,
                                    WorldX<Pixel>& destination, const TileMap* only, bool clears)
    : FrameMesh(mesh),
      destination_(destination),
      only_(only),
      clears_(clears),
      widened_(widened(source)),
      source_(plane(widened_ ? *widened_ : source,
                    std::min(renderer_.sourceWidth, source.width()) - 1.0001,
                    std::min(renderer_.sourceHeight, source.height()) - 1.0001)),
      band_height_(only ? TileMap::side : band_rows),
      tolerance2_(std::max(4.0, 4.0 / (zoom_ * zoom_))) {
  const auto columns = static_cast<std::size_t>(std::max(destination.width(), 0));
  test_x_.reserve(columns);
  plane_x_.reserve(columns);
  for (int i = 0; i < destination.width(); ++i) {
    const auto x = static_cast<double>(i - to_destination_x_);
    test_x_.push_back(x / zoom_);
    plane_x_.push_back((x + offset_x_) / zoom_);
  }
}

template <class Pixel>
std::size_t StripRenderer<Pixel>::bands() const {
  return static_cast<std::size_t>((destination_.height() + band_height_ - 1) / band_height_);
}

template <class Pixel>
void StripRenderer<Pixel>::operator()(std::size_t band) const {
  const std::int64_t first = static_cast<std::int64_t>(band) * band_height_;
  const std::int64_t end = std::min<std::int64_t>(first + band_height_, destination_.height());
  band_runs runs;
  // A zoom of 0 shows nothing.
  if (zoom_ > 0 && source_.width >= 1 && source_.height >= 1 &&
      (!only_ || only_->touches(0, first, destination_.width(), end))) {
    for (std::int32_t r = 0; r + 1 < renderer_.rows; ++r) drawGridRow(r, first, end, runs);
  }
  if (clears_) clearRest(static_cast<int>(first), static_cast<int>(end), runs);
}

template <class Pixel>
void StripRenderer<Pixel>::clearRest(int first, int end, band_runs& runs) const {
  std::sort(runs.spans.begin(), runs.spans.end(),
            [](const auto& a, const auto& b) { return a.y != b.y ? a.y < b.y : a.x0 < b.x0; });
  auto next = runs.spans.begin();
  for (int y = first; y < end; ++y) {
    int x = 0;
    const auto clearTo = [&](int x1) {
      if (x1 > x) {
        std::memset(static_cast<void*>(destination_.row(y) + x), 0,
                    sizeof(Pixel) * static_cast<std::size_t>(x1 - x));
      }
    };
    for (; next != runs.spans.end() && next->y == y; ++next) {
      clearTo(next->x0);
      x = std::max(x, next->x1);
    }
    clearTo(destination_.width());
  }
}

template <class Pixel>
void StripRenderer<Pixel>::drawGridRow(std::int32_t r, std::int64_t first_row, std::int64_t end_row,
                                       band_runs& runs) const {
  const row_extent& a = extents_[static_cast<std::size_t>(r)];
  const row_extent& b = extents_[static_cast<std::size_t>(r) + 1];
  const auto to_destination = static_cast<double>(to_destination_y_);
  if (std::floor(zoom_ * std::min(a.min_y, b.min_y) - 1) + to_destination >=
          static_cast<double>(end_row) ||
      std::ceil(zoom_ * std::max(a.max_y, b.max_y) + 1) + to_destination <=
          static_cast<double>(first_row)) {
    return;
  }
  std::vector<cell> cells;
  cells.reserve(static_cast<std::size_t>(renderer_.cols));
  cell next;
  for (std::int32_t c = 0; c + 1 < renderer_.cols; ++c) {
    if (setUpCell(c, r, first_row, end_row, next)) cells.push_back(next);
  }
  // Row by row: source and destination are walked as they lie in memory, and the runs of
  // neighbouring cells join.
  std::int64_t y0 = end_row - to_destination_y_;
  std::int64_t y1 = first_row - to_destination_y_;
  for (const cell& q : cells) {
    y0 = std::min(y0, q.y0);
    y1 = std::max(y1, q.y1);
  }
  for (std::int64_t y = y0; y < y1; ++y) {
    for (const cell& q : cells) {
      if (y >= q.y0 && y < q.y1) drawRow(q, y, runs);
    }
    sample(y, runs);
  }
}

template <class Pixel>
bool StripRenderer<Pixel>::setUpCell(std::int32_t c, std::int32_t r, std::int64_t first_row,
                                     std::int64_t end_row, cell& q) const {
  cell_bounds bounds;
  if (!cellBounds(c, r, bounds)) return false;

  const bool top = r == 0;
  const bool bottom = r == renderer_.rows - 2;
  const bool left = c == 0;
  const bool right = c == renderer_.cols - 2;
  const bool border = (!crop_ || renderer_.edgeTolerant) && (top || bottom || left || right);

  // The window in destination coordinates, then both clipped in the zoomed plane.
  std::int64_t window_x0 = 0;
  std::int64_t window_x1 = destination_.width();
  std::int64_t window_y0 = first_row;
  std::int64_t window_y1 = end_row;
  if (!border && crop_) {
    window_x0 = std::max<std::int64_t>(window_x0, renderer_.outLeft);
    window_x1 = std::min<std::int64_t>(window_x1, renderer_.outRight);
    window_y0 = std::max<std::int64_t>(window_y0, renderer_.outTop);
    window_y1 = std::min<std::int64_t>(window_y1, renderer_.outBottom);
  }
  const std::int64_t x0 = std::max(bounds.x0, window_x0 - to_destination_x_);
  const std::int64_t x1 = std::min(bounds.x1, window_x1 - to_destination_x_);
  const std::int64_t y0 = std::max(bounds.y0, window_y0 - to_destination_y_);
  const std::int64_t y1 = std::min(bounds.y1, window_y1 - to_destination_y_);
  if (x0 >= x1 || y0 >= y1) return false;
  // Whole cells: a span's samples depend on where it begins.
  if (only_ && !only_->touches(x0 + to_destination_x_, y0 + to_destination_y_,
                               x1 + to_destination_x_, y1 + to_destination_y_)) {
    return false;
  }

  const point2 p00 = vertex(c, r);
  const point2 p10 = vertex(c + 1, r);
  const point2 p01 = vertex(c, r + 1);
  const point2 p11 = vertex(c + 1, r + 1);
  q = {c,
       r,
       x0,
       x1,
       y0,
       y1,
       stabilization::inverse(stabilization::square_to_quad(p00, p10, p01, p11)),
       {between(p00, p10), between(p10, p11), between(p11, p01), between(p01, p00)},
       {top, right, bottom, left},
       border};
  // Otherwise the quadrilateral has no inside.
  return std::all_of(q.square_from_plane.begin(), q.square_from_plane.end(),
                     [](double entry) { return std::isfinite(entry); });
}

template <class Pixel>
void StripRenderer<Pixel>::drawRow(const cell& q, std::int64_t y, band_runs& runs) const {
  if (!(planeY(y) < renderer_.planeHeight)) return;
  const double test_y = static_cast<double>(y) / zoom_;
  const double* test_x = test_x_.data() + to_destination_x_;

  std::int64_t inside0 = q.x0;
  std::int64_t inside1 = q.x1;
  q.edges[0].cutSeldom(zoom_, test_x, test_y, inside0, inside1);
  q.edges[1].cut(zoom_, test_x, test_y, inside0, inside1);
  q.edges[2].cutSeldom(zoom_, test_x, test_y, inside0, inside1);
  q.edges[3].cut(zoom_, test_x, test_y, inside0, inside1);
  if (!q.border) {
    drawSpan(q, inside0, inside1, y, runs);
    return;
  }
  // A border cell also takes what lies near an outer edge that it owns.
  if (inside0 >= inside1) inside0 = inside1 = q.x1;
  const auto near = [&](std::int64_t x) {
    for (std::size_t i = 0; i < q.edges.size(); ++i) {
      if (q.owned[i] && q.edges[i].distance2(test_x[x], test_y) < tolerance2_) return true;
    }
    return false;
  };
  std::int64_t begin = q.x0;
  for (std::int64_t x = q.x0; x < q.x1; ++x) {
    if (x == inside0) x = inside1;
    if (x < q.x1 && near(x)) continue;
    drawSpan(q, begin, std::min(x, q.x1), y, runs);
    begin = x + 1;
  }
  drawSpan(q, begin, q.x1, y, runs);
}

template <class Pixel>
void StripRenderer<Pixel>::drawSpan(const cell& q, std::int64_t x0, std::int64_t x1, std::int64_t y,
                                    band_runs& runs) const {
  const double* plane_x = plane_x_.data() + to_destination_x_;
  while (x0 < x1 && !(plane_x[x1 - 1] < renderer_.planeWidth)) --x1;
  if (x0 >= x1) return;
  runs.add(static_cast<int>(y + to_destination_y_), static_cast<int>(x0 + to_destination_x_),
           static_cast<int>(x1 + to_destination_x_));
  for (std::int64_t x = x0; x < x1; x += max_run) {
    runs.runs[runs.count++] = {&q, x, static_cast<int>(std::min<std::int64_t>(max_run, x1 - x))};
    if (runs.count == runs.runs.size()) sample(y, runs);
  }
}

// All of a row's runs at once: their divisions don't wait for each other, nor for the search of
// spans, whose branches are hard to foretell.
template <class Pixel>
void StripRenderer<Pixel>::sample(std::int64_t y, band_runs& runs) const {
  const double py = planeY(y);
  const double* plane_x = plane_x_.data() + to_destination_x_;
  Pixel* row = destination_.row(static_cast<int>(y + to_destination_y_)) + to_destination_x_;
  std::array<source_run<Pixel>, std::tuple_size_v<decltype(runs.runs)>> placed;
  for (std::size_t i = 0; i < runs.count; ++i) {
    const auto& [q, x, count] = runs.runs[i];
    const matrix3& h = q->square_from_plane;
    const double px = plane_x[x];
    const double inverse_w = 1.0 / (h[6] * px + h[7] * py + h[8]);
    const double u = (h[0] * px + h[1] * py + h[2]) * inverse_w;
    const double v = (h[3] * px + h[4] * py + h[5]) * inverse_w;
    // u(x + k) - u(x) = k (h0 - u h6) / zoom / (w + k h6 / zoom), and v likewise.
    const double step = inverse_w / zoom_;
    placed[i] = {(q->c + u) * renderer_.cellWidth - 0.5,
                 (q->r + v) * renderer_.cellHeight - 0.5,
                 (h[0] - u * h[6]) * step * renderer_.cellWidth,
                 (h[3] - v * h[6]) * step * renderer_.cellHeight,
                 h[6] * step,
                 count,
                 row + x};
  }
  SampleRuns(source_, placed.data(), runs.count);
  runs.count = 0;
}

template class StripRenderer<HX_Pixel8>;
template class StripRenderer<HX_Pixel16>;
template class StripRenderer<HX_PixelFloat>;

}  // namespace marrow::render
