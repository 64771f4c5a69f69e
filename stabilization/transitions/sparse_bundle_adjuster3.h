#pragma once

#include <cstdint>
#include <span>
#include <vector>

#include "stabilization/least_squares/band_normal_system.h"
#include "stabilization/models/matrix3.h"
#include "stabilization/models/similarity.h"
#include "stabilization/progress.h"

namespace marrow::stabilization {

// One frame's motion within a bundle problem: takes scene points to the frame. Not variable on the
// problem's first frame, which stays the identity and so fixes the scene's coordinates.
struct frame_motion {
  double scale = 1.0;
  double angle = 0.0;
  double tx = 0.0;
  double ty = 0.0;
  bool variable = true;
};

// Bundle adjustment of one plane similarity a camera and plane scene points: minimises the
// distances between T_camera(point) and the observations (Triggs, McLauchlan, Hartley and
// Fitzgibbon, Bundle adjustment - a modern synthesis, 1999). Unknowns: (scale, angle, tx, ty) of
// each variable camera, then (X, Y) of each point, the first group's points before the second's. J
// is kept in blocks, 2 x 4 for the camera and 2 x 2 for the point of an observation; the points are
// eliminated by a Schur complement. It couples cameras that see one point, so it is a band as wide
// as the longest track. The operations are those that lm_solver asks for.
class sparse_bundle_adjuster3 {
 public:
  struct observation {
    std::int32_t camera;
    std::int32_t group;  // 0 or 1
    std::int32_t point;  // within the group
    point2 position;     // pixels of the camera's frame
  };

  bool user_error = false;
  bool failed = false;  // construction or the last run failed

  virtual ~sparse_bundle_adjuster3() = default;
  sparse_bundle_adjuster3(const sparse_bundle_adjuster3&) = delete;
  sparse_bundle_adjuster3& operator=(const sparse_bundle_adjuster3&) = delete;

  const std::vector<frame_motion>& cameras() const { return cameras_; }
  const std::vector<point2>& points(int group = 0) const { return points_[group]; }

  // Runs the solver from the present cameras and points, which receive the result. False where the
  // run failed.
  bool solve(std::int64_t max_iter, const progress_functor& progress);

  std::int64_t residual_count() const {
    return 2 * static_cast<std::int64_t>(observations_.size());
  }
  std::int64_t unknown_count() const;

  // Scatters x to the cameras and points first.
  void compute_cost(const double* x, double* f);
  void compute_sparse_jacobian(const double* x, const double* f);
  void update_unknown(const double* x, const double* step, double* x_new) const;
  bool monitor_progress(std::int64_t, const double*, const double*) const { return true; }
  void j_norm(double* norms) const;
  void jtf(const double* f, double* g) const;
  double jtj_quadratic(const double* p) const;
  void update_pinv_jtj_diag(const double* d);
  void pinv_jtj_x(const double* b, double* x);
  bool j_fullrank() const;
  double pinv_jtj_quadratic(const double* v);
  void report_initial_residual(double, std::int64_t) const {}
  void report_iteration_residual(double, std::int64_t) const {}
  void report_final_residual(double, std::int64_t) const {}

 protected:
  sparse_bundle_adjuster3() = default;

  // Sizes all blocks for the cameras, points and observations below, in one piece of memory. Throws
  // lapack_failure where the reduced system is too large for LAPACK's integers.
  void setup_secondary_variables();
  void gather(double* x) const;
  void scatter(const double* x);

  std::vector<frame_motion> cameras_;
  std::vector<point2> points_[2];
  std::vector<observation> observations_;  // those of one point stand together

 private:
  std::int64_t flat_point(const observation& o) const {
    return o.group == 0 ? o.point : static_cast<std::int64_t>(points_[0].size()) + o.point;
  }

  std::int64_t primary_ = 0;                 // unknowns of cameras
  std::int64_t points_total_ = 0;            // of both groups
  std::vector<std::int32_t> camera_column_;  // a camera: its first unknown, or -1
  std::vector<std::size_t> point_begin_;     // a point: its first observation; one more at the end

  std::vector<double> arena_;
  std::span<double> camera_blocks_;   // an observation: 2 x 4
  std::span<double> point_blocks_;    // an observation: 2 x 2
  std::span<double> coupling_;        // an observation: W = Jc'Jp, 4 x 2
  std::span<double> coupling_vinv_;   // an observation: W Vinv, 4 x 2
  std::span<double> primary_normal_;  // a variable camera: 4 x 4 of J'J
  std::span<double> point_normal_;    // a point: xx, xy, yy of J'J
  std::span<double> point_inverse_;   // a point: xx, xy, yy of (V + D)^-1
  std::span<double> reduced_;         // primary unknowns
  std::span<double> product_;         // all unknowns
  band_normal_system system_;
  bool factorized_ = false;
};

}  // namespace marrow::stabilization
