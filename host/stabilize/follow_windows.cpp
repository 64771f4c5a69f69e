#include "host/stabilize/follow_windows.h"

#include <algorithm>
#include <cmath>
#include <cstddef>
#include <memory>
#include <optional>
#include <utility>

#include "host/stabilize/solved_grid.h"
#include "host/stabilize/track_paths.h"
#include "host/stabilize/warped_plane.h"
#include "host/stabilize/window/clip_windows.h"
#include "platform/tessel/threads.h"

namespace calmframe::host {
namespace {

constexpr double kMargin = 1;        // pixels; what the drawing may read beside a pixel
constexpr double kMostGrowth = 1.1;  // of a frame; no camera zooms as fast
// Seconds. With 0.6, over which MeasureShake takes a path's parabola, the windows went along with
// the bob of a run and of a walking selfie and were 0.8 dB less calm there; 2 was no calmer than
// this.
constexpr double kCalmed = 1.5;
// Two keep up to two hundredths of the width less, on three filmed clips.
constexpr int kRounds = 3;

// Between coordinates about the middle and about the top left pixel.
Similarity Moved(const Similarity& of, Point by) {
  const Point shift = of({-by.x, -by.y});
  return {of.a, of.b, shift.x + by.x, shift.y + by.y};
}

// By how much the camera itself makes the background grow from the frame before, as a logarithm:
// the mean over kCalmed to either side, by Epanechnikov's kernel. Of the first frame without
// meaning.
// `scales`: of the plane's frames.
std::vector<double> CalmedGrowth(const std::vector<double>& scales, const PictureMotion& motion,
                                 double frames_per_second) {
  const auto frames = static_cast<std::ptrdiff_t>(motion.background.size());
  std::vector<double> growth(motion.background.size()), calmed(growth);
  for (std::size_t f = 1; f < growth.size(); ++f) {
    const Similarity& back = motion.background[f];
    const double of_source = scales[f - 1] / scales[f] / std::hypot(back.a, back.b);
    // A background that is lost, or a warp that is folded, tells nothing.
    if (of_source > 1 / kMostGrowth && of_source < kMostGrowth) growth[f] = std::log(of_source);
  }
  const std::ptrdiff_t reach = std::lround(kCalmed * frames_per_second);
  for (std::ptrdiff_t f = 1; f < frames; ++f) {
    double sum = 0, weights = 0;
    for (std::ptrdiff_t k = std::max<std::ptrdiff_t>(1, f - reach);
         k <= std::min(frames - 1, f + reach); ++k) {
      const double away = static_cast<double>(k - f) / static_cast<double>(reach + 1);
      const double weight = 1 - away * away;
      sum += weight * growth[static_cast<std::size_t>(k)];
      weights += weight;
    }
    calmed[static_cast<std::size_t>(f)] = sum / weights;
  }
  return calmed;
}

// Calls visit(f, its frame of the plane) for each frame on all processors: a frame is expanded once
// for that and for its tracks.
template <class Visit>
std::shared_ptr<const std::vector<TrackPath>> PathsOf(const WarpedPlane& plane,
                                                      const Visit& visit) {
  const SolvedClip& clip = plane.clip();
  const auto frames = static_cast<std::size_t>(clip.frame_count);
  PathGatherer paths(clip.slots);
  constexpr std::size_t kStretch = 256;  // rows that are there at a time
  for (std::size_t first = 0; first < frames; first += kStretch) {
    std::vector<TrackRow> rows(std::min(kStretch, frames - first));
    tessel::threads::ExecuteCPUBoundTaskOnAllProcessors(
        [&](std::size_t i) {
          const PlaneFrame frame = plane.Frame(first + i);
          visit(first + i, frame);
          rows[i] = RowInPlane(frame, clip.TracksOf(first + i));
        },
        rows.size());
    for (const TrackRow& row : rows) paths.Add(row);
  }
  return std::make_shared<const std::vector<TrackPath>>(paths.Take());
}

}  // namespace

WindowFinder::WindowFinder(const WarpedPlane& plane, const PictureMotion& motion,
                           const FollowSettings& settings)
    : settings_(settings),
      width_(plane.clip().width),
      height_(plane.clip().height),
      middle_(Middle(plane.clip())),
      frames_(static_cast<std::size_t>(plane.clip().frame_count)) {
  const double margin = settings.filling ? settings.filling->rim : kMargin;
  const std::vector<HalfPlane> at_rest =
      CoveredRegion(WarpedPlane(plane.clip(), Warps::none).Frame(0).Warp(), margin);
  std::vector<double> scales(frames_.size());
  tessel::threads::ExecuteCPUBoundTaskOnAllProcessors(
      [&](std::size_t f) {
        WindowFrame& frame = frames_[f];
        const PlaneFrame in_plane = plane.Frame(f);
        scales[f] = in_plane.Scale();
        frame.motion = motion.background[f];
        frame.covered = CoveredRegion(in_plane.Warp(), margin);
        if (frame.covered.empty() || !(scales[f] > 0)) {
          frame.covered = at_rest;
          frame.most_zoom = settings.most_zoom;
        } else {
          frame.most_zoom = settings.most_zoom / scales[f];
        }
      },
      frames_.size());
  const std::vector<double> growth = CalmedGrowth(scales, motion, settings.frames_per_second);
  const double speed = settings.zoom_speed / 100 / settings.frames_per_second;
  for (std::size_t f = 0; f < frames_.size(); ++f) {
    frames_[f].least_growth = std::exp(growth[f] - speed);
    frames_[f].most_growth = std::exp(growth[f] + speed);
  }
  if (settings.filling) filled_.emplace(plane, *settings.filling);
}

std::vector<Similarity> WindowFinder::Find(double width_weight) const {
  WindowWeights weights = settings_.weights;
  weights.width = width_weight;
  std::vector<Similarity> windows = FindWindowPath(width_, height_, frames_, weights);
  if (filled_) {
    std::vector<WindowFrame> frames = frames_;
    for (int round = 0; round < kRounds; ++round) {
      tessel::threads::ExecuteCPUBoundTaskOnAllProcessors(
          [&](std::size_t f) {
            std::vector<HalfPlane> around = filled_->RegionAround(f, windows[f]);
            if (!around.empty()) frames[f].covered = std::move(around);
          },
          frames.size());
      windows = FindWindowPath(width_, height_, frames, weights);
    }
  }
  const Similarity enlarged{1 / settings_.enlarged, 0, 0, 0};
  for (Similarity& window : windows) window = Moved(Compose(window, enlarged), middle_);
  return windows;
}

std::vector<Similarity> FollowWindows(const WarpedPlane& plane, const PictureMotion& motion,
                                      const FollowSettings& settings) {
  return WindowFinder(plane, motion, settings).Find(settings.weights.width);
}

std::vector<Similarity> OwnWindows(const SolvedClip& clip, double zoom) {
  std::vector<Similarity> windows(static_cast<std::size_t>(clip.frame_count));
  const Point middle = Middle(clip);
  const OutlineBounds bounds = BoundsOf(clip);
  const Point middle_of_all = {(bounds.least.x + bounds.most.x) / 2,
                               (bounds.least.y + bounds.most.y) / 2};
  for (std::size_t f = 0; f < windows.size(); ++f) {
    Point centre = middle_of_all;
    if (clip.crop && f < clip.crop->windows.size()) {
      const SolvedClip::Window& window = clip.crop->windows[f];
      centre = {clip.crop->origin.x + (double{window.left} + window.right) / 2,
                clip.crop->origin.y + (double{window.top} + window.bottom) / 2};
    }
    windows[f] = {1 / zoom, 0, centre.x - middle.x / zoom, centre.y - middle.y / zoom};
  }
  return windows;
}

std::vector<Similarity> WholeFrames(const SolvedClip& clip) {
  constexpr double kInside = 1.0 / 128;  // warps are kept in steps of 1 / 256
  const double scale = 1 - 2 * kInside / std::min(clip.width, clip.height);
  const Point middle = Middle(clip);
  const Similarity window{scale, 0, middle.x * (1 - scale), middle.y * (1 - scale)};
  return std::vector<Similarity>(static_cast<std::size_t>(clip.frame_count), window);
}

std::vector<ShownMotion> MotionsShown(const WarpedPlane& plane, const PictureMotion& motion,
                                      const std::vector<std::vector<Similarity>>& ways,
                                      const FilledPlane* filled) {
  const SolvedClip& clip = plane.clip();
  const Point middle = Middle(clip);
  const double square = (clip.width - 1.0) / (clip.source_width - 1.0);
  const auto frames = static_cast<std::size_t>(clip.frame_count);
  std::vector<ShownMotion> all(ways.size());
  for (ShownMotion& shown : all) {
    shown.width = clip.width;
    shown.height = clip.height;
    shown.to_output.resize(frames);
    shown.motions.resize(frames);
    shown.zooms.resize(frames);
    shown.uncovered.resize(frames);
    shown.wobble.resize(frames);
    shown.aims.resize(frames);
  }
  const auto about_middle = [&middle](const Similarity& window) {
    return Moved(window, {-middle.x, -middle.y});
  };
  const auto show = [&](std::size_t f, const PlaneFrame& frame, double scale,
                        const std::vector<Similarity>& windows, ShownMotion& shown) {
    const Similarity window = about_middle(windows[f]);
    const Similarity to_output = Inverse(window);
    const double zoom = 1 / std::hypot(window.a, window.b);
    shown.to_output[f] = to_output;
    shown.zooms[f] = scale * zoom;
    shown.wobble[f] = motion.wobble[f] * zoom;
    if (f > 0) {
      shown.motions[f] =
          Compose(Inverse(about_middle(windows[f - 1])), Compose(motion.background[f], window));
    }
    if (filled) {
      shown.uncovered[f] = filled->UncoveredShare(f, window);
    } else {
      const WarpView warp = frame.Warp();
      std::vector<Point> in_output(warp.vertices, warp.vertices + warp.columns * warp.rows);
      for (Point& vertex : in_output) vertex = to_output(vertex);
      shown.uncovered[f] = UncoveredShare({in_output.data(), warp.columns, warp.rows},
                                          clip.width - 1.0, clip.height - 1.0);
    }
    const Point aim = frame.SourceAt(window({}));
    shown.aims[f] = {aim.x * square - middle.x, aim.y - middle.y};
  };
  const auto paths = PathsOf(plane, [&](std::size_t f, const PlaneFrame& frame) {
    const double scale = frame.Scale();
    for (std::size_t way = 0; way < ways.size(); ++way) show(f, frame, scale, ways[way], all[way]);
  });
  for (ShownMotion& shown : all) shown.paths = paths;
  return all;
}

ShownMotion MotionShown(const WarpedPlane& plane, const PictureMotion& motion,
                        const std::vector<Similarity>& windows,
                        const std::optional<Filling>& filling) {
  std::optional<FilledPlane> filled;
  if (filling) filled.emplace(plane, *filling);
  return std::move(MotionsShown(plane, motion, {windows}, filled ? &*filled : nullptr).front());
}

ShownMotion MotionOfSource(const SolvedClip& clip, const PictureMotion& motion) {
  const std::size_t frames = motion.background.size();
  return {double(clip.width),
          double(clip.height),
          motion.background,
          std::vector<double>(frames, 1.0),
          std::vector<double>(frames, 0.0),
          motion.wobble,
          PathsOf(WarpedPlane(clip, Warps::none), [](std::size_t, const PlaneFrame&) {}),
          std::vector<Point>(frames)};
}

}  // namespace calmframe::host
