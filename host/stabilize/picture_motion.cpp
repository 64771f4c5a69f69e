#include "host/stabilize/picture_motion.h"

#include <algorithm>
#include <array>
#include <cmath>
#include <cstddef>
#include <optional>

#include "host/stabilize/homography.h"
#include "host/stabilize/median.h"
#include "host/stabilize/window/clip_windows.h"
#include "platform/tessel/threads.h"

namespace calmframe::host {
namespace {

// Where the tracks that go on from one frame to the next were and are.
struct TrackPairs {
  std::vector<Point> before, now;  // equally many
};

TrackPairs PairsOf(const WarpedPlane& plane, std::size_t frame) {
  const SolvedClip& clip = plane.clip();
  TrackPairs pairs;
  const auto slots = static_cast<std::size_t>(clip.slots);
  for (std::size_t s = 0; s < slots; ++s) {
    const std::size_t now = frame * slots + s, before = now - slots;
    if (clip.statuses[now] != 0 || clip.statuses[before] < 0) continue;
    const Point here = plane.At(frame, clip.tracks[now]);
    const Point there = plane.At(frame - 1, clip.tracks[before]);
    if (!IsInReach(here) || !IsInReach(there)) continue;
    pairs.now.push_back(here);
    pairs.before.push_back(there);
  }
  return pairs;
}

constexpr int kColumns = 12, kRows = 7;
constexpr double kLost = 0.006;  // of the width: a track that left its place, not the scene

std::vector<Point> Scaled(std::vector<Point> points, double unit) {
  for (Point& point : points) point = {point.x / unit, point.y / unit};
  return points;
}

using Cells = std::array<std::optional<Point>, kColumns * kRows>;

// `start`: from the frame before to this one.
Cells Residuals(const TrackPairs& pairs, const Similarity& start, double width, double height) {
  Cells cells;
  if (pairs.now.size() < 8) return cells;
  const double unit = width / 2;
  constexpr double kFarthest = 1.5 * kTrackTolerance * 2;
  const Homography h = FitHomography(
      Scaled(pairs.before, unit), Scaled(pairs.now, unit),
      {start.a, -start.b, start.dx / unit, start.b, start.a, start.dy / unit, 0, 0}, kFarthest);
  std::array<std::vector<double>, kColumns * kRows> x, y;
  for (std::size_t i = 0; i < pairs.now.size(); ++i) {
    const Point& q = pairs.now[i];
    const Point reached = Apply(h, {pairs.before[i].x / unit, pairs.before[i].y / unit});
    const Point off{q.x - reached.x * unit, q.y - reached.y * unit};
    if (!(std::hypot(off.x, off.y) < std::max(6.0, kLost * width))) continue;
    const int column =
        static_cast<int>(std::clamp((q.x / width + 0.5) * kColumns, 0.0, kColumns - 1.0));
    const int row = static_cast<int>(std::clamp((q.y / height + 0.5) * kRows, 0.0, kRows - 1.0));
    const auto cell = static_cast<std::size_t>(row * kColumns + column);
    x[cell].push_back(off.x);
    y[cell].push_back(off.y);
  }
  for (std::size_t c = 0; c < cells.size(); ++c) {
    if (x[c].size() >= 2) cells[c] = Point{Median(x[c]), Median(y[c])};
  }
  return cells;
}

std::vector<double> Flicker(const std::vector<Cells>& cells) {
  std::vector<double> flicker(cells.size(), 0);
  for (std::size_t f = 1; f + 1 < cells.size(); ++f) {
    double sum = 0;
    int count = 0;
    for (std::size_t c = 0; c < cells[f].size(); ++c) {
      const auto &now = cells[f][c], &before = cells[f - 1][c], &after = cells[f + 1][c];
      if (!now || !before || !after) continue;
      const double x = now->x - (before->x + after->x) / 2;
      const double y = now->y - (before->y + after->y) / 2;
      sum += (x * x + y * y) / 1.5;  // of three independent values the variance is that of one
      ++count;
    }
    if (count > 0) flicker[f] = std::sqrt(sum / count);
  }
  return flicker;
}

// Of at least five frames.
std::vector<TrackPath> PathsOf(const WarpedPlane& plane) {
  const SolvedClip& clip = plane.clip();
  std::vector<TrackPath> paths;
  const auto slots = static_cast<std::size_t>(clip.slots);
  const auto frames = static_cast<std::size_t>(clip.frame_count);
  for (std::size_t s = 0; s < slots; ++s) {
    TrackPath path;
    const auto end = [&] {
      if (path.points.size() >= 5) paths.push_back(path);
      path.points.clear();
    };
    for (std::size_t f = 0; f < frames; ++f) {
      const std::int32_t status = clip.statuses[f * slots + s];
      if (status != 0) end();
      if (status < 0) continue;
      if (path.points.empty()) path.first = f;
      path.points.push_back(plane.At(f, clip.tracks[f * slots + s]));
      if (!IsInReach(path.points.back())) path.points.clear();
    }
    end();
  }
  return paths;
}

}  // namespace

PictureMotion FindMotion(const WarpedPlane& plane) {
  const SolvedClip& clip = plane.clip();
  const auto frames = static_cast<std::size_t>(clip.frame_count);
  PictureMotion motion{std::vector<Similarity>(frames), {}, {}};
  std::vector<Cells> cells(frames);
  tessel::threads::ExecuteCPUBoundTaskOnAllProcessors(
      [&](std::size_t before) {
        const std::size_t f = before + 1;
        const TrackPairs pairs = PairsOf(plane, f);
        motion.background[f] = FitMotion(pairs.now, pairs.before, kTrackTolerance * clip.width);
        cells[f] = Residuals(pairs, Inverse(motion.background[f]), clip.width, clip.height);
      },
      frames - 1);
  motion.wobble = Flicker(cells);
  motion.paths = PathsOf(plane);
  return motion;
}

}  // namespace calmframe::host
