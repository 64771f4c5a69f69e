#include "host/stabilize/picture_motion.h"

#include <algorithm>
#include <array>
#include <cmath>
#include <cstddef>
#include <optional>
#include <utility>

#include "host/stabilize/homography.h"
#include "host/stabilize/median.h"
#include "host/stabilize/path_correction.h"
#include "host/stabilize/track_paths.h"
#include "host/stabilize/window/clip_windows.h"
#include "platform/tessel/threads.h"

namespace calmframe::host {
namespace {

// Where the tracks that go on from one frame to the next were and are.
struct TrackPairs {
  std::vector<Point> before, now;  // equally many
};

TrackPairs PairsOf(const TrackRow& before, const TrackRow& now) {
  TrackPairs pairs;
  for (std::size_t s = 0; s < now.statuses.size(); ++s) {
    if (now.statuses[s] != 0 || before.statuses[s] < 0) continue;
    if (!IsInReach(now.places[s]) || !IsInReach(before.places[s])) continue;
    pairs.now.push_back(now.places[s]);
    pairs.before.push_back(before.places[s]);
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

// Of a frame between two others.
double Flicker(const Cells& before, const Cells& now, const Cells& after) {
  double sum = 0;
  int count = 0;
  for (std::size_t c = 0; c < now.size(); ++c) {
    if (!now[c] || !before[c] || !after[c]) continue;
    const double x = now[c]->x - (before[c]->x + after[c]->x) / 2;
    const double y = now[c]->y - (before[c]->y + after[c]->y) / 2;
    sum += (x * x + y * y) / 1.5;  // of three independent values the variance is that of one
    ++count;
  }
  return count > 0 ? std::sqrt(sum / count) : 0;
}

}  // namespace

PictureMotion FindMotion(const WarpedPlane& plane) {
  const SolvedClip& clip = plane.clip();
  const auto frames = static_cast<std::size_t>(clip.frame_count);
  PictureMotion motion{std::vector<Similarity>(frames), std::vector<double>(frames, 0)};
  // A stretch of frames after the other, so that no more than its rows are there at a time.
  constexpr std::size_t kStretch = 256;
  PathGatherer paths(clip.slots);
  TrackRow last;
  Cells before_last_cells, last_cells;
  for (std::size_t first = 0; first < frames; first += kStretch) {
    const std::size_t count = std::min(kStretch, frames - first);
    std::vector<TrackRow> rows(count);
    tessel::threads::ExecuteCPUBoundTaskOnAllProcessors(
        [&](std::size_t i) {
          rows[i] = RowInPlane(plane.Frame(first + i), clip.TracksOf(first + i));
        },
        count);
    std::vector<Cells> cells(count);
    tessel::threads::ExecuteCPUBoundTaskOnAllProcessors(
        [&](std::size_t i) {
          const std::size_t f = first + i;
          if (f == 0) return;
          const TrackPairs pairs = PairsOf(i > 0 ? rows[i - 1] : last, rows[i]);
          motion.background[f] = FitMotion(pairs.now, pairs.before, kTrackTolerance * clip.width);
          cells[i] = Residuals(pairs, Inverse(motion.background[f]), clip.width, clip.height);
        },
        count);
    for (std::size_t i = 0; i < count; ++i) {
      if (first + i >= 2) {
        motion.wobble[first + i - 1] = Flicker(before_last_cells, last_cells, cells[i]);
      }
      before_last_cells = std::exchange(last_cells, cells[i]);
    }
    for (const TrackRow& row : rows) paths.Add(row);
    last = std::move(rows.back());
  }
  CorrectByPaths(paths.Take(), kTrackTolerance * clip.width, motion.background);
  return motion;
}

}  // namespace calmframe::host
