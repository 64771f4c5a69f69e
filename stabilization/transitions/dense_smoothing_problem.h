#pragma once

#include <array>
#include <cmath>
#include <cstdint>
#include <vector>

#include "stabilization/least_squares/band_normal_system.h"
#include "stabilization/models/matrix3.h"
#include "stabilization/progress.h"

namespace marrow::stabilization {

// One frame's similarity within a problem with its sine and cosine.
struct frame_unknowns {
  double scale;
  double angle;
  double tx;
  double ty;
  double c;  // cos angle
  double s;

  explicit frame_unknowns(const double* x)
      : scale(x[0]), angle(x[1]), tx(x[2]), ty(x[3]), c(std::cos(x[1])), s(std::sin(x[1])) {}
  point2 rotate(point2 p) const { return {c * p.x - s * p.y, c * p.y + s * p.x}; }
  point2 operator()(point2 p) const {
    const point2 r = rotate(p);
    return {scale * r.x + tx, scale * r.y + ty};
  }
};

// What the two smoothing problems share: four unknowns a frame (scale, angle, tx, ty), residuals in
// pairs (x, y) that each see one, two or three consecutive frames. J is kept as blocks of 2 x 4, 2
// x 8 or 2 x 12 numbers, row-major; J'J is a band of half width 11. The operations are those that
// lm_solver asks for.
class dense_smoothing_problem {
 public:
  bool user_error = false;
  bool failed = false;  // construction or the last run failed: the motion found is of no use

  virtual ~dense_smoothing_problem() = default;
  dense_smoothing_problem(const dense_smoothing_problem&) = delete;
  dense_smoothing_problem& operator=(const dense_smoothing_problem&) = delete;

  std::int64_t frame_count() const { return frames_; }
  std::int64_t residual_count() const { return 2 * static_cast<std::int64_t>(blocks_.size()); }
  std::int64_t unknown_count() const { return 4 * frames_; }

  // Runs the solver from motion, frame_count() * 4 numbers, which receives the result. False where
  // the run failed.
  bool solve(std::vector<double>& motion, std::int64_t max_iter, const progress_functor& progress);

  virtual void compute_cost(const double* x, double* f) = 0;
  virtual void compute_sparse_jacobian(const double* x, const double* f) = 0;
  void update_unknown(const double* x, const double* step, double* x_new) const;
  bool monitor_progress(std::int64_t, const double*, const double*) const { return true; }
  void j_norm(double* norms) const;
  void jtf(const double* f, double* g) const;
  double jtj_quadratic(const double* p) const;
  void update_pinv_jtj_diag(const double* d);
  // Throws lapack_failure "pinv_jtj_x(): LAPACK failure".
  void pinv_jtj_x(const double* b, double* x);
  bool j_fullrank() const;
  double pinv_jtj_quadratic(const double* v);
  void report_initial_residual(double, std::int64_t) const {}
  void report_iteration_residual(double, std::int64_t) const {}
  void report_final_residual(double, std::int64_t) const {}

 protected:
  dense_smoothing_problem() = default;

  // Start of a problem over `frames` frames; then the pairs of residuals in their order, then
  // finish_blocks.
  void start_blocks(std::int64_t frames);
  void add_block(std::int64_t first_frame, int frames);
  void finish_blocks();

  // Where block i's 2 x (4 * frames) numbers lie.
  double* jacobian(std::size_t i) { return &jacobian_[blocks_[i].jacobian]; }
  // Takes the derivatives by the unknowns u with held[u] out of J: they stay as they start.
  void hold(const std::vector<bool>& held);
  // Derivatives of one frame's stretch of a block: columns scale, angle, tx, ty.
  static void set_columns(double* columns, int frames, int frame, point2 scale, point2 angle,
                          point2 tx, point2 ty);
  std::vector<frame_unknowns> unpack(const double* x) const;

 private:
  struct block {
    std::int32_t first_frame;
    std::int32_t frames;
    std::size_t jacobian;
  };

  void assemble();

  std::int64_t frames_ = 0;
  std::vector<block> blocks_;
  std::vector<double> jacobian_;
  std::size_t jacobian_size_ = 0;
  bool assembled_ = false;  // jtj_ belongs to the present J
  std::vector<double> jtj_;
  band_normal_system system_;
  bool factorized_ = false;
  std::vector<double> scratch_;

 protected:
  // J has been rewritten.
  void jacobian_changed() { assembled_ = false; }
};

}  // namespace marrow::stabilization
