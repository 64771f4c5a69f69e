#include "host/stabilize/follow_windows.h"

#include <algorithm>
#include <cmath>
#include <cstddef>
#include <optional>
#include <utility>

#include "host/stabilize/solved_grid.h"
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
std::vector<double> CalmedGrowth(const WarpedPlane& plane, const PictureMotion& motion,
                                 double frames_per_second) {
  const auto frames = static_cast<std::ptrdiff_t>(motion.background.size());
  std::vector<double> growth(motion.background.size()), calmed(growth);
  for (std::size_t f = 1; f < growth.size(); ++f) {
    const Similarity& back = motion.background[f];
    const double of_source = plane.Scale(f - 1) / plane.Scale(f) / std::hypot(back.a, back.b);
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

}  // namespace

std::vector<Similarity> FollowWindows(const WarpedPlane& plane, const PictureMotion& motion,
                                      const FollowSettings& settings) {
  const SolvedClip& clip = plane.clip();
  const WarpedPlane source(clip, Warps::none);
  const double margin = settings.filling ? settings.filling->rim : kMargin;
  std::vector<WindowFrame> frames(static_cast<std::size_t>(clip.frame_count));
  const std::vector<double> growth = CalmedGrowth(plane, motion, settings.frames_per_second);
  const double speed = settings.zoom_speed / 100 / settings.frames_per_second;
  for (std::size_t f = 0; f < frames.size(); ++f) {
    WindowFrame& frame = frames[f];
    frame.least_growth = std::exp(growth[f] - speed);
    frame.most_growth = std::exp(growth[f] + speed);
    frame.motion = motion.background[f];
    frame.covered = CoveredRegion(plane.Warp(f), margin);
    const double scale = plane.Scale(f);
    if (frame.covered.empty() || !(scale > 0)) {
      frame.covered = CoveredRegion(source.Warp(f), margin);
      frame.most_zoom = settings.most_zoom;
    } else {
      frame.most_zoom = settings.most_zoom / scale;
    }
  }
  std::vector<Similarity> windows =
      FindWindowPath(clip.width, clip.height, frames, settings.weights);
  if (settings.filling) {
    const FilledPlane filled(plane, *settings.filling);
    for (int round = 0; round < kRounds; ++round) {
      tessel::threads::ExecuteCPUBoundTaskOnAllProcessors(
          [&](std::size_t f) {
            std::vector<HalfPlane> around = filled.RegionAround(f, windows[f]);
            if (!around.empty()) frames[f].covered = std::move(around);
          },
          frames.size());
      windows = FindWindowPath(clip.width, clip.height, frames, settings.weights);
    }
  }
  const Point middle = Middle(clip);
  const Similarity enlarged{1 / settings.enlarged, 0, 0, 0};
  for (Similarity& window : windows) window = Moved(Compose(window, enlarged), middle);
  return windows;
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

ShownMotion MotionShown(const WarpedPlane& plane, const PictureMotion& motion,
                        const std::vector<Similarity>& windows,
                        const std::optional<Filling>& filling) {
  const SolvedClip& clip = plane.clip();
  std::optional<FilledPlane> filled;
  if (filling) filled.emplace(plane, *filling);
  const Point middle = Middle(clip);
  ShownMotion shown;
  shown.width = clip.width;
  shown.height = clip.height;
  shown.paths = motion.paths;
  const double square = (clip.width - 1.0) / (clip.source_width - 1.0);
  std::vector<Similarity> to_outputs;
  Similarity before;
  std::vector<Point> in_output;
  for (std::size_t f = 0; f < windows.size(); ++f) {
    const Similarity window = Moved(windows[f], {-middle.x, -middle.y});
    const Similarity to_output = Inverse(window);
    const double zoom = 1 / std::hypot(window.a, window.b);
    shown.zooms.push_back(plane.Scale(f) * zoom);
    shown.wobble.push_back(motion.wobble[f] * zoom);
    shown.motions.push_back(
        f == 0 ? Similarity{} : Compose(Inverse(before), Compose(motion.background[f], window)));
    if (filled) {
      shown.uncovered.push_back(filled->UncoveredShare(f, window));
    } else {
      const WarpView warp = plane.Warp(f);
      in_output.assign(warp.vertices, warp.vertices + warp.columns * warp.rows);
      for (Point& vertex : in_output) vertex = to_output(vertex);
      shown.uncovered.push_back(UncoveredShare({in_output.data(), warp.columns, warp.rows},
                                               clip.width - 1.0, clip.height - 1.0));
    }
    const Point aim = plane.SourceAt(f, window({}));
    shown.aims.push_back({aim.x * square - middle.x, aim.y - middle.y});
    before = window;
    to_outputs.push_back(to_output);
  }
  for (TrackPath& path : shown.paths) {
    for (std::size_t i = 0; i < path.points.size(); ++i) {
      path.points[i] = to_outputs[path.first + i](path.points[i]);
    }
  }
  return shown;
}

ShownMotion MotionOfSource(const SolvedClip& clip, const PictureMotion& motion) {
  const std::size_t frames = motion.background.size();
  return {double(clip.width),
          double(clip.height),
          motion.background,
          std::vector<double>(frames, 1.0),
          std::vector<double>(frames, 0.0),
          motion.wobble,
          motion.paths,
          std::vector<Point>(frames)};
}

}  // namespace calmframe::host
