#include "apps/report/camera_path.h"

#include <algorithm>
#include <cmath>

namespace calmframe::report {
namespace {

constexpr std::size_t kLeastMatches = 3;
constexpr int kRounds = 10;
constexpr double kLeastSpread = 0.02;       // pixels; residuals below are the tracker's own
constexpr double kCutoff = 4.685 * 1.4826;  // of Tukey's biweight, in median residuals

// p -> (a -b; b a) p + (x, y), about the centre.
struct Similarity {
  double a = 1, b = 0, x = 0, y = 0;
  Point Of(Point p) const { return {a * p.x - b * p.y + x, b * p.x + a * p.y + y}; }
};

Point Minus(Point p, Point q) {
  return {p.x - q.x, p.y - q.y};
}

std::optional<Similarity> LeastSquares(std::span<const Match> matches,
                                       const std::vector<double>& weights, Point centre) {
  double sum = 0;
  Point from{}, to{};
  for (std::size_t i = 0; i < matches.size(); ++i) {
    const double w = weights[i];
    sum += w;
    from = {from.x + w * matches[i].from.x, from.y + w * matches[i].from.y};
    to = {to.x + w * matches[i].to.x, to.y + w * matches[i].to.y};
  }
  if (!(sum > 0)) return {};
  from = {from.x / sum, from.y / sum};
  to = {to.x / sum, to.y / sum};
  double square = 0, dot = 0, cross = 0;
  for (std::size_t i = 0; i < matches.size(); ++i) {
    const Point p = Minus(matches[i].from, from);
    const Point q = Minus(matches[i].to, to);
    square += weights[i] * (p.x * p.x + p.y * p.y);
    dot += weights[i] * (p.x * q.x + p.y * q.y);
    cross += weights[i] * (p.x * q.y - p.y * q.x);
  }
  if (!(square > 0)) return {};
  Similarity similarity{dot / square, cross / square, 0, 0};
  const Point base = similarity.Of(Minus(from, centre));
  const Point goal = Minus(to, centre);
  similarity.x = goal.x - base.x;
  similarity.y = goal.y - base.y;
  return similarity;
}

double Median(std::vector<double> values) {
  const auto middle = values.begin() + static_cast<std::ptrdiff_t>(values.size() / 2);
  std::nth_element(values.begin(), middle, values.end());
  return *middle;
}

}  // namespace

std::optional<FrameMotion> FitMotion(std::span<const Match> matches, Point centre) {
  if (matches.size() < kLeastMatches) return {};
  std::vector<double> weights(matches.size(), 1.0);
  std::vector<double> residuals(matches.size());
  // Begins at the median shift, which half of the matches can't lead astray.
  Similarity similarity;
  for (std::size_t i = 0; i < matches.size(); ++i) {
    residuals[i] = matches[i].to.x - matches[i].from.x;
  }
  similarity.x = Median(residuals);
  for (std::size_t i = 0; i < matches.size(); ++i) {
    residuals[i] = matches[i].to.y - matches[i].from.y;
  }
  similarity.y = Median(residuals);
  for (int round = 0; round < kRounds; ++round) {
    for (std::size_t i = 0; i < matches.size(); ++i) {
      const Point p = similarity.Of(Minus(matches[i].from, centre));
      const Point q = Minus(matches[i].to, centre);
      residuals[i] = std::hypot(p.x - q.x, p.y - q.y);
    }
    const double cutoff = kCutoff * std::max(Median(residuals), kLeastSpread);
    for (std::size_t i = 0; i < matches.size(); ++i) {
      const double t = residuals[i] / cutoff;
      weights[i] = t < 1 ? (1 - t * t) * (1 - t * t) : 0;
    }
    const std::optional<Similarity> fitted = LeastSquares(matches, weights, centre);
    if (!fitted) return {};
    similarity = *fitted;
  }
  return FrameMotion{similarity.x, similarity.y, std::atan2(similarity.b, similarity.a),
                     std::hypot(similarity.a, similarity.b)};
}

double ShakeOf(std::span<const CameraPlace> path) {
  if (path.size() < 3) return 0;
  double sum = 0;
  for (std::size_t i = 2; i < path.size(); ++i) {
    const double x = path[i].x - 2 * path[i - 1].x + path[i - 2].x;
    const double y = path[i].y - 2 * path[i - 1].y + path[i - 2].y;
    sum += x * x + y * y;
  }
  return std::sqrt(sum / static_cast<double>(path.size() - 2));
}

}  // namespace calmframe::report
