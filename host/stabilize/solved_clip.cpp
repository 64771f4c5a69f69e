#include "host/stabilize/solved_clip.h"

#include <algorithm>
#include <array>
#include <cmath>
#include <cstring>
#include <limits>
#include <memory>
#include <utility>

#include "host/stabilize/centred_bounds.h"
#include "host/stabilize/homography.h"
#include "host/stabilize/solved_grid.h"
#include "host/stabilize/solved_payload.h"

namespace calmframe::host {
namespace {

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

void AppendCropOfWholeFrame(const SolvedLayout& layout, const OutlineBounds& bounds,
                            InstanceWriter& out) {
  const auto width = static_cast<std::int32_t>(layout.square_width());
  const std::int32_t height = layout.source_height;
  const Side x = WholeFrame(bounds.least.x, width), y = WholeFrame(bounds.least.y, height);
  const auto mask = [](double least, double most) {
    return static_cast<std::int32_t>(std::ceil(std::max(Tame(most - least), 0.0)));
  };
  out.Append(std::uint8_t{1});
  // One pixel more than the frame: with the one that the effect adds to the frame, scale 1 exactly.
  out.Append(std::array<std::int32_t, 5>{layout.frames, mask(bounds.least.x, bounds.most.x),
                                         mask(bounds.least.y, bounds.most.y), width + 1,
                                         height + 1});
  const SolvedClip::Window window = {x.first, y.first, x.last, y.last};
  for (std::int32_t f = 0; f < layout.frames; ++f) out.Append(window);
}

std::size_t StoredCropBytes(const SolvedPayload& payload) {
  constexpr std::size_t kFields = 1 + 5 * sizeof(std::int32_t);
  if (!payload.layout.has_crop) return 1;
  const auto windows = payload.At<std::int32_t>(payload.layout.crop + 1);
  return kFields + static_cast<std::size_t>(windows) * sizeof(SolvedClip::Window);
}

Matrix MatrixOf(const Similarity& s) {
  return {s.a, -s.b, s.dx, s.b, s.a, s.dy, 0, 0, 1};
}

// Entries of the frame map are motions to the output of their second frame. then_of(frame): what
// comes behind those to its output.
template <class ThenOf>
void AppendMovedMap(const SolvedPayload& payload, const ThenOf& then_of, InstanceWriter& out) {
  std::size_t place = payload.layout.map;
  for (std::size_t i = 0; i < payload.layout.map_entries; ++i) {
    const auto frames = payload.At<std::array<std::int32_t, 2>>(place);
    out.Append(frames);
    place += kMapKeyBytes;
    const Matrix then = then_of(static_cast<std::size_t>(frames[1]));
    out.Append(Product(then, payload.At<Matrix>(place)));
    place += kMatrixBytes;
  }
}

// -- Frames --

// As an instance has them.
class StoredFrames final : public SolvedFrames {
 public:
  explicit StoredFrames(std::vector<std::uint8_t> instance)
      : instance_(std::move(instance)), payload_(ReadPayload(instance_)) {
    if (!payload_.inflated.empty()) instance_ = {};
  }

  const SolvedPayload& payload() const { return payload_; }
  void ReadVertices(std::size_t frame, std::vector<Point>& vertices) const override {
    StoredWarp warp;
    payload_.Read(frame, warp);
    WarpGrid grid(payload_.layout);
    grid.Take(warp);
    vertices = grid.TakeVertices();
  }
  void ReadTracks(std::size_t frame, TrackRow& row) const override { payload_.Read(frame, row); }

 private:
  std::vector<std::uint8_t> instance_;
  const SolvedPayload payload_;  // refers to it
};

// Takes frames of that size from where a warp puts them back to where they stand, as near as one
// homography comes to all vertices.
class Unbending {
 public:
  explicit Unbending(const WarpGrid& rest, double width, double height)
      : rest_(rest.vertices()),
        to_unit_{2 / width, 0, (1 - width) / width, 0, 2 / width, (1 - height) / width, 0, 0, 1},
        from_unit_{width / 2, 0, (width - 1) / 2, 0, width / 2, (height - 1) / 2, 0, 0, 1} {
    for (Point& point : rest_) point = InUnit(point);
  }

