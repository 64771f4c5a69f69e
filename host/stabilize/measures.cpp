#include "host/stabilize/measures.h"

#include <algorithm>
#include <array>
#include <cmath>
#include <cstddef>

#include "host/stabilize/median.h"

namespace calmframe::host {
namespace {

constexpr int kPlaces = 5;      // in a row, and in a column
constexpr double kReach = 0.6;  // seconds

// What the middle of a least squares parabola through 2 reach + 1 values is made of.
std::vector<double> ParabolaWeights(std::ptrdiff_t reach) {
  const double m = 2.0 * static_cast<double>(reach) + 1;
  std::vector<double> weights;
  for (std::ptrdiff_t i = -reach; i <= reach; ++i) {
    const auto at = static_cast<double>(i);
    weights.push_back((3 * m * m - 7 - 20 * at * at) / 4 / (m * (m * m - 4) / 3));
  }
  return weights;
}

std::ptrdiff_t ReachOf(std::ptrdiff_t frames, double frames_per_second) {
  const auto reach = std::max<std::ptrdiff_t>(3, std::lround(kReach * frames_per_second));
  return frames < 2 * reach + 1 ? std::max<std::ptrdiff_t>(2, (frames - 1) / 2) : reach;
}

struct WorstSecond {
  double mean = 0;    // the greatest of a second's values; 0 where none is above
  double middle = 0;  // of that second, in values from the first
};

WorstSecond FindWorstSecond(const std::vector<double>& values, double frames_per_second) {
  WorstSecond worst;
  const auto second = std::clamp<std::size_t>(
      static_cast<std::size_t>(std::lround(frames_per_second)), 1, values.size());
  double sum = 0;
  for (std::size_t f = 0; f < values.size(); ++f) {
    sum += values[f];
    if (f + 1 < second) continue;
    if (f >= second) sum -= values[f - second];
    const double mean = sum / static_cast<double>(second);
    if (mean <= worst.mean) continue;
    worst = {mean, static_cast<double>(f) - static_cast<double>(second - 1) / 2};
  }
  return worst;
}

}  // namespace

Shake MeasureShake(const ShownMotion& shown, double frames_per_second) {
  const auto frames = static_cast<std::ptrdiff_t>(shown.motions.size());
  const std::ptrdiff_t reach = ReachOf(frames, frames_per_second);
  if (frames < 2 * reach + 1) return {};
  const std::vector<double> weights = ParabolaWeights(reach);
  std::vector<std::array<double, kPlaces * kPlaces>> of_places(
      static_cast<std::size_t>(frames - 2 * reach));
  std::vector<Point> path(static_cast<std::size_t>(frames));
  for (std::size_t place = 0; place < kPlaces * kPlaces; ++place) {
    const Point at{shown.width * (static_cast<double>(place % kPlaces) / (kPlaces - 1) - 0.5),
                   shown.height * (static_cast<double>(place / kPlaces) / (kPlaces - 1) - 0.5)};
    for (std::size_t f = 1; f < path.size(); ++f) {
      const Point before = shown.motions[f](at);
      path[f] = {path[f - 1].x + at.x - before.x, path[f - 1].y + at.y - before.y};
    }
    for (std::size_t f = 0; f < of_places.size(); ++f) {
      const std::size_t middle = f + static_cast<std::size_t>(reach);
      Point off = path[middle];
      for (std::size_t i = 0; i < weights.size(); ++i) {
        off.x -= weights[i] * path[f + i].x;
        off.y -= weights[i] * path[f + i].y;
      }
      of_places[f][place] = std::hypot(off.x, off.y) * 1000 / shown.width;
    }
  }
  std::vector<double> shakes;
  for (auto& places : of_places) {
    const auto middle = places.begin() + places.size() / 2;
    std::nth_element(places.begin(), middle, places.end());
    shakes.push_back(*middle);
  }
  Shake shake;
  for (const double value : shakes) shake.mean += value / static_cast<double>(shakes.size());
  const WorstSecond worst = FindWorstSecond(shakes, frames_per_second);
  shake.worst = worst.mean;
  if (worst.mean > 0) {
    shake.worst_at = (worst.middle + static_cast<double>(reach)) / frames_per_second;
  }
  std::sort(shakes.begin(), shakes.end());
  shake.p95 = shakes[std::min(shakes.size() - 1, shakes.size() * 19 / 20)];
  return shake;
}

Straying MeasureStraying(const ShownMotion& shown, double frames_per_second) {
  const auto frames = static_cast<std::ptrdiff_t>(shown.aims.size());
  const std::ptrdiff_t reach = ReachOf(frames, frames_per_second);
  if (frames < 2 * reach + 1) return {};
  const std::vector<double> weights = ParabolaWeights(reach);
  std::vector<Point> aims = shown.aims;
  Point last;
  for (Point& aim : aims) {
    if (!std::isfinite(aim.x) || !std::isfinite(aim.y)) aim = last;
    last = aim;
  }
  Straying straying;
  std::vector<double> away(static_cast<std::size_t>(frames - 2 * reach));
  for (std::size_t f = 0; f < away.size(); ++f) {
    Point calm;
    for (std::size_t i = 0; i < weights.size(); ++i) {
      calm.x += weights[i] * aims[f + i].x;
      calm.y += weights[i] * aims[f + i].y;
    }
    away[f] = std::hypot(calm.x, calm.y) * 1000 / shown.width;
    straying.mean += away[f] / static_cast<double>(away.size());
  }
  straying.worst = FindWorstSecond(away, frames_per_second).mean;
  return straying;
}

double MeasureWobble(const ShownMotion& shown) {
  double sum = 0;
  int frames = 0;
  for (const double wobble : shown.wobble) {
    if (wobble == 0) continue;
    sum += wobble;
    ++frames;
  }
  return frames == 0 ? 0 : sum / frames * 1000 / shown.width;
}

double MeasureTrackShake(const ShownMotion& shown, double frames_per_second) {
  const std::size_t frames = shown.motions.size();
  const auto reach =
      static_cast<std::size_t>(ReachOf(static_cast<std::ptrdiff_t>(frames), frames_per_second));
  const std::vector<double> weights = ParabolaWeights(static_cast<std::ptrdiff_t>(reach));
  if (!shown.paths) return 0;
  double sum = 0;
  int count = 0;
  // A stretch of frames after the other, so that no more than its shakes are there at a time.
  constexpr std::size_t kStretch = 4096;
  std::vector<Point> points;
  for (std::size_t first = 0; first < frames; first += kStretch) {
    const std::size_t end = std::min(frames, first + kStretch);
    std::vector<std::vector<double>> of_frames(end - first);
    for (const TrackPath& path : *shown.paths) {
      // The frames of the path that are both in the stretch and far enough from its ends.
      const std::size_t begin = std::max(path.first + reach, first);
      const std::size_t length = path.points.size();
      const std::size_t stop = std::min(path.first + length - std::min(reach, length), end);
      if (begin >= stop) continue;
      const std::size_t behind = begin - reach - path.first;
      points.assign(path.points.begin() + static_cast<std::ptrdiff_t>(behind),
                    path.points.begin() + static_cast<std::ptrdiff_t>(stop - path.first + reach));
      if (!shown.to_output.empty()) {
        for (std::size_t i = 0; i < points.size(); ++i) {
          points[i] = shown.to_output[begin - reach + i](points[i]);
        }
      }
      for (std::size_t frame = begin; frame < stop; ++frame) {
        Point off = points[frame - begin + reach];
        for (std::size_t i = 0; i < weights.size(); ++i) {
          off.x -= weights[i] * points[frame - begin + i].x;
          off.y -= weights[i] * points[frame - begin + i].y;
        }
        of_frames[frame - first].push_back(std::hypot(off.x, off.y) * 1000 / shown.width);
      }
    }
    for (std::vector<double>& shakes : of_frames) {
      if (shakes.size() < 3) continue;
      sum += Median(shakes);
      ++count;
    }
  }
  return count == 0 ? 0 : sum / count;
}

}  // namespace calmframe::host
