#pragma once

#include "stabilization/transitions/dense_smoothing_problem.h"

namespace marrow::stabilization {

// One scene point's stretch of consecutive frames.
struct refiner_track {
  std::int64_t first = 0;  // frame of the problem
  point2 point;            // in the scene, fixed
  std::vector<point2> observations;
  // Set where the track goes on from solved frames: its stabilized positions two frames and one
  // frame before frame 0.
  bool continues = false;
  point2 two_before = {};
  point2 one_before = {};

  std::int64_t end() const { return first + static_cast<std::int64_t>(observations.size()); }
};

// Smooths frame motions T_f against fixed scene points P: frame_weights[f] (T_f(P) - o) a sample,
// lambda (T_f-1(P) + T_f+1(P) - 2 T_f(P)) an interior frame, and for tracks that continue
// lambda2 * 100 times the second differences across the start.
class transition_refiner : public dense_smoothing_problem {
 public:
  // Keeps `tracks` by reference; frame_weights has one number a frame. A failure to allocate sets
  // `failed`.
  transition_refiner(const std::vector<double>& frame_weights,
                     const std::vector<refiner_track>& tracks, double lambda, double lambda2);

  void compute_cost(const double* x, double* f) override;
  void compute_sparse_jacobian(const double* x, const double* f) override;

 private:
  // Appends weight * sum of coefficients[k] T_{frame + k}(P) to J.
  void add_columns(std::size_t index, const frame_unknowns* frame, int frames,
                   const double* coefficients, double weight, point2 point);

  std::vector<double> frame_weights_;
  const std::vector<refiner_track>& tracks_;
  double lambda_;
  double join_weight_;
};

}  // namespace marrow::stabilization