  // Of as many vertices.
  Matrix operator()(const Point* vertices) const {
    std::vector<Point> warped(vertices, vertices + rest_.size());
    for (Point& point : warped) point = InUnit(point);
    const Homography h = FitHomography(warped, rest_, {1, 0, 0, 0, 1, 0, 0, 0});
    Matrix fit{};
    std::copy(h.begin(), h.end(), fit.begin());
    fit.back() = 1;
    return Product(from_unit_, Product(fit, to_unit_));
  }

 private:
  Point InUnit(Point p) const {
    return {p.x * to_unit_[0] + to_unit_[2], p.y * to_unit_[0] + to_unit_[5]};
  }

  std::vector<Point> rest_;
  // Between pixels and halves of the width about the middle.
  Matrix to_unit_, from_unit_;
};

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

std::vector<Point> SolvedClip::VerticesOf(std::size_t frame) const {
  std::vector<Point> vertices;
  frames->ReadVertices(frame, vertices);
  return vertices;
}

TrackRow SolvedClip::TracksOf(std::size_t frame) const {
  TrackRow row;
  frames->ReadTracks(frame, row);
  return row;
}

SolvedClip ReadSolvedClip(std::vector<std::uint8_t> instance) {
  const auto frames = std::make_shared<const StoredFrames>(std::move(instance));
  const SolvedPayload& payload = frames->payload();
  const SolvedLayout& layout = payload.layout;
  SolvedClip clip;
  clip.frames = frames;
  clip.source_width = layout.source_width;
  clip.source_height = clip.height = layout.source_height;
  clip.width = static_cast<int>(layout.square_width());
  clip.first_frame = layout.first_frame;
  clip.frame_count = layout.frames;
  clip.columns = layout.columns;
  clip.rows = layout.rows;
  clip.slots = layout.slots;

  clip.neighbours.reserve(layout.map_entries);
  for (std::size_t i = 0; i < layout.map_entries; ++i) {
    const std::size_t place = layout.map + i * (kMapKeyBytes + kMatrixBytes);
    const auto frames_of = payload.At<std::array<std::int32_t, 2>>(place);
    clip.neighbours.push_back(
        {frames_of[0], frames_of[1], payload.At<Matrix>(place + kMapKeyBytes)});
  }

  if (layout.has_crop) {
    const auto fields = payload.At<std::array<std::int32_t, 5>>(layout.crop + 1);
    clip.crop = {
        .width = fields[3], .height = fields[4], .origin = BoundsOf(clip).least, .windows = {}};
    clip.crop->windows.resize(static_cast<std::size_t>(fields[0]));
    std::memcpy(clip.crop->windows.data(), payload.bytes.data() + layout.crop + 1 + sizeof fields,
                clip.crop->windows.size() * sizeof(SolvedClip::Window));
  }
  return clip;
}

std::vector<std::uint8_t> WithWindows(const std::vector<std::uint8_t>& instance,
                                      const std::vector<Similarity>& windows, Warps warps,
                                      PlacedBy placed_by) {
  const SolvedPayload payload = ReadPayload(instance);
  const SolvedLayout& layout = payload.layout;
  if (windows.size() != static_cast<std::size_t>(layout.frames)) {
    throw std::invalid_argument("windows of another clip");
  }
  std::vector<Similarity> output_from_plane = Inverses(windows);

  const auto frames = windows.size();
  const double width = layout.square_width(), height = layout.source_height;
  WarpGrid rest(layout);
  rest.Rest(width, height);
  const auto solved_grid = [&](std::size_t f) {
    StoredWarp warp;
    payload.Read(f, warp);
    WarpGrid grid(layout);
    grid.Take(warp);
    return grid;
  };
  std::vector<Matrix> unbent;
  if (warps == Warps::none) {
    const Unbending unbending(rest, width, height);
    for (std::size_t f = 0; f < frames; ++f) {
      unbent.push_back(unbending(solved_grid(f).vertices().data()));
    }
  }
  const auto grid_of = [&](std::size_t f) {
    WarpGrid grid = warps == Warps::solved ? solved_grid(f) : rest;
    grid.Move(output_from_plane[f]);
    return grid;
  };
  OutlineBounds bounds;
  for (std::size_t f = 0; f < frames; ++f) bounds.Add(grid_of(f));
  std::vector<Pull> pulls;
  if (placed_by == PlacedBy::bounds) pulls = FindPulls(layout, bounds, grid_of);
  for (const Pull& pull : pulls) {
    bounds.least.*pull.axis = std::min(bounds.least.*pull.axis, pull.to);
    bounds.most.*pull.axis = std::max(bounds.most.*pull.axis, pull.to);
  }
  // The effect draws nothing past the bounds' size, counted from 0 and not from their least: where
  // that lies inside the frame, all goes to the left and up by as much, and the crop with it.
  const Point back = {std::ceil(std::max(Tame(bounds.least.x), 0.0)),
                      std::ceil(std::max(Tame(bounds.least.y), 0.0))};
  for (Similarity& motion : output_from_plane) {
    motion.dx -= back.x;
    motion.dy -= back.y;
  }
  constexpr std::size_t kMore = 1 << 16;  // offsets that are packed take other sizes than before
  InstanceWriter out(payload.form, payload.bytes.size() + payload.bytes.size() / 8 +
                                       frames * sizeof(SolvedClip::Window) + kMore);
  out.Append(payload.bytes.first(layout.warps));
  bounds = {};
  for (std::size_t f = 0; f < frames; ++f) {
    WarpGrid grid = grid_of(f);
    for (const Pull& pull : pulls) {
      if (pull.frame == f) grid.corner(pull.corner).*pull.axis = pull.to;
    }
    const StoredWarp warp = grid.Stored();
    out.Append(warp, grid.columns());
    grid.Take(warp);
    bounds.Add(grid);
  }
  const std::size_t map_end = layout.map + layout.map_entries * (kMapKeyBytes + kMatrixBytes);
  out.Append(payload.bytes.subspan(layout.warps_end, layout.map - layout.warps_end));
  AppendMovedMap(
      payload,
      [&](std::size_t f) {
        const Matrix moved = MatrixOf(output_from_plane[f]);
        return unbent.empty() ? moved : Product(moved, unbent[f]);
      },
      out);
  out.Append(payload.bytes.subspan(map_end, layout.crop - map_end));
  const OutlineBounds in_output = {{bounds.least.x + back.x, bounds.least.y + back.y},
                                   {bounds.most.x + back.x, bounds.most.y + back.y}};
  AppendCropOfWholeFrame(layout, in_output, out);
  out.Append(payload.bytes.subspan(layout.crop + StoredCropBytes(payload)));
  return out.Take();
}

namespace {

WarpGrid RestingGrid(const SolvedClip& clip) {
  WarpGrid grid(static_cast<std::size_t>(clip.columns), static_cast<std::size_t>(clip.rows));
  grid.Rest(clip.width, clip.height);
  return grid;
}

}  // namespace

std::vector<Point> GridAtRest(const SolvedClip& clip) {
  return RestingGrid(clip).vertices();
}

std::vector<SolvedClip::Neighbour> NeighboursIn(const SolvedClip& clip, Warps warps) {
  std::vector<SolvedClip::Neighbour> neighbours = clip.neighbours;
  if (warps == Warps::solved) return neighbours;
  const WarpGrid rest = RestingGrid(clip);
  const Unbending unbending(rest, clip.width, clip.height);
  std::vector<Matrix> unbent;
  for (std::size_t f = 0; f < static_cast<std::size_t>(clip.frame_count); ++f) {
    unbent.push_back(unbending(clip.VerticesOf(f).data()));
  }
  for (SolvedClip::Neighbour& neighbour : neighbours) {
    neighbour.plane_from_frame =
        Product(unbent[static_cast<std::size_t>(neighbour.in)], neighbour.plane_from_frame);
  }
  return neighbours;
}

Point ShiftWithoutCrop(const SolvedClip& clip) {
  if (!clip.crop || clip.crop->windows.empty()) {
    throw std::invalid_argument("a clip without windows");
  }
  const OutlineBounds bounds = BoundsOf(clip);
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
