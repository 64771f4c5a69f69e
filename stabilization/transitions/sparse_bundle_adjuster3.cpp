#include "stabilization/transitions/sparse_bundle_adjuster3.h"

#include <algorithm>
#include <cmath>
#include <limits>

#include "stabilization/least_squares/least_squares_run.h"

namespace marrow::stabilization {

bool sparse_bundle_adjuster3::solve(std::int64_t max_iter, const progress_functor& progress) {
  if (failed) return false;
  std::vector<double> x(static_cast<std::size_t>(unknown_count()));
  gather(x.data());
  const bool solved = run_least_squares(*this, x, max_iter, progress, true);
  scatter(x.data());
  return solved;
}

std::int64_t sparse_bundle_adjuster3::unknown_count() const {
  return primary_ + 2 * points_total_;
}

void sparse_bundle_adjuster3::setup_secondary_variables() {
  points_total_ = static_cast<std::int64_t>(points_[0].size() + points_[1].size());
  primary_ = 0;
  camera_column_.clear();
  for (const frame_motion& camera : cameras_) {
    camera_column_.push_back(camera.variable ? static_cast<std::int32_t>(primary_) : -1);
    if (camera.variable) primary_ += 4;
  }

  point_begin_.assign(static_cast<std::size_t>(points_total_) + 1, observations_.size());
  std::int64_t previous = -1;
  std::int64_t widest = 4;
  for (std::size_t i = 0; i < observations_.size(); ++i) {
    const std::int64_t p = flat_point(observations_[i]);
    while (previous < p) point_begin_[static_cast<std::size_t>(++previous)] = i;
  }
  for (std::int64_t p = 0; p < points_total_; ++p) {
    std::int64_t low = std::numeric_limits<std::int64_t>::max();
    std::int64_t high = -1;
    for (std::size_t i = point_begin_[p]; i < point_begin_[p + 1]; ++i) {
      const std::int64_t column = camera_column_[static_cast<std::size_t>(observations_[i].camera)];
      if (column < 0) continue;
      low = std::min(low, column);
      high = std::max(high, column + 4);
    }
    if (high >= 0) widest = std::max(widest, high - low);
  }
  if (primary_ > std::numeric_limits<int>::max() / 8) {
    throw lapack_failure(
        "sparse_bundle_adjuster3::setup_secondary_variables(): LAPACK call (S/D)GELSS failed");
  }
  system_.resize(static_cast<std::size_t>(primary_), static_cast<std::size_t>(widest - 1));

  const std::size_t seen = observations_.size();
  const std::size_t points = static_cast<std::size_t>(points_total_);
  const std::size_t primary = static_cast<std::size_t>(primary_);
  const std::size_t all = static_cast<std::size_t>(unknown_count());
  arena_.assign(seen * (8 + 4 + 8 + 8) + primary * 4 + points * 6 + primary + all, 0.0);
  double* next = arena_.data();
  const auto take = [&next](std::size_t count) {
    const std::span<double> taken(next, count);
    next += count;
    return taken;
  };
  camera_blocks_ = take(seen * 8);
  point_blocks_ = take(seen * 4);
  coupling_ = take(seen * 8);
  coupling_vinv_ = take(seen * 8);
  primary_normal_ = take(primary * 4);
  point_normal_ = take(points * 3);
  point_inverse_ = take(points * 3);
  reduced_ = take(primary);
  product_ = take(all);
}

void sparse_bundle_adjuster3::gather(double* x) const {
  for (const frame_motion& camera : cameras_) {
    if (!camera.variable) continue;
    *x++ = camera.scale;
    *x++ = camera.angle;
    *x++ = camera.tx;
    *x++ = camera.ty;
  }
  for (const auto& group : points_) {
    for (const point2& p : group) {
      *x++ = p.x;
      *x++ = p.y;
    }
  }
}

void sparse_bundle_adjuster3::scatter(const double* x) {
  for (frame_motion& camera : cameras_) {
    if (!camera.variable) continue;
    camera.scale = *x++;
    camera.angle = *x++;
    camera.tx = *x++;
    camera.ty = *x++;
  }
  for (auto& group : points_) {
    for (point2& p : group) {
      p.x = *x++;
      p.y = *x++;
    }
  }
}

void sparse_bundle_adjuster3::compute_cost(const double* x, double* f) {
  scatter(x);
  for (const observation& o : observations_) {
    const frame_motion& camera = cameras_[static_cast<std::size_t>(o.camera)];
    const double c = camera.scale * std::cos(camera.angle);
    const double s = camera.scale * std::sin(camera.angle);
    const point2 p = points_[o.group][static_cast<std::size_t>(o.point)];
    *f++ = c * p.x - s * p.y + camera.tx - o.position.x;
    *f++ = c * p.y + s * p.x + camera.ty - o.position.y;
  }
}

void sparse_bundle_adjuster3::compute_sparse_jacobian(const double* x, const double*) {
  scatter(x);
  std::fill(primary_normal_.begin(), primary_normal_.end(), 0.0);
  std::fill(point_normal_.begin(), point_normal_.end(), 0.0);
  for (std::size_t i = 0; i < observations_.size(); ++i) {
    const observation& o = observations_[i];
    const frame_motion& camera = cameras_[static_cast<std::size_t>(o.camera)];
    const point2 p = points_[o.group][static_cast<std::size_t>(o.point)];
    const double c = std::cos(camera.angle);
    const double s = std::sin(camera.angle);
    const point2 r = {c * p.x - s * p.y, c * p.y + s * p.x};
    double* const jp = &point_blocks_[4 * i];
    jp[0] = camera.scale * c;
    jp[1] = -camera.scale * s;
    jp[2] = camera.scale * s;
    jp[3] = camera.scale * c;
    double* const v = &point_normal_[3 * static_cast<std::size_t>(flat_point(o))];
    v[0] += jp[0] * jp[0] + jp[2] * jp[2];
    v[1] += jp[0] * jp[1] + jp[2] * jp[3];
    v[2] += jp[1] * jp[1] + jp[3] * jp[3];

    const std::int32_t column = camera_column_[static_cast<std::size_t>(o.camera)];
    if (column < 0) continue;
    double* const jc = &camera_blocks_[8 * i];
    jc[0] = r.x;
    jc[1] = -camera.scale * r.y;
    jc[2] = 1;
    jc[3] = 0;
    jc[4] = r.y;
    jc[5] = camera.scale * r.x;
    jc[6] = 0;
    jc[7] = 1;
    double* const u = &primary_normal_[4 * static_cast<std::size_t>(column)];
    double* const w = &coupling_[8 * i];
    for (int a = 0; a < 4; ++a) {
      for (int b = 0; b < 4; ++b) u[4 * a + b] += jc[a] * jc[b] + jc[4 + a] * jc[4 + b];
      w[2 * a] = jc[a] * jp[0] + jc[4 + a] * jp[2];
      w[2 * a + 1] = jc[a] * jp[1] + jc[4 + a] * jp[3];
    }
  }
}

void sparse_bundle_adjuster3::update_unknown(const double* x, const double* step,
                                             double* x_new) const {
  for (std::int64_t j = 0; j < unknown_count(); ++j) x_new[j] = x[j] + step[j];
}

void sparse_bundle_adjuster3::j_norm(double* norms) const {
  for (std::int64_t j = 0; j < primary_; ++j) {
    norms[j] = std::sqrt(primary_normal_[static_cast<std::size_t>(4 * j + j % 4)]);
  }
  for (std::int64_t p = 0; p < points_total_; ++p) {
    const double* v = &point_normal_[static_cast<std::size_t>(3 * p)];
    norms[primary_ + 2 * p] = std::sqrt(v[0]);
    norms[primary_ + 2 * p + 1] = std::sqrt(v[2]);
  }
}

void sparse_bundle_adjuster3::jtf(const double* f, double* g) const {
  std::fill(g, g + unknown_count(), 0.0);
  for (std::size_t i = 0; i < observations_.size(); ++i) {
    const observation& o = observations_[i];
    const double fx = f[2 * i];
    const double fy = f[2 * i + 1];
    double* const gp = g + primary_ + 2 * flat_point(o);
    const double* const jp = &point_blocks_[4 * i];
    gp[0] += jp[0] * fx + jp[2] * fy;
    gp[1] += jp[1] * fx + jp[3] * fy;
    const std::int32_t column = camera_column_[static_cast<std::size_t>(o.camera)];
    if (column < 0) continue;
    const double* const jc = &camera_blocks_[8 * i];
    for (int a = 0; a < 4; ++a) g[column + a] += jc[a] * fx + jc[4 + a] * fy;
  }
}

double sparse_bundle_adjuster3::jtj_quadratic(const double* p) const {
  double sum = 0;
  for (std::size_t i = 0; i < observations_.size(); ++i) {
    const observation& o = observations_[i];
    const double* const pp = p + primary_ + 2 * flat_point(o);
    const double* const jp = &point_blocks_[4 * i];
    double x = jp[0] * pp[0] + jp[1] * pp[1];
    double y = jp[2] * pp[0] + jp[3] * pp[1];
    const std::int32_t column = camera_column_[static_cast<std::size_t>(o.camera)];
    if (column >= 0) {
      const double* const jc = &camera_blocks_[8 * i];
      for (int a = 0; a < 4; ++a) {
        x += jc[a] * p[column + a];
        y += jc[4 + a] * p[column + a];
      }
    }
    sum += x * x + y * y;
  }
  return sum;
}

void sparse_bundle_adjuster3::update_pinv_jtj_diag(const double* d) {
  std::vector<double>& s = system_.matrix();
  const std::size_t stride = system_.half_bandwidth() + 1;
  std::fill(s.begin(), s.end(), 0.0);
  for (std::size_t j = 0; j < static_cast<std::size_t>(primary_); j += 4) {
    const double* const u = &primary_normal_[4 * j];
    for (std::size_t b = 0; b < 4; ++b) {
      for (std::size_t a = b; a < 4; ++a) system_.at(j + a, j + b) = u[4 * a + b];
      system_.at(j + b, j + b) += d[j + b];
    }
  }
  for (std::size_t p = 0; p < static_cast<std::size_t>(points_total_); ++p) {
    const double* const v = &point_normal_[3 * p];
    const double* const dp = d + primary_ + 2 * static_cast<std::ptrdiff_t>(p);
    const double xx = v[0] + dp[0];
    const double yy = v[2] + dp[1];
    const double determinant = xx * yy - v[1] * v[1];
    double* const inverse = &point_inverse_[3 * p];
    inverse[0] = yy / determinant;
    inverse[1] = -v[1] / determinant;
    inverse[2] = xx / determinant;
    for (std::size_t i = point_begin_[p]; i < point_begin_[p + 1]; ++i) {
      const std::int32_t row = camera_column_[static_cast<std::size_t>(observations_[i].camera)];
      if (row < 0) continue;
      const double* const w = &coupling_[8 * i];
      double* const y = &coupling_vinv_[8 * i];
      for (int a = 0; a < 4; ++a) {
        y[2 * a] = w[2 * a] * inverse[0] + w[2 * a + 1] * inverse[1];
        y[2 * a + 1] = w[2 * a] * inverse[1] + w[2 * a + 1] * inverse[2];
      }
    }
    // Observations of a point stand in the order of cameras, so the second index is the lower one.
    for (std::size_t i = point_begin_[p]; i < point_begin_[p + 1]; ++i) {
      const std::int32_t row = camera_column_[static_cast<std::size_t>(observations_[i].camera)];
      if (row < 0) continue;
      const double* const y = &coupling_vinv_[8 * i];
      for (std::size_t k = point_begin_[p]; k <= i; ++k) {
        const std::int32_t col = camera_column_[static_cast<std::size_t>(observations_[k].camera)];
        if (col < 0) continue;
        const double* const w = &coupling_[8 * k];
        double* entry =
            &s[static_cast<std::size_t>(col) * stride + static_cast<std::size_t>(row - col)];
        for (int b = 0; b < 4; ++b, entry += stride - 1) {
          const double w0 = w[2 * b];
          const double w1 = w[2 * b + 1];
          for (int a = row == col ? b : 0; a < 4; ++a) {
            entry[a] -= y[2 * a] * w0 + y[2 * a + 1] * w1;
          }
        }
      }
    }
  }
  factorized_ = system_.factorize();
}

void sparse_bundle_adjuster3::pinv_jtj_x(const double* b, double* x) {
  if (!factorized_) {
    user_error = true;
    return;
  }
  std::copy(b, b + primary_, reduced_.begin());
  for (std::size_t i = 0; i < observations_.size(); ++i) {
    const observation& o = observations_[i];
    const std::int32_t column = camera_column_[static_cast<std::size_t>(o.camera)];
    if (column < 0) continue;
    const double* const bp = b + primary_ + 2 * flat_point(o);
    const double* const y = &coupling_vinv_[8 * i];
    for (int a = 0; a < 4; ++a) {
      reduced_[static_cast<std::size_t>(column + a)] -= y[2 * a] * bp[0] + y[2 * a + 1] * bp[1];
    }
  }
  system_.solve(reduced_.data());
  if (b != x) std::copy(b + primary_, b + unknown_count(), x + primary_);
  std::copy(reduced_.begin(), reduced_.end(), x);
  for (std::size_t i = 0; i < observations_.size(); ++i) {
    const observation& o = observations_[i];
    const std::int32_t column = camera_column_[static_cast<std::size_t>(o.camera)];
    if (column < 0) continue;
    double* const xp = x + primary_ + 2 * flat_point(o);
    const double* const w = &coupling_[8 * i];
    for (int a = 0; a < 4; ++a) {
      xp[0] -= w[2 * a] * x[column + a];
      xp[1] -= w[2 * a + 1] * x[column + a];
    }
  }
  for (std::size_t p = 0; p < static_cast<std::size_t>(points_total_); ++p) {
    double* const xp = x + primary_ + 2 * static_cast<std::ptrdiff_t>(p);
    const double* const inverse = &point_inverse_[3 * p];
    const double px = xp[0];
    xp[0] = inverse[0] * px + inverse[1] * xp[1];
    xp[1] = inverse[1] * px + inverse[2] * xp[1];
  }
}

bool sparse_bundle_adjuster3::j_fullrank() const {
  return static_cast<std::int64_t>(system_.rank()) == primary_;
}

double sparse_bundle_adjuster3::pinv_jtj_quadratic(const double* v) {
  pinv_jtj_x(v, product_.data());
  if (user_error) return 0;
  double sum = 0;
  for (std::int64_t j = 0; j < unknown_count(); ++j) {
    sum += v[j] * product_[static_cast<std::size_t>(j)];
  }
  return sum;
}

}  // namespace marrow::stabilization
