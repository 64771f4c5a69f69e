#include "host/stabilize/window/clip_windows.h"

#include <algorithm>
#include <cmath>
#include <cstddef>
#include <cstdint>
#include <utility>

namespace calmframe::host {
namespace {

// Vertices of a side, in an order that has the frame's inside on its right in a plane with y down.
std::vector<Point> Side(const WarpView& warp, int side) {
  std::vector<Point> points;
  const int last_column = warp.columns - 1, last_row = warp.rows - 1;
  for (int i = 0; i < (side % 2 == 0 ? warp.columns : warp.rows); ++i) {
    switch (side) {
      case 0:
        points.push_back(warp.at(i, 0));
        break;
      case 1:
        points.push_back(warp.at(last_column, i));
        break;
      case 2:
        points.push_back(warp.at(last_column - i, last_row));
        break;
      default:
        points.push_back(warp.at(0, last_row - i));
    }
  }
  return points;
}

// Least squares of the shift, turn and scale between weighted pairs.
Similarity Fit(const std::vector<Point>& from, const std::vector<Point>& to,
               const std::vector<double>& weights) {
  double sum = 0;
  Point from_mean, to_mean;
  for (std::size_t i = 0; i < from.size(); ++i) {
    sum += weights[i];
    from_mean.x += weights[i] * from[i].x;
    from_mean.y += weights[i] * from[i].y;
    to_mean.x += weights[i] * to[i].x;
    to_mean.y += weights[i] * to[i].y;
  }
  if (sum <= 0) return {};
  from_mean = {from_mean.x / sum, from_mean.y / sum};
  to_mean = {to_mean.x / sum, to_mean.y / sum};
  double along = 0, across = 0, square = 0;
  for (std::size_t i = 0; i < from.size(); ++i) {
    const double fx = from[i].x - from_mean.x, fy = from[i].y - from_mean.y;
    const double tx = to[i].x - to_mean.x, ty = to[i].y - to_mean.y;
    along += weights[i] * (fx * tx + fy * ty);
    across += weights[i] * (fx * ty - fy * tx);
    square += weights[i] * (fx * fx + fy * fy);
  }
  Similarity fit;
  if (square > 0) fit = {along / square, across / square, 0, 0};
  if (fit.a == 0 && fit.b == 0) fit.a = 1;
  const Point shifted = fit(from_mean);
  fit.dx = to_mean.x - shifted.x;
  fit.dy = to_mean.y - shifted.y;
  return fit;
}

double SquaredMiss(const Similarity& fit, const Point& from, const Point& to) {
  const Point reached = fit(from);
  const double x = reached.x - to.x, y = reached.y - to.y;
  return x * x + y * y;
}

}  // namespace

bool IsInReach(const Point& point) {
  constexpr double kFarthest = 1 << 20;
  return std::abs(point.x) < kFarthest && std::abs(point.y) < kFarthest;
}

std::vector<HalfPlane> CoveredRegion(const WarpView& warp, double margin) {
  std::vector<HalfPlane> region;
  Point middle;
  const int count = warp.columns * warp.rows;
  for (int i = 0; i < count; ++i) {
    if (!IsInReach(warp.vertices[i])) return {};
    middle.x += warp.vertices[i].x / count;
    middle.y += warp.vertices[i].y / count;
  }
  for (int side = 0; side < 4; ++side) {
    const std::vector<Point> points = Side(warp, side);
    // Along the side's chord; then inwards past the vertex that lies furthest in.
    const double x = points.back().x - points.front().x, y = points.back().y - points.front().y;
    const double length = std::hypot(x, y);
    if (!(length > 0)) return {};
    HalfPlane half{y / length, -x / length, 0};
    half.limit = half.nx * points.front().x + half.ny * points.front().y;
    for (const Point& point : points) {
      half.limit = std::min(half.limit, half.nx * point.x + half.ny * point.y);
    }
    half.limit -= margin;
    if (!(half.nx * middle.x + half.ny * middle.y < half.limit)) return {};
    region.push_back(half);
  }
  return region;
}

double UncoveredShare(const WarpView& warp, double width, double height) {
  std::vector<Point> outline;
  for (int side = 0; side < 4; ++side) {
    const std::vector<Point> points = Side(warp, side);
    outline.insert(outline.end(), points.begin(), points.end() - 1);
  }
  if (!std::all_of(outline.begin(), outline.end(), IsInReach)) return 1;
  const HalfPlane sides[] = {
      {1, 0, width / 2}, {-1, 0, width / 2}, {0, 1, height / 2}, {0, -1, height / 2}};
  for (const HalfPlane& side : sides) {
    const auto beyond = [&side](const Point& p) {
      return side.nx * p.x + side.ny * p.y - side.limit;
    };
    std::vector<Point> kept;
    for (std::size_t i = 0; i < outline.size(); ++i) {
      const Point& from = outline[i];
      const Point& to = outline[(i + 1) % outline.size()];
      const double a = beyond(from), b = beyond(to);
      if (a <= 0) kept.push_back(from);
      if ((a <= 0) != (b <= 0)) {
        kept.push_back(
            {from.x + (to.x - from.x) * a / (a - b), from.y + (to.y - from.y) * a / (a - b)});
      }
    }
    outline = std::move(kept);
  }
  double twice = 0;
  for (std::size_t i = 0; i < outline.size(); ++i) {
    const Point& p = outline[i];
    const Point& q = outline[(i + 1) % outline.size()];
    twice += p.x * q.y - q.x * p.y;
  }
  return std::clamp(1 - twice / 2 / (width * height), 0.0, 1.0);
}

Similarity FitMotion(const std::vector<Point>& from, const std::vector<Point>& to,
                     double tolerance) {
  if (from.size() < 3) return {};
  // At least so many pairs; then until one of two points on the best motion was among them but for
  // a chance of 1 in 1000 (Fischler and Bolles, Communications of the ACM 24, 1981), at most 200.
  constexpr int kFewestPairs = 30, kMostPairs = 200;
  const double kMissed = std::log(0.001);
  constexpr std::size_t kJudges = 250;  // points by which a pair is judged, evenly out of all
  const std::size_t every = (from.size() + kJudges - 1) / kJudges;
  std::uint64_t state = 1;  // a fixed series: Knuth's 64-bit congruential generator
  const auto next = [&] {
    state = state * 6364136223846793005u + 1442695040888963407u;
    return static_cast<std::size_t>((state >> 33) % from.size());
  };
  const double square = tolerance * tolerance;
  const auto score = [&](const Similarity& fit) {
    double sum = 0;
    for (std::size_t i = 0; i < from.size(); i += every) {
      sum += std::max(0.0, 1 - SquaredMiss(fit, from[i], to[i]) / square);
    }
    return sum;
  };
  Similarity best;
  double best_score = -1;
  const double judges = std::ceil(static_cast<double>(from.size()) / static_cast<double>(every));
  double pairs = kMostPairs;
  for (int pair = 0; pair < std::max<double>(pairs, kFewestPairs); ++pair) {
    const std::size_t i = next(), j = next();
    const double x = from[j].x - from[i].x, y = from[j].y - from[i].y;
    if (x * x + y * y < 100 * square) continue;  // too near to tell a turn
    const Similarity fit = Fit({from[i], from[j]}, {to[i], to[j]}, {1, 1});
    const double reached = score(fit);
    if (reached <= best_score) continue;
    best_score = reached;
    best = fit;
    const double share = std::clamp(reached / judges, 0.001, 0.999);
    pairs = std::min<double>(kMostPairs, kMissed / std::log(1 - share * share));
  }
  return RefitMotion(best, from, to, std::vector<double>(from.size(), 1.0), tolerance);
}

Similarity RefitMotion(Similarity motion, const std::vector<Point>& from,
                       const std::vector<Point>& to, const std::vector<double>& shares,
                       double tolerance) {
  constexpr int kRounds = 8;
  const double square = tolerance * tolerance;
  std::vector<double> weights(from.size());
  for (int round = 0; round < kRounds; ++round) {
    for (std::size_t i = 0; i < from.size(); ++i) {
      const double rest = std::max(0.0, 1 - SquaredMiss(motion, from[i], to[i]) / (2.25 * square));
      weights[i] = shares[i] * rest * rest;
    }
    motion = Fit(from, to, weights);
  }
  return motion;
}

}  // namespace calmframe::host
