#include "stabilizer/render/strip_renderer.h"

#include <algorithm>
#include <array>
#include <cmath>
#include <limits>

using marrow::stabilization::matrix3;
using marrow::stabilization::point2;

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
    const double meet = (from.x + slope * (y - from.y)) * zoom;
    std::int64_t x = static_cast<std::int64_t>(
        std::clamp(std::floor(meet), static_cast<double>(x0), static_cast<double>(x1)));
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

template <class Pixel>
struct StripRenderer<Pixel>::cell {
  std::int32_t c;
  std::int32_t r;
  matrix3 square_from_plane;
  std::array<source_run<Pixel>, 32> runs;  // not drawn yet; about as many as a cell has rows
  std::size_t run_count;
};

template <class Pixel>
StripRenderer<Pixel>::StripRenderer(const FrameMesh& mesh, const WorldX<Pixel>& source,
                                    WorldX<Pixel>& destination, const TileMap* only)
    : FrameMesh(mesh),
      destination_(destination),
      only_(only),
      source_{reinterpret_cast<const unsigned char*>(source.data()),
              source.row_bytes(),
              source.width(),
              source.height(),
              std::min(renderer_.sourceWidth, source.width()) - 1.0001,
              std::min(renderer_.sourceHeight, source.height()) - 1.0001},
      band_height_(only ? TileMap::side : band_rows),
      tolerance2_(std::max(4.0, 4.0 / (zoom_ * zoom_))) {
  for (int x = 0; x < destination.width(); ++x) {
    test_x_.push_back(static_cast<double>(x - to_destination_x_) / zoom_);
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
  // A zoom of 0 shows nothing.
  if (!(zoom_ > 0) || source_.width < 1 || source_.height < 1) return;
  if (only_ && !only_->touches(0, first, destination_.width(), end)) return;
  for (std::int32_t r = 0; r + 1 < renderer_.rows; ++r) drawGridRow(r, first, end);
}

template <class Pixel>
void StripRenderer<Pixel>::drawGridRow(std::int32_t r, std::int64_t first_row,
                                       std::int64_t end_row) const {
  const row_extent& a = extents_[static_cast<std::size_t>(r)];
  const row_extent& b = extents_[static_cast<std::size_t>(r) + 1];
  const auto to_destination = static_cast<double>(to_destination_y_);
  if (std::floor(zoom_ * std::min(a.min_y, b.min_y) - 1) + to_destination >=
          static_cast<double>(end_row) ||
      std::ceil(zoom_ * std::max(a.max_y, b.max_y) + 1) + to_destination <=
          static_cast<double>(first_row)) {
    return;
  }
  for (std::int32_t c = 0; c + 1 < renderer_.cols; ++c) drawCell(c, r, first_row, end_row);
}

template <class Pixel>
void StripRenderer<Pixel>::drawCell(std::int32_t c, std::int32_t r, std::int64_t first_row,
                                    std::int64_t end_row) const {
  cell_bounds bounds;
  if (!cellBounds(c, r, bounds)) return;

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
  if (x0 >= x1 || y0 >= y1) return;
  // Whole cells: a span's samples depend on where it begins.
  if (only_ && !only_->touches(x0 + to_destination_x_, y0 + to_destination_y_,
                               x1 + to_destination_x_, y1 + to_destination_y_)) {
    return;
  }

  const point2 p00 = vertex(c, r);
  const point2 p10 = vertex(c + 1, r);
  const point2 p01 = vertex(c, r + 1);
  const point2 p11 = vertex(c + 1, r + 1);
  cell q;
  q.c = c;
  q.r = r;
  q.square_from_plane =
      marrow::stabilization::inverse(marrow::stabilization::square_to_quad(p00, p10, p01, p11));
  q.run_count = 0;
  for (const double entry : q.square_from_plane) {
    if (!std::isfinite(entry)) return;  // the quadrilateral has no inside
  }
  const edge edges[4] = {between(p00, p10), between(p10, p11), between(p11, p01),
                         between(p01, p00)};
  const bool owned[4] = {top, right, bottom, left};
  const double* test_x = test_x_.data() + to_destination_x_;

  for (std::int64_t y = y0; y < y1; ++y) {
    const double py = (static_cast<double>(y) + offset_y_) / zoom_;
    if (!(py < renderer_.planeHeight)) break;
    const double test_y = static_cast<double>(y) / zoom_;
    Pixel* row = destination_.row(static_cast<int>(y + to_destination_y_));

    std::int64_t inside0 = x0;
    std::int64_t inside1 = x1;
    for (const edge& e : edges) e.cut(zoom_, test_x, test_y, inside0, inside1);
    if (!border) {
      drawSpan(q, inside0, inside1, py, row);
      continue;
    }
    // A border cell also takes what lies near an outer edge that it owns.
    if (inside0 >= inside1) inside0 = inside1 = x1;
    const auto near = [&](std::int64_t x) {
      for (int i = 0; i < 4; ++i) {
        if (owned[i] && edges[i].distance2(test_x[x], test_y) < tolerance2_) {
          return true;
        }
      }
      return false;
    };
    std::int64_t begin = x0;
    for (std::int64_t x = x0; x < x1; ++x) {
      if (x == inside0) x = inside1;
      if (x < x1 && near(x)) continue;
      drawSpan(q, begin, std::min(x, x1), py, row);
      begin = x + 1;
    }
    drawSpan(q, begin, x1, py, row);
  }
  SampleRuns(source_, q.runs.data(), q.run_count);
}

// Plane positions of the row's pixels are ((x + offset) / zoom, py).
template <class Pixel>
void StripRenderer<Pixel>::drawSpan(cell& q, std::int64_t x0, std::int64_t x1, double py,
                                    Pixel* row) const {
  const auto plane_x = [&](std::int64_t x) { return (static_cast<double>(x) + offset_x_) / zoom_; };
  while (x0 < x1 && !(plane_x(x1 - 1) < renderer_.planeWidth)) --x1;
  const matrix3& h = q.square_from_plane;
  for (std::int64_t x = x0; x < x1; x += max_run) {
    const double px = plane_x(x);
    const double inverse_w = 1.0 / (h[6] * px + h[7] * py + h[8]);
    const double u = (h[0] * px + h[1] * py + h[2]) * inverse_w;
    const double v = (h[3] * px + h[4] * py + h[5]) * inverse_w;
    // u(x + k) - u(x) = k (h0 - u h6) / zoom / (w + k h6 / zoom), and v likewise.
    const double step = inverse_w / zoom_;
    q.runs[q.run_count++] = {(q.c + u) * renderer_.cellWidth - 0.5,
                             (q.r + v) * renderer_.cellHeight - 0.5,
                             (h[0] - u * h[6]) * step * renderer_.cellWidth,
                             (h[3] - v * h[6]) * step * renderer_.cellHeight,
                             h[6] * step,
                             static_cast<int>(std::min<std::int64_t>(max_run, x1 - x)),
                             row + (x + to_destination_x_)};
    if (q.run_count < q.runs.size()) continue;
    SampleRuns(source_, q.runs.data(), q.run_count);
    q.run_count = 0;
  }
}

template class StripRenderer<HX_Pixel8>;
template class StripRenderer<HX_Pixel16>;
template class StripRenderer<HX_PixelFloat>;
