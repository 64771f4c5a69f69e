#include "examples/outside_renderer/drawing/frame_mesh.h"

#include <algorithm>
#include <cmath>

namespace outside {
namespace {

using Matrix = std::array<double, 9>;  // row-major

struct Point {
  double x, y;
};

Matrix operator*(const Matrix& a, const Matrix& b) {
  Matrix m{};
  for (std::size_t i = 0; i < 9; ++i) {
    for (std::size_t k = 0; k < 3; ++k) m[i] += a[i / 3 * 3 + k] * b[k * 3 + i % 3];
  }
  return m;
}

Matrix Adjugate(const Matrix& m) {
  return {m[4] * m[8] - m[5] * m[7], m[2] * m[7] - m[1] * m[8], m[1] * m[5] - m[2] * m[4],
          m[5] * m[6] - m[3] * m[8], m[0] * m[8] - m[2] * m[6], m[2] * m[3] - m[0] * m[5],
          m[3] * m[7] - m[4] * m[6], m[1] * m[6] - m[0] * m[7], m[0] * m[4] - m[1] * m[3]};
}

// The projective map of the unit square (Heckbert, Fundamentals of Texture Mapping and Image
// Warping, 1989). The plug-in takes a cell for a parallelogram when it is one to within 1e-5 in
// either coordinate.
Matrix QuadFromSquare(Point p00, Point p10, Point p01, Point p11) {
  const double sx = p00.x - p10.x + p11.x - p01.x, sy = p00.y - p10.y + p11.y - p01.y;
  if (std::fabs(sx) < 1e-5 || std::fabs(sy) < 1e-5) {
    return {p10.x - p00.x, p11.x - p10.x, p00.x, p10.y - p00.y, p11.y - p10.y, p00.y, 0, 0, 1};
  }
  const double ax = p10.x - p11.x, ay = p10.y - p11.y, bx = p01.x - p11.x, by = p01.y - p11.y;
  const double area = ax * by - bx * ay;
  const double g = (sx * by - bx * sy) / area, h = (ax * sy - sx * ay) / area;
  return {p10.x - p00.x + g * p10.x,
          p01.x - p00.x + h * p01.x,
          p00.x,
          p10.y - p00.y + g * p10.y,
          p01.y - p00.y + h * p01.y,
          p00.y,
          g,
          h,
          1};
}

std::int32_t Whole(double value) {  // towards 0
  return static_cast<std::int32_t>(std::clamp(std::isnan(value) ? 0 : value, -1e9, 1e9));
}

// One axis of the way from the plane of all warps to the output.
struct Axis {
  float render_scale;  // layer pixels for one of the analysed frame
  double origin;       // of the plane, where the bounds begin
  std::int32_t plane;  // length of the plane
  std::int32_t output;
  std::int32_t source;  // layer pixels
  double cell;          // of the resting grid, in layer pixels
  std::int32_t begin = 0, end = 0;
  // Output = zoomed plane + shift, but for `fraction`, by which samples are taken aside.
  std::int32_t shift = 0;
  double fraction = 0;

  Axis(float scale, float minimum, float maximum, std::int32_t source_side, std::int32_t grid)
      : render_scale(scale),
        origin(double{minimum} * scale),
        plane(Whole(std::ceil(double{maximum} * scale - origin))),
        output(plane),
        source(source_side),
        cell((source - 1.0) / (grid - 1)) {}

