#include "host/stabilize/follow_windows.h"

#include <algorithm>
#include <cmath>
#include <cstddef>

#include "host/stabilize/window/clip_windows.h"
#include "platform/tessel/threads.h"

namespace calmframe::host {
namespace {

constexpr double kMargin = 1;         // pixels; what the drawing may read beside a pixel
constexpr double kTolerance = 0.003;  // of the width: how far a track may be from the background

Point Middle(const SolvedClip& clip) {
  return {(clip.width - 1) / 2.0, (clip.height - 1) / 2.0};
}

// Vertices about the middle of the plane, frame by frame; without warps one grid for all, at rest.
class Plane {
 public:
  Plane(const SolvedClip& clip, Warps warps)
      : clip_(clip),
        vertices_(warps == Warps::solved ? clip.vertices : GridAtRest(clip)),
        of_frame_(warps == Warps::solved
                      ? vertices_.size() / static_cast<std::size_t>(clip.frame_count)
                      : 0) {
    const Point middle = Middle(clip);
    for (Point& vertex : vertices_) {
      vertex.x -= middle.x;
      vertex.y -= middle.y;
    }
  }

  WarpView Warp(std::size_t frame) const {
    return {vertices_.data() + frame * of_frame_, clip_.columns, clip_.rows};
  }

  // Of a place in the source, in its own pixels; inside of a cell the vertices' bilinear mean.
  Point At(std::size_t frame, Point source) const {
    const WarpView warp = Warp(frame);
    const double u = source.x / (clip_.source_width - 1.0) * (clip_.columns - 1);
    const double v = source.y / (clip_.source_height - 1.0) * (clip_.rows - 1);
    const int c = static_cast<int>(std::clamp(u, 0.0, clip_.columns - 2.0));
    const int r = static_cast<int>(std::clamp(v, 0.0, clip_.rows - 2.0));
    const double fx = u - c, fy = v - r;
    const auto mix = [&](double Point::*axis) {
      return (warp.at(c, r).*axis * (1 - fx) + warp.at(c + 1, r).*axis * fx) * (1 - fy) +
             (warp.at(c, r + 1).*axis * (1 - fx) + warp.at(c + 1, r + 1).*axis * fx) * fy;
    };
    return {mix(&Point::x), mix(&Point::y)};
  }

  // How many times the warp enlarges the frame: the root of its outline's area (the shoelace
  // formula) over the frame's. 0 of a folded one.
  double Scale(std::size_t frame) const {
    const WarpView warp = Warp(frame);
    double twice = 0;
    const auto add = [&](const Point& p, const Point& q) { twice += p.x * q.y - q.x * p.y; };
    for (int c = 0; c + 1 < warp.columns; ++c) {
      add(warp.at(c, 0), warp.at(c + 1, 0));
      add(warp.at(c + 1, warp.rows - 1), warp.at(c, warp.rows - 1));
    }
    for (int r = 0; r + 1 < warp.rows; ++r) {
      add(warp.at(warp.columns - 1, r), warp.at(warp.columns - 1, r + 1));
      add(warp.at(0, r + 1), warp.at(0, r));
    }
    const double area = (clip_.width - 1.0) * (clip_.height - 1.0);
    return std::sqrt(std::max(twice / 2 / area, 0.0));
  }

  // Of the background, from a frame to the one before.
  Similarity Motion(std::size_t frame) const {
    std::vector<Point> from, to;
    const auto slots = static_cast<std::size_t>(clip_.slots);
    for (std::size_t s = 0; s < slots; ++s) {
      const std::size_t now = frame * slots + s, before = now - slots;
      if (clip_.statuses[now] != 0 || clip_.statuses[before] < 0) continue;
      const Point here = At(frame, clip_.tracks[now]);
      const Point there = At(frame - 1, clip_.tracks[before]);
      if (!IsInReach(here) || !IsInReach(there)) continue;
      from.push_back(here);
      to.push_back(there);
    }
    return FitMotion(from, to, kTolerance * clip_.width);
  }

 private:
  const SolvedClip& clip_;
  std::vector<Point> vertices_;
  std::size_t of_frame_;  // from a frame's to the next one's
};

// Between coordinates about the middle and about the top left pixel.
Similarity Moved(const Similarity& of, Point by) {
  const Point shift = of({-by.x, -by.y});
  return {of.a, of.b, shift.x + by.x, shift.y + by.y};
}

}  // namespace

Background FindBackground(const SolvedClip& clip) {
  const Plane source(clip, Warps::none), plane(clip, Warps::solved);
  const auto frames = static_cast<std::size_t>(clip.frame_count);
  Background found{std::vector<Similarity>(frames), std::vector<Similarity>(frames)};
  tessel::threads::ExecuteCPUBoundTaskOnAllProcessors(
      [&](std::size_t before) {
        found.in_source[before + 1] = source.Motion(before + 1);
        found.in_plane[before + 1] = plane.Motion(before + 1);
      },
      frames - 1);
  return found;
}

std::vector<Similarity> FollowWindows(const SolvedClip& clip, const Background& background,
                                      const FollowSettings& settings) {
  const Plane source(clip, Warps::none), plane(clip, Warps::solved);
  std::vector<WindowFrame> frames(static_cast<std::size_t>(clip.frame_count));
  for (std::size_t f = 0; f < frames.size(); ++f) {
    WindowFrame& frame = frames[f];
    frame.motion = background.in_plane[f];
    frame.covered = CoveredRegion(plane.Warp(f), kMargin);
    const double scale = plane.Scale(f);
    if (frame.covered.empty() || !(scale > 0)) {
      frame.covered = CoveredRegion(source.Warp(f), kMargin);
      frame.most_zoom = settings.most_zoom;
    } else {
      frame.most_zoom = settings.most_zoom / scale;
    }
  }
  std::vector<Similarity> windows =
      FindWindowPath(clip.width, clip.height, frames, settings.weights);
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

ShownMotion MotionShown(const SolvedClip& clip, const Background& background,
                        const std::vector<Similarity>& windows) {
  const Plane plane(clip, Warps::solved);
  const Point middle = Middle(clip);
  ShownMotion shown;
  shown.width = clip.width;
  shown.height = clip.height;
  Similarity before;
  std::vector<Point> in_output;
  for (std::size_t f = 0; f < windows.size(); ++f) {
    const Similarity window = Moved(windows[f], {-middle.x, -middle.y});
    const Similarity to_output = Inverse(window);
    shown.zooms.push_back(plane.Scale(f) / std::hypot(window.a, window.b));
    shown.motions.push_back(
        f == 0 ? Similarity{} : Compose(Inverse(before), Compose(background.in_plane[f], window)));
    const WarpView warp = plane.Warp(f);
    in_output.assign(warp.vertices, warp.vertices + warp.columns * warp.rows);
    for (Point& vertex : in_output) vertex = to_output(vertex);
    shown.uncovered.push_back(UncoveredShare({in_output.data(), warp.columns, warp.rows},
                                             clip.width - 1.0, clip.height - 1.0));
    before = window;
  }
  return shown;
}

ShownMotion MotionOfSource(const SolvedClip& clip, const Background& background) {
  const std::size_t frames = background.in_source.size();
  return {double(clip.width), double(clip.height), background.in_source,
          std::vector<double>(frames, 1.0), std::vector<double>(frames, 0.0)};
}

}  // namespace calmframe::host
