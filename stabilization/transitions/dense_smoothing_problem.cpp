#include "stabilization/transitions/dense_smoothing_problem.h"

#include <algorithm>

#include "stabilization/least_squares/least_squares_run.h"

namespace marrow::stabilization {
namespace {

// Three frames of four unknowns meet in a residual.
constexpr std::size_t kHalfBandwidth = 11;

}  // namespace

bool dense_smoothing_problem::solve(std::vector<double>& motion, std::int64_t max_iter,
                                    const progress_functor& progress) {
  return run_least_squares(*this, motion, max_iter, progress, false);
}

void dense_smoothing_problem::start_blocks(std::int64_t frames) {
  frames_ = frames;
  blocks_.clear();
  jacobian_size_ = 0;
}

void dense_smoothing_problem::add_block(std::int64_t first_frame, int frames) {
  blocks_.push_back({static_cast<std::int32_t>(first_frame), frames, jacobian_size_});
  jacobian_size_ += static_cast<std::size_t>(8 * frames);
}

void dense_smoothing_problem::finish_blocks() {
  jacobian_.assign(jacobian_size_, 0.0);
  const std::size_t n = static_cast<std::size_t>(unknown_count());
  system_.resize(n, kHalfBandwidth);
  jtj_.resize(system_.matrix().size());
  scratch_.resize(n);
}

void dense_smoothing_problem::set_columns(double* columns, int frames, int frame, point2 scale,
                                          point2 angle, point2 tx, point2 ty) {
  double* const row_x = columns + 4 * frame;
  double* const row_y = row_x + 4 * frames;
  row_x[0] = scale.x;
  row_x[1] = angle.x;
  row_x[2] = tx.x;
  row_x[3] = ty.x;
  row_y[0] = scale.y;
  row_y[1] = angle.y;
  row_y[2] = tx.y;
  row_y[3] = ty.y;
}

void dense_smoothing_problem::hold(const std::vector<bool>& held) {
  for (const block& b : blocks_) {
    const std::size_t columns = static_cast<std::size_t>(4 * b.frames);
    double* j = &jacobian_[b.jacobian];
    for (std::size_t k = 0; k < columns; ++k) {
      if (held[static_cast<std::size_t>(4 * b.first_frame) + k]) j[k] = j[columns + k] = 0;
    }
  }
}

std::vector<frame_unknowns> dense_smoothing_problem::unpack(const double* x) const {
  std::vector<frame_unknowns> frames;
  frames.reserve(static_cast<std::size_t>(frames_));
  for (std::int64_t f = 0; f < frames_; ++f) frames.emplace_back(x + 4 * f);
  return frames;
}

void dense_smoothing_problem::update_unknown(const double* x, const double* step,
                                             double* x_new) const {
  for (std::int64_t j = 0; j < unknown_count(); ++j) x_new[j] = x[j] + step[j];
}

void dense_smoothing_problem::j_norm(double* norms) const {
  std::fill(norms, norms + unknown_count(), 0.0);
  for (const block& b : blocks_) {
    const int columns = 4 * b.frames;
    const double* j = &jacobian_[b.jacobian];
    double* out = norms + 4 * b.first_frame;
    for (int k = 0; k < columns; ++k) out[k] += j[k] * j[k] + j[columns + k] * j[columns + k];
  }
  for (std::int64_t j = 0; j < unknown_count(); ++j) norms[j] = std::sqrt(norms[j]);
}

void dense_smoothing_problem::jtf(const double* f, double* g) const {
  std::fill(g, g + unknown_count(), 0.0);
  for (std::size_t i = 0; i < blocks_.size(); ++i) {
    const int columns = 4 * blocks_[i].frames;
    const double* j = &jacobian_[blocks_[i].jacobian];
    double* out = g + 4 * blocks_[i].first_frame;
    for (int k = 0; k < columns; ++k) out[k] += j[k] * f[2 * i] + j[columns + k] * f[2 * i + 1];
  }
}

double dense_smoothing_problem::jtj_quadratic(const double* p) const {
  double sum = 0;
  for (const block& b : blocks_) {
    const int columns = 4 * b.frames;
    const double* j = &jacobian_[b.jacobian];
    const double* q = p + 4 * b.first_frame;
    double x = 0;
    double y = 0;
    for (int k = 0; k < columns; ++k) {
      x += j[k] * q[k];
      y += j[columns + k] * q[k];
    }
    sum += x * x + y * y;
  }
  return sum;
}

void dense_smoothing_problem::assemble() {
  const std::size_t stride = system_.half_bandwidth() + 1;
  std::fill(jtj_.begin(), jtj_.end(), 0.0);
  for (const block& b : blocks_) {
    const int columns = 4 * b.frames;
    const double* row_x = &jacobian_[b.jacobian];
    const double* row_y = row_x + columns;
    double* column = &jtj_[static_cast<std::size_t>(4 * b.first_frame) * stride];
    for (int k = 0; k < columns; ++k, column += stride) {
      for (int i = k; i < columns; ++i) {
        column[i - k] += row_x[i] * row_x[k] + row_y[i] * row_y[k];
      }
    }
  }
  assembled_ = true;
}

void dense_smoothing_problem::update_pinv_jtj_diag(const double* d) {
  if (!assembled_) assemble();
  system_.matrix() = jtj_;
  for (std::size_t j = 0; j < system_.size(); ++j) system_.at(j, j) += d[j];
  factorized_ = system_.factorize();
}

void dense_smoothing_problem::pinv_jtj_x(const double* b, double* x) {
  if (!factorized_) throw lapack_failure("pinv_jtj_x(): LAPACK failure");
  if (b != x) std::copy(b, b + unknown_count(), x);
  system_.solve(x);
}

bool dense_smoothing_problem::j_fullrank() const {
  return static_cast<std::int64_t>(system_.rank()) == unknown_count();
}

double dense_smoothing_problem::pinv_jtj_quadratic(const double* v) {
  pinv_jtj_x(v, scratch_.data());
  double sum = 0;
  for (std::int64_t j = 0; j < unknown_count(); ++j)
    sum += v[j] * scratch_[static_cast<std::size_t>(j)];
  return sum;
}

}  // namespace marrow::stabilization