  // Puts the window's middle on the output's.
  void Centre(double first, double last, double zoom) {
    const double centre = ((last + origin) * zoom + (first + origin) * zoom) / 2;
    const double half = (output - 1) * 0.5;
    shift = Whole(half) - Whole(centre);
    fraction = (centre - std::trunc(centre)) - (half - std::trunc(half));
  }
  // The plane's far end, which no sample passes.
  void Limit(double zoom) {
    end = std::min({end, output, Whole(std::trunc(plane * zoom)) + shift,
                    Whole(std::ceil(plane * zoom - fraction)) + shift});
    begin = std::max(begin, 0);
  }
  double ToOutput(double place, double zoom) const { return place * zoom + shift; }
  // Of the sample of an output pixel.
  double ToPlane(std::int32_t pixel, double zoom) const {
    return (pixel - shift + fraction) / zoom;
  }
};

// Enlarges the window until it covers the frame less its margin, between 1 and the maximum.
float FitZoom(const SolvedFrame& f, const Controls& controls, std::int32_t frame_width,
              std::int32_t frame_height) {
  const float maximum =
      controls.framing == Framing::crop_auto_scale ? controls.maximum_scale : 1.0f;
  const float inside = 1.0f - controls.action_safe_margin;
  const float x =
      (static_cast<float>(frame_width) * inside + 1.0f) / static_cast<float>(f.crop_width);
  const float y =
      (static_cast<float>(frame_height) * inside + 1.0f) / static_cast<float>(f.crop_height);
  return controls.additional_scale * std::max(std::min(std::max(x, y), maximum), 1.0f);
}

// The part of the output that the window takes: what is enlarged too little stands in the middle.
void Fit(Axis& axis, std::int32_t frame, std::int32_t window, float zoom) {
  const float length = static_cast<float>(frame), shown = static_cast<float>(window) * zoom;
  axis.begin = std::max(0, Whole(std::ceil((length - shown) * axis.render_scale * 0.5f)));
  axis.end = std::min(Whole(axis.render_scale * shown) + axis.begin,
                      Whole(axis.render_scale * length + 0.5f));
}

}  // namespace

FrameMesh MeshOf(const SolvedFrame& f, const Controls& controls) {
  const bool crops = controls.framing != Framing::stabilize_only;
  // The analysis sees square pixels.
  const std::int32_t frame_width = std::max(
      1, Whole(std::floor(f.source_width *
                              (double{1} * controls.pixel_aspect_num / controls.pixel_aspect_den) +
                          0.5)));
  const auto scale_x = static_cast<float>(static_cast<double>(f.source_width) / frame_width);
  Axis x(scale_x, f.min_x, f.max_x, f.source_width, f.columns);
  Axis y(1.0f, f.min_y, f.max_y, f.source_height, f.rows);

  float zoom = controls.additional_scale;
  if (crops) {
    x.output = f.source_width;
    y.output = f.source_height;
    if (f.crop_width > 0 && f.crop_height > 0) {
      zoom = FitZoom(f, controls, frame_width, f.source_height);
      Fit(x, frame_width, f.crop_width, zoom);
      Fit(y, f.source_height, f.crop_height, zoom);
    }
    x.Centre(f.left * x.render_scale, f.right * x.render_scale, zoom);
    y.Centre(f.top * y.render_scale, f.bottom * y.render_scale, zoom);
  } else {
    x.end = x.output;
    y.end = y.output;
    x.Centre(0, x.plane - 1, zoom);
    y.Centre(0, y.plane - 1, zoom);
  }
  x.Limit(zoom);
  y.Limit(zoom);

  FrameMesh mesh{x.output, y.output, x.begin, y.begin, x.end, y.end, {}};
  if (!(zoom > 0) || f.warp->columns != f.columns || f.warp->rows != f.rows) return mesh;
  const auto vertex = [&](std::int32_t c, std::int32_t r) {
    const double* v = f.warp->values + 2 * (std::ptrdiff_t{r} * f.columns + c);
    return Point{v[0] * x.render_scale, v[1] * y.render_scale};
  };
  for (std::int32_t r = 0; r + 1 < f.rows; ++r) {
    for (std::int32_t c = 0; c + 1 < f.columns; ++c) {
      const Point corners[] = {vertex(c, r), vertex(c + 1, r), vertex(c + 1, r + 1),
                               vertex(c, r + 1)};
      Cell cell;
      for (std::size_t k = 0; k < 4; ++k) {
        cell.x[k] = static_cast<float>(x.ToOutput(corners[k].x, zoom));
        cell.y[k] = static_cast<float>(y.ToOutput(corners[k].y, zoom));
      }
      const auto [x0, x1] = std::minmax_element(cell.x.begin(), cell.x.end());
      const auto [y0, y1] = std::minmax_element(cell.y.begin(), cell.y.end());
      const auto left = static_cast<float>(x.begin - 1), top = static_cast<float>(y.begin - 1);
      if (!(*x1 > left && *x0 < static_cast<float>(x.end) && *y1 > top &&
            *y0 < static_cast<float>(y.end))) {
        continue;  // also where a vertex is no number
      }
      cell.output_origin = {Whole(std::floor(*x0)), Whole(std::floor(*y0))};
      cell.source_origin = {Whole(c * x.cell), Whole(r * y.cell)};
      const Matrix plane_from_output = {1 / double{zoom},
                                        0,
                                        x.ToPlane(cell.output_origin[0], zoom),
                                        0,
                                        1 / double{zoom},
                                        y.ToPlane(cell.output_origin[1], zoom),
                                        0,
                                        0,
                                        1};
      const Matrix square_from_plane =
          Adjugate(QuadFromSquare(corners[0], corners[1], corners[3], corners[2]));
      // Samples stand half a pixel before the pixels' centres.
      const Matrix source_from_square = {x.cell, 0,      c * x.cell - 0.5 - cell.source_origin[0],
                                         0,      y.cell, r * y.cell - 0.5 - cell.source_origin[1],
                                         0,      0,      1};
      const Matrix m = source_from_square * square_from_plane * plane_from_output;
      for (std::size_t k = 0; k < 9; ++k) {
        cell.source_from_output[k] = static_cast<float>(m[k] / m[8]);
      }
      if (std::all_of(cell.source_from_output.begin(), cell.source_from_output.end(),
                      [](float entry) { return std::isfinite(entry); })) {
        mesh.cells.push_back(cell);
      }
    }
  }
  return mesh;
}

}  // namespace outside
