#include "stabilization/transitions/wild_steps.h"

#include <algorithm>

#include "stabilization/models/motion_fits.h"

namespace marrow::stabilization {
namespace {

constexpr int kPasses = 20;
constexpr double kLeastDistance = 0.1;  // pixels: nearer steps all pull alike

// By iteratively reweighted least squares (Bjorck, Numerical Methods for Least Squares Problems,
// 1996). Squares would let one far step turn the frame. Leaves each step's distance from the
// result in `distances`.
void fit_least_distances(std::vector<Displacement>& steps, std::vector<double>& distances) {
  for (int pass = 0; pass < kPasses; ++pass) {
    const matrix3 motion = fitSimilarity(steps);
    distances.clear();
    for (Displacement& step : steps) {
      distances.push_back(distance_off(motion, step));
      step.weight = 1 / std::max(distances.back(), kLeastDistance);
    }
  }
}

// The root of the weight, as it multiplies the residual.
double root_weight(double distance, double sigma) {
  const double excess = distance / sigma - 1;
  return excess > 0 ? std::max(0.0, 1 - excess * excess) : 1.0;
}

}  // namespace

void weigh_down_wild_steps(std::vector<smoothing_track>& tracks, std::int64_t frames,
                           double sigma) {
  std::vector<Displacement> steps;
  std::vector<smoothing_track*> movers;
  std::vector<double> distances;
  for (std::int64_t f = 1; f < frames; ++f) {
    steps.clear();
    movers.clear();
    for (smoothing_track& track : tracks) {
      if (f <= track.first || f >= track.end()) continue;
      const point2* to = &track.points[static_cast<std::size_t>(f - track.first)];
      Displacement step;
      step.sourceX = to[-1].x;
      step.sourceY = to[-1].y;
      step.targetX = to->x;
      step.targetY = to->y;
      step.weight = 1;
      steps.push_back(step);
      movers.push_back(&track);
    }
    if (steps.size() < kLeastSteps) continue;
    fit_least_distances(steps, distances);
    std::vector<double> sorted = distances;
    const auto middle = sorted.begin() + static_cast<std::ptrdiff_t>(sorted.size() / 2);
    std::nth_element(sorted.begin(), middle, sorted.end());
    const double unit = std::max(sigma, *middle);
    for (std::size_t k = 0; k < movers.size(); ++k) {
      const double root = root_weight(distances[k], unit);
      double* weight =
          &movers[k]->smoothness_weight[static_cast<std::size_t>(f - movers[k]->first)];
      weight[-1] *= root;
      weight[0] *= root;
    }
  }
}

}  // namespace marrow::stabilization
