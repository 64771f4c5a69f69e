#include "host/stabilize/solved_clip.h"

#include <algorithm>
#include <array>
#include <cmath>
#include <cstring>
#include <limits>
#include <string>
#include <utility>

#include "host/stabilize/solved_payload.h"
#include "platform/tessel/filesupport.h"

namespace calmframe::host {
namespace {

// -- Warps --

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

// One frame's warp, rows of a grid of columns x rows vertices.
class Grid {
 public:
  Grid(std::size_t columns, std::size_t rows)
      : vertices_(columns * rows),
        columns_(columns),
        rows_(rows),
        corners_{0, columns - 1, columns * (rows - 1), columns * rows - 1} {}

  static std::size_t StoredBytes(const SolvedLayout& layout) {
    return kCornerBytes + layout.vertices() * kOffsetBytes;
  }

  void Read(const SolvedPayload& payload, std::size_t place) {
    const auto corners = payload.At<std::array<Point, 4>>(place);
    place += kCornerBytes;
    ForEach(corners, [&](Point& vertex, Point flat) {
      const auto steps = payload.At<std::array<std::int32_t, 2>>(place);
      place += sizeof steps;
      vertex = {static_cast<double>(static_cast<float>(steps[0]) / kStepsPerPixel) + flat.x,
                static_cast<double>(static_cast<float>(steps[1]) / kStepsPerPixel) + flat.y};
    });
    for (std::size_t i = 0; i < corners.size(); ++i) vertices_[corners_[i]] = corners[i];
  }

  // Every vertex where it stands in a frame of that size.
  void Rest(double width, double height) {
    const Point far = {width - 1, height - 1};
    ForEach({Point{}, {far.x, 0}, {0, far.y}, far},
            [](Point& vertex, const Point& flat) { vertex = flat; });
  }

  // In as many bytes as it was read from.
  void Write(SolvedPayload& payload, std::size_t place) {
    std::array<Point, 4> corners;
    for (std::size_t i = 0; i < corners.size(); ++i) corners[i] = vertices_[corners_[i]];
    payload.Put(place, corners);
    place += kCornerBytes;
    ForEach(corners, [&](const Point& vertex, Point flat) {
      const std::array<std::int32_t, 2> steps = {Steps(vertex.x - flat.x),
                                                 Steps(vertex.y - flat.y)};
      payload.Put(place, steps);
      place += sizeof steps;
    });
  }

  void Move(const Similarity& motion) {
    for (Point& vertex : vertices_) vertex = motion(vertex);
  }

  const std::vector<Point>& vertices() const { return vertices_; }

  // Top left, top right, bottom left, bottom right, as they are stored.
  Point& corner(std::size_t i) { return vertices_[corners_[i]]; }
  // The cell that a corner belongs to: its vertices, the way round of its edges.
  std::array<Point, 4> CellOf(std::size_t corner) const {
    const std::size_t left = corner % 2 == 0 ? 0 : columns_ - 2;
    const std::size_t at = (corner < 2 ? 0 : rows_ - 2) * columns_ + left;
    return {vertices_[at], vertices_[at + 1], vertices_[at + columns_ + 1],
            vertices_[at + columns_]};
  }

 private:
  // visit(vertex, where the corners' map puts it)
  template <class Visit>
  void ForEach(const std::array<Point, 4>& corners, const Visit& visit) {
    const SquareToQuad quad(corners);
    for (std::size_t r = 0; r < rows_; ++r) {
      const double v = static_cast<double>(r) / static_cast<double>(rows_ - 1);
      for (std::size_t c = 0; c < columns_; ++c) {
        const double u = static_cast<double>(c) / static_cast<double>(columns_ - 1);
        visit(vertices_[r * columns_ + c], quad(u, v));
      }
    }
  }

  std::vector<Point> vertices_;
  std::size_t columns_, rows_;
  std::array<std::size_t, 4> corners_;
};

// Of all frames' outlines, as the effect has them: their least and largest coordinates, the largest
// above 0 in any case; what is no number does not count.
struct Bounds {
  Point least = {std::numeric_limits<float>::max(), std::numeric_limits<float>::max()};
  Point most = {std::numeric_limits<float>::min(), std::numeric_limits<float>::min()};

