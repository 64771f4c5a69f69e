#include "host/stabilize/follow_windows.h"

#include <algorithm>
#include <cmath>
#include <cstddef>
#include <optional>
#include <utility>

#include "host/stabilize/warped_plane.h"
#include "host/stabilize/window/clip_windows.h"
#include "platform/tessel/threads.h"

namespace calmframe::host {
namespace {

constexpr double kMargin = 1;  // pixels; what the drawing may read beside a pixel
// Two keep up to two hundredths of the width less, on three filmed clips.
constexpr int kRounds = 3;

// Between coordinates about the middle and about the top left pixel.
Similarity Moved(const Similarity& of, Point by) {
  const Point shift = of({-by.x, -by.y});
  return {of.a, of.b, shift.x + by.x, shift.y + by.y};
}

}  // namespace

std::vector<Similarity> FollowWindows(const SolvedClip& clip, Warps warps,
                                      const PictureMotion& motion, const FollowSettings& settings) {
  const WarpedPlane source(clip, Warps::none), plane(clip, warps);
  const double margin = settings.filling ? settings.filling->rim : kMargin;
  std::vector<WindowFrame> frames(static_cast<std::size_t>(clip.frame_count));
  for (std::size_t f = 0; f < frames.size(); ++f) {
    WindowFrame& frame = frames[f];
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
    const FilledPlane filled(clip, *settings.filling);
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
  for (std::size_t f = 0; f < windows.size(); ++f) {
    Point centre = middle;
    if (clip.crop && f < clip.crop->windows.size()) {
      const SolvedClip::Window& window = clip.crop->windows[f];
      centre = {clip.crop->origin.x + (double{window.left} + window.right) / 2,
                clip.crop->origin.y + (double{window.top} + window.bottom) / 2};
    }
    windows[f] = {1 / zoom, 0, centre.x - middle.x / zoom, centre.y - middle.y / zoom};
  }
  return windows;
}

ShownMotion MotionShown(const SolvedClip& clip, Warps warps, const PictureMotion& motion,
                        const std::vector<Similarity>& windows,
                        const std::optional<Filling>& filling) {
  const WarpedPlane plane(clip, warps);
  std::optional<FilledPlane> filled;
  if (filling) filled.emplace(clip, *filling);
  const Point middle = Middle(clip);
  ShownMotion shown;
  shown.width = clip.width;
  shown.height = clip.height;
  shown.paths = motion.paths;
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
          motion.paths};
}

}  // namespace calmframe::host
