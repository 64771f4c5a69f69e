#pragma once

#include "stabilization/transitions/dense_smoothing_problem.h"

namespace marrow::stabilization {

// One track's stretch of consecutive frames of a smoothing problem.
struct smoothing_track {
  std::int64_t first = 0;  // frame of the problem
  std::vector<point2> points;
  std::vector<double> data_weight;        // a point: holds the frame near the identity
  std::vector<double> smoothness_weight;  // a point: of the second difference in its middle

  std::int64_t end() const { return first + static_cast<std::int64_t>(points.size()); }
};

// Similarities T_f that leave tracks o smooth without straying far: for each sample
// wd (T_f(o) - o), and for each three consecutive samples o-, o, o+ the second difference of the
// stabilized track in the middle frame's coordinates,
// ws R(-angle) (T-(o-) + T+(o+) - 2 T(o)) / scale.
class transition_smoother : public dense_smoothing_problem {
 public:
  // Keeps `tracks` by reference. held: empty, or for each of the four numbers of each frame whether
  // it stays as it starts. A failure to allocate sets `failed`.
  transition_smoother(std::int64_t frames, const std::vector<smoothing_track>& tracks,
                      std::vector<bool> held = {});

  void compute_cost(const double* x, double* f) override;
  void compute_sparse_jacobian(const double* x, const double* f) override;

 private:
  const std::vector<smoothing_track>& tracks_;
  const std::vector<bool> held_;
};

}  // namespace marrow::stabilization
