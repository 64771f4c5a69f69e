#include "host/stabilize/picture_motion.h"

#include <algorithm>
#include <array>
#include <cmath>
#include <cstddef>
#include <optional>

#include "host/stabilize/warped_plane.h"
#include "host/stabilize/window/clip_windows.h"
#include "platform/tessel/threads.h"

namespace calmframe::host {
namespace {

// Where the tracks that go on from one frame to the next were and are.
struct TrackPairs {
  std::vector<Point> before, now;  // equally many
};

TrackPairs PairsOf(const SolvedClip& clip, const WarpedPlane& plane, std::size_t frame) {
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
constexpr double kTolerance = 0.003;  // of the width, as for the background's motion
constexpr double kLost = 0.006;       // of the width: a track that left its place, not the scene

// (x, y) -> (h0 x + h1 y + h2, h3 x + h4 y + h5) / (h6 x + h7 y + 1)
using Homography = std::array<double, 8>;

Point Apply(const Homography& h, Point p) {
  const double w = h[6] * p.x + h[7] * p.y + 1;
  return {(h[0] * p.x + h[1] * p.y + h[2]) / w, (h[3] * p.x + h[4] * p.y + h[5]) / w};
}

// Solves A x = b of the upper triangle, A positive definite (Cholesky); none where it isn't.
std::optional<Homography> Solve(std::array<std::array<double, 8>, 8> a, Homography b) {
  for (std::size_t i = 0; i < 8; ++i) {
    for (std::size_t j = i; j < 8; ++j) {
      double sum = a[i][j];
      for (std::size_t k = 0; k < i; ++k) sum -= a[k][i] * a[k][j];
      if (i == j) {
        if (!(sum > 1e-12)) return {};
        a[i][i] = std::sqrt(sum);
      } else {
        a[i][j] = sum / a[i][i];
      }
    }
  }
  for (std::size_t i = 0; i < 8; ++i) {
    for (std::size_t k = 0; k < i; ++k) b[i] -= a[k][i] * b[k];
    b[i] /= a[i][i];
  }
  for (std::size_t i = 8; i-- > 0;) {
    for (std::size_t k = i + 1; k < 8; ++k) b[i] -= a[i][k] * b[k];
    b[i] /= a[i][i];
  }
  return b;
}

// Of points in halves of the width.
Homography Fit(const TrackPairs& pairs, double unit, const Similarity& start) {
  Homography h{start.a, -start.b, start.dx / unit, start.b, start.a, start.dy / unit, 0, 0};
  constexpr int kRounds = 6;
  constexpr double kFarthest = 1.5 * kTolerance * 2;
  for (int round = 0; round < kRounds; ++round) {
    std::array<std::array<double, 8>, 8> a{};
    Homography b{};
    for (std::size_t i = 0; i < pairs.now.size(); ++i) {
      const Point p{pairs.before[i].x / unit, pairs.before[i].y / unit};
      const Point q{pairs.now[i].x / unit, pairs.now[i].y / unit};
      const Point reached = Apply(h, p);
      const double miss = std::hypot(reached.x - q.x, reached.y - q.y) / kFarthest;
      if (!(miss < 1)) continue;
      const double weight = (1 - miss * miss) * (1 - miss * miss);
      const double rows[2][8] = {{p.x, p.y, 1, 0, 0, 0, -p.x * q.x, -p.y * q.x},
                                 {0, 0, 0, p.x, p.y, 1, -p.x * q.y, -p.y * q.y}};
      const double right[2] = {q.x, q.y};
      for (int r = 0; r < 2; ++r) {
        for (std::size_t j = 0; j < 8; ++j) {
          if (rows[r][j] == 0) continue;
          b[j] += weight * rows[r][j] * right[r];
          for (std::size_t k = j; k < 8; ++k) a[j][k] += weight * rows[r][j] * rows[r][k];
        }
      }
    }
    // What the tracks leave open stays as the similarity has it: no tilt.
    a[6][6] += 1e-3, a[7][7] += 1e-3;
    const std::optional<Homography> solved = Solve(a, b);
    if (!solved) return h;
    h = *solved;
  }
  return h;
}

using Cells = std::array<std::optional<Point>, kColumns * kRows>;

double Median(std::vector<double>& values) {
  const auto middle = values.begin() + static_cast<std::ptrdiff_t>(values.size() / 2);
  std::nth_element(values.begin(), middle, values.end());
  return *middle;
}

// `start`: from the frame before to this one.
Cells Residuals(const TrackPairs& pairs, const Similarity& start, double width, double height) {
  Cells cells;
  if (pairs.now.size() < 8) return cells;
  const double unit = width / 2;
  const Homography h = Fit(pairs, unit, start);
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
std::vector<TrackPath> PathsOf(const SolvedClip& clip, const WarpedPlane& plane) {
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

PictureMotion FindMotion(const SolvedClip& clip, Warps warps) {
  const WarpedPlane plane(clip, warps);
  const auto frames = static_cast<std::size_t>(clip.frame_count);
  PictureMotion motion{std::vector<Similarity>(frames), {}, {}};
  std::vector<Cells> cells(frames);
  tessel::threads::ExecuteCPUBoundTaskOnAllProcessors(
      [&](std::size_t before) {
        const std::size_t f = before + 1;
        const TrackPairs pairs = PairsOf(clip, plane, f);
        motion.background[f] = FitMotion(pairs.now, pairs.before, kTolerance * clip.width);
        cells[f] = Residuals(pairs, Inverse(motion.background[f]), clip.width, clip.height);
      },
      frames - 1);
  motion.wobble = Flicker(cells);
  motion.paths = PathsOf(clip, plane);
  return motion;
}

}  // namespace calmframe::host