  // Vertices of one frame.
  void Add(const Point* vertices, std::size_t columns, std::size_t rows) {
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
};

// A folded warp's bounds can lie anywhere; no picture is as large as this.
double Tame(double coordinate) {
  constexpr double kFarthest = 1 << 30;
  return std::clamp(coordinate, -kFarthest, kFarthest);
}

// -- The bounds' middle --

// One coordinate of a frame's corner, set.
struct Pull {
  std::size_t frame, corner;
  double Point::*axis;
  double to;
};

// Whether the effect draws nothing of a cell in a frame of that size: what it draws lies on the
// inner side of all edges.
bool IsHidden(const std::array<Point, 4>& cell, double width, double height) {
  constexpr double kRoom = 2;  // pixels
  for (std::size_t i = 0; i < cell.size(); ++i) {
    const Point& from = cell[i];
    const double dx = cell[(i + 1) % 4].x - from.x, dy = cell[(i + 1) % 4].y - from.y;
    const auto beyond = [&](double x, double y) {
      return dx * (y - from.y) - dy * (x - from.x) < -kRoom * std::hypot(dx, dy);
    };
    const double right = width - 1, bottom = height - 1;
    if (beyond(0, 0) && beyond(right, 0) && beyond(0, bottom) && beyond(right, bottom)) return true;
  }
  return false;
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

// What puts the output frame in the bounds' middle; nothing of bounds that are beyond all sense.
// grid_of(frame): moved to the output.
template <class GridOf>
std::vector<Pull> FindPulls(const SolvedLayout& layout, const Bounds& bounds,
                            const GridOf& grid_of) {
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
  // The first that nobody sees; without one that which goes least far.
  const auto add = [&](double Point::*axis, double to) {
    Pull best{};
    double least = std::numeric_limits<double>::infinity();
    for (std::size_t f = 0; least > 0 && f < static_cast<std::size_t>(layout.frames); ++f) {
      Grid& grid = grid_of(f);
      for (std::size_t corner = 0; corner < 4; ++corner) {
        if (is_taken(f, corner)) continue;
        const bool was_hidden = IsHidden(grid.CellOf(corner), width, height);
        const double from = std::exchange(grid.corner(corner).*axis, to);
        const bool unseen = was_hidden && IsHidden(grid.CellOf(corner), width, height);
        grid.corner(corner).*axis = from;
        const double way = unseen ? 0 : std::abs(to - from);
        if (!(way < least)) continue;
        least = way;
        best = {f, corner, axis, to};
      }
    }
    if (std::isfinite(least)) pulls.push_back(best);
  };
  const Placement x(bounds.least.x, bounds.most.x, width, layout.source_width);
  const Placement y(bounds.least.y, bounds.most.y, height, height);
  add(&Point::x, x.least);
  add(&Point::y, y.least);
  if (!x.most_is_there) add(&Point::x, x.most);
  if (!y.most_is_there) add(&Point::y, y.most);
  return pulls;
}

// -- Windows --

// The ends of a rectangle along one axis, from the bounds' least, whose middle is that of the
// frame.
struct Side {
  float first, last;
};

// The effect tests a pixel's coverage at its place without the fraction. So that the two agree on
// which pixel that is, the middle may lie a hair, and no more, behind the frame's.
Side WholeFrame(double least, std::int32_t pixels) {
  constexpr double kHair = 1e-7;
  const double sum = pixels - 1 - 2 * Tame(least) + kHair;
  const auto first = static_cast<float>(-Tame(least));
  auto last = static_cast<float>(sum - first);
  if (last < sum - first) last = std::nextafter(last, std::numeric_limits<float>::infinity());
  return {first, last};
}

std::string CropOfWholeFrame(const SolvedLayout& layout, const Bounds& bounds) {
  const auto width = static_cast<std::int32_t>(layout.square_width());
  const std::int32_t height = layout.source_height;
  const Side x = WholeFrame(bounds.least.x, width), y = WholeFrame(bounds.least.y, height);
  const auto mask = [](double least, double most) {
    return static_cast<std::int32_t>(std::ceil(std::max(Tame(most - least), 0.0)));
  };
  tessel::filesupport::OStringByteStream out;
  out << true << layout.frames << mask(bounds.least.x, bounds.most.x)
      << mask(bounds.least.y, bounds.most.y);
  // One pixel more than the frame: with the one that the effect adds to the frame, scale 1 exactly.
  out << width + 1 << height + 1;
  const SolvedClip::Window window = {x.first, y.first, x.last, y.last};
  for (std::int32_t f = 0; f < layout.frames; ++f) out.Write(&window, sizeof window);
  return out.Take();
}

std::size_t StoredCropBytes(const SolvedPayload& payload) {
  constexpr std::size_t kFields = 1 + 5 * sizeof(std::int32_t);
  if (!payload.layout.has_crop) return 1;
  const auto windows = payload.At<std::int32_t>(payload.layout.crop + 1);
  return kFields + static_cast<std::size_t>(windows) * sizeof(SolvedClip::Window);
}

// Entries of the frame map are motions to the output of their second frame.
void MoveFrameMap(SolvedPayload& payload, const std::vector<Similarity>& output_from_plane) {
  std::size_t place = payload.layout.map;
  for (std::size_t i = 0; i < payload.layout.map_entries; ++i) {
    const auto frames = payload.At<std::array<std::int32_t, 2>>(place);
    const Similarity& s = output_from_plane[static_cast<std::size_t>(frames[1])];
    place += kMapKeyBytes;
    auto m = payload.At<std::array<double, 9>>(place);
    for (std::size_t c = 0; c < 3; ++c) {
      const double x = m[c], y = m[3 + c], w = m[6 + c];
      m[c] = s.a * x - s.b * y + s.dx * w;
      m[3 + c] = s.b * x + s.a * y + s.dy * w;
    }
    payload.Put(place, m);
    place += kMatrixBytes;
  }
}

std::vector<Similarity> Inverses(const std::vector<Similarity>& windows) {
  std::vector<Similarity> inverses;
  inverses.reserve(windows.size());
  for (const Similarity& window : windows) {
    const Similarity inverse = Inverse(window);
    if (!std::isfinite(inverse.a) || !std::isfinite(inverse.b) || !std::isfinite(inverse.dx) ||
        !std::isfinite(inverse.dy)) {
      throw std::invalid_argument("a window without an inverse");
    }
    inverses.push_back(inverse);
  }
  return inverses;
}

}  // namespace

SolvedClip ReadSolvedClip(const std::vector<std::uint8_t>& instance) {
  const SolvedPayload payload = ReadPayload(instance);
  const SolvedLayout& layout = payload.layout;
  SolvedClip clip;
  clip.source_width = layout.source_width;
  clip.source_height = clip.height = layout.source_height;
  clip.width = static_cast<int>(layout.square_width());
  clip.first_frame = layout.first_frame;
  clip.frame_count = layout.frames;
  clip.columns = layout.columns;
  clip.rows = layout.rows;
  clip.slots = layout.slots;

  const auto columns = static_cast<std::size_t>(clip.columns);
  const auto rows = static_cast<std::size_t>(clip.rows);
  const auto frames = static_cast<std::size_t>(clip.frame_count);
  Grid grid(columns, rows);
  Bounds bounds;
  clip.vertices.reserve(frames * layout.vertices());
  for (std::size_t f = 0; f < frames; ++f) {
    grid.Read(payload, layout.warps + f * Grid::StoredBytes(layout));
    bounds.Add(grid.vertices().data(), columns, rows);
    clip.vertices.insert(clip.vertices.end(), grid.vertices().begin(), grid.vertices().end());
  }

  constexpr double kTrackStep = 1.0 / 32;
  const std::size_t statuses = layout.tracks + layout.cells() * kPositionBytes;
  clip.tracks.reserve(layout.cells());
  clip.statuses.resize(layout.cells());
  for (std::size_t i = 0; i < layout.cells(); ++i) {
    const auto steps = payload.At<std::array<std::int32_t, 2>>(layout.tracks + i * kPositionBytes);
    clip.tracks.push_back({steps[0] * kTrackStep, steps[1] * kTrackStep});
  }
  std::memcpy(clip.statuses.data(), payload.bytes.data() + statuses, layout.cells() * kStatusBytes);

  clip.neighbours.reserve(layout.map_entries);
  for (std::size_t i = 0; i < layout.map_entries; ++i) {
    const std::size_t place = layout.map + i * (kMapKeyBytes + kMatrixBytes);
    const auto frames_of = payload.At<std::array<std::int32_t, 2>>(place);
    clip.neighbours.push_back(
        {frames_of[0], frames_of[1], payload.At<std::array<double, 9>>(place + kMapKeyBytes)});
  }

  if (layout.has_crop) {
    const auto fields = payload.At<std::array<std::int32_t, 5>>(layout.crop + 1);
    clip.crop = {.width = fields[3], .height = fields[4], .origin = bounds.least, .windows = {}};
    clip.crop->windows.resize(static_cast<std::size_t>(fields[0]));
    std::memcpy(clip.crop->windows.data(), payload.bytes.data() + layout.crop + 1 + sizeof fields,
                clip.crop->windows.size() * sizeof(SolvedClip::Window));
  }
  return clip;
}

std::vector<std::uint8_t> WithWindows(const std::vector<std::uint8_t>& instance,
                                      const std::vector<Similarity>& windows, Warps warps,
                                      PlacedBy placed_by) {
  SolvedPayload payload = ReadPayload(instance);
  const SolvedLayout& layout = payload.layout;
  if (windows.size() != static_cast<std::size_t>(layout.frames)) {
    throw std::invalid_argument("windows of another clip");
  }
  std::vector<Similarity> output_from_plane = Inverses(windows);

  Grid grid(static_cast<std::size_t>(layout.columns), static_cast<std::size_t>(layout.rows));
  const auto columns = static_cast<std::size_t>(layout.columns);
  const auto rows = static_cast<std::size_t>(layout.rows);
  const auto place = [&](std::size_t f) { return layout.warps + f * Grid::StoredBytes(layout); };
  const auto take = [&](std::size_t f) {
    if (warps == Warps::solved) {
      grid.Read(payload, place(f));
    } else {
      grid.Rest(layout.square_width(), layout.source_height);
    }
    grid.Move(output_from_plane[f]);
  };
  Bounds bounds;
  for (std::size_t f = 0; f < windows.size(); ++f) {
    take(f);
    bounds.Add(grid.vertices().data(), columns, rows);
  }
  std::vector<Pull> pulls;
  if (placed_by == PlacedBy::bounds) {
    pulls = FindPulls(layout, bounds, [&](std::size_t f) -> Grid& {
      take(f);
      return grid;
    });
    for (const Pull& pull : pulls) {
      bounds.least.*pull.axis = std::min(bounds.least.*pull.axis, pull.to);
      bounds.most.*pull.axis = std::max(bounds.most.*pull.axis, pull.to);
    }
  }
  // The effect draws nothing past the bounds' size, counted from 0 and not from their least: where
  // that lies inside the frame, all goes to the left and up by as much, and the crop with it.
  const Point back = {std::ceil(std::max(Tame(bounds.least.x), 0.0)),
                      std::ceil(std::max(Tame(bounds.least.y), 0.0))};
  for (Similarity& motion : output_from_plane) {
    motion.dx -= back.x;
    motion.dy -= back.y;
  }
  bounds = {};
  for (std::size_t f = 0; f < windows.size(); ++f) {
    take(f);
    for (const Pull& pull : pulls) {
      if (pull.frame == f) grid.corner(pull.corner).*pull.axis = pull.to;
    }
    grid.Write(payload, place(f));
    grid.Read(payload, place(f));
    bounds.Add(grid.vertices().data(), columns, rows);
  }
  MoveFrameMap(payload, output_from_plane);
  const Bounds in_output = {{bounds.least.x + back.x, bounds.least.y + back.y},
                            {bounds.most.x + back.x, bounds.most.y + back.y}};
  payload.bytes.replace(layout.crop, StoredCropBytes(payload), CropOfWholeFrame(layout, in_output));

  return InstanceOf(payload.bytes);
}

std::vector<Point> GridAtRest(const SolvedClip& clip) {
  Grid grid(static_cast<std::size_t>(clip.columns), static_cast<std::size_t>(clip.rows));
  grid.Rest(clip.width, clip.height);
  return grid.vertices();
}

SolvedClip WithoutWarps(SolvedClip clip) {
  const std::vector<Point> rest = GridAtRest(clip);
  for (std::size_t i = 0; i < clip.vertices.size(); ++i) clip.vertices[i] = rest[i % rest.size()];
  return clip;
}

Point ShiftWithoutCrop(const SolvedClip& clip) {
  if (!clip.crop || clip.crop->windows.empty()) {
    throw std::invalid_argument("a clip without windows");
  }
  const auto columns = static_cast<std::size_t>(clip.columns);
  const auto rows = static_cast<std::size_t>(clip.rows);
  Bounds bounds;
  for (std::size_t at = 0; at < clip.vertices.size(); at += columns * rows) {
    bounds.Add(clip.vertices.data() + at, columns, rows);
  }
  const SolvedClip::Window& shown = clip.crop->windows.front();
  // Along one axis: the bounds' least goes to the left end of a buffer that the frame lies in the
  // middle of, by whole pixels. With a crop the middles of the window and the frame meet.
  const auto shift = [](double least, double most, float first, float last, int square,
                        int pixels) {
    const double scale = static_cast<float>(static_cast<double>(pixels) / square);
    const double side = std::ceil(Tame((most - least) * scale));
    const double before = std::trunc((side - pixels) / 2);
    const double middle = least + (static_cast<double>(first) + last) / 2;
    return -least * scale - before - ((pixels - 1) / 2.0 - middle * scale);
  };
  return {
      shift(bounds.least.x, bounds.most.x, shown.left, shown.right, clip.width, clip.source_width),
      shift(bounds.least.y, bounds.most.y, shown.top, shown.bottom, clip.height,
            clip.source_height)};
}

}  // namespace calmframe::host
