#include "stabilization/models/motion_fits.h"

#include <algorithm>
#include <cmath>
#include <limits>

#include "platform/lapack/lapack.h"

namespace marrow::stabilization {
namespace {

constexpr double kNaN = std::numeric_limits<double>::quiet_NaN();

}  // namespace

point2 meanTranslation(std::span<const Displacement> list) {
  double weight = 0, x = 0, y = 0;
  for (const Displacement& d : list) {
    weight += d.weight;
    x += d.weight * (d.targetX - d.sourceX);
    y += d.weight * (d.targetY - d.sourceY);
  }
  return {x / weight, y / weight};
}

matrix3 fitTranslation(std::span<const Displacement> list) {
  const point2 t = meanTranslation(list);
  return {1, 0, t.x, 0, 1, t.y, 0, 0, 1};
}

matrix3 fitSimilarity(std::span<const Displacement> list) {
  double weight = 0;
  point2 source = {0, 0}, target = {0, 0};
  for (const Displacement& d : list) {
    weight += d.weight;
    source.x += d.weight * d.sourceX;
    source.y += d.weight * d.sourceY;
    target.x += d.weight * d.targetX;
    target.y += d.weight * d.targetY;
  }
  source = {source.x / weight, source.y / weight};
  target = {target.x / weight, target.y / weight};

  double variance = 0;
  double covariance[4] = {};  // target x source, column-major as LAPACK takes it
  for (const Displacement& d : list) {
    const double x = d.sourceX - source.x;
    const double y = d.sourceY - source.y;
    const double wX = d.weight * (d.targetX - target.x);
    const double wY = d.weight * (d.targetY - target.y);
    variance += d.weight * (x * x + y * y);
    covariance[0] += wX * x;
    covariance[1] += wY * x;
    covariance[2] += wX * y;
    covariance[3] += wY * y;
  }
  variance /= weight;
  for (double& entry : covariance) entry /= weight;
  const double checksum = variance + std::fabs(covariance[0]) + std::fabs(covariance[1]) +
                          std::fabs(covariance[2]) + std::fabs(covariance[3]);
  if (!std::isfinite(checksum)) return {kNaN, kNaN, kNaN, kNaN, kNaN, kNaN, 0, 0, 1};

  const int two = 2, work_size = 50;
  double s[2], u[4], vt[4], work[50];
  int info = 0;
  lapack::dgesvd("A", "A", &two, &two, covariance, &two, s, u, &two, vt, &two, work, &work_size,
                 &info);
  const double determinants = (u[0] * u[3] - u[1] * u[2]) * (vt[0] * vt[3] - vt[1] * vt[2]);
  if (determinants < 0) {
    s[1] = -s[1];
    u[2] = -u[2];
    u[3] = -u[3];
  }
  const double scale = (s[0] + s[1]) / (variance == 0 ? 1.0 : variance);
  const double m00 = scale * (u[0] * vt[0] + u[2] * vt[1]);
  const double m10 = scale * (u[1] * vt[0] + u[3] * vt[1]);
  const double m01 = scale * (u[0] * vt[2] + u[2] * vt[3]);
  const double m11 = scale * (u[1] * vt[2] + u[3] * vt[3]);
  return {m00, m01, target.x - (m00 * source.x + m01 * source.y),
          m10, m11, target.y - (m10 * source.x + m11 * source.y),
          0,   0,   1};
}

matrix3 homography_fitter::fit(std::span<const Displacement> list) {
  const int rows = static_cast<int>(2 * list.size());
  const int columns = 8;
  const int leading = std::max(rows, 1);
  const int right_leading = std::max(rows, columns);
  rows_.assign(static_cast<std::size_t>(leading) * columns, 0.0);
  right_.assign(static_cast<std::size_t>(right_leading), 0.0);
  integer_work_.resize(static_cast<std::size_t>(11 * leading));
  double checksum = 0;
  for (std::size_t i = 0; i < list.size(); ++i) {
    const Displacement& d = list[i];
    const double w = d.weight, x = d.sourceX, y = d.sourceY, X = d.targetX, Y = d.targetY;
    const auto at = [&](int column, std::size_t row) -> double& {
      return rows_[static_cast<std::size_t>(column) * leading + row];
    };
    const std::size_t rx = 2 * i, ry = 2 * i + 1;
    at(0, rx) = at(3, ry) = w * x;
    at(1, rx) = at(4, ry) = w * y;
    at(2, rx) = at(5, ry) = w;
    at(6, rx) = -w * x * X;
    at(7, rx) = -w * y * X;
    at(6, ry) = -w * x * Y;
    at(7, ry) = -w * y * Y;
    right_[rx] = w * X;
    right_[ry] = w * Y;
    checksum += std::fabs(at(6, rx)) + std::fabs(at(7, ry)) + std::fabs(w);
  }
  if (!std::isfinite(checksum)) {
    return {kNaN, kNaN, kNaN, kNaN, kNaN, kNaN, kNaN, kNaN, 1};
  }
  const int one = 1, query = -1;
  const double machine_precision = -1.0;
  double singular_values[8], size = 0;
  int rank = 0, info = 0;
  lapack::dgelsd(&rows, &columns, &one, rows_.data(), &leading, right_.data(), &right_leading,
                 singular_values, &machine_precision, &rank, &size, &query, integer_work_.data(),
                 &info);
  const int work_size = std::max(1, static_cast<int>(size));
  if (work_.size() < static_cast<std::size_t>(work_size)) work_.resize(work_size);
  lapack::dgelsd(&rows, &columns, &one, rows_.data(), &leading, right_.data(), &right_leading,
                 singular_values, &machine_precision, &rank, work_.data(), &work_size,
                 integer_work_.data(), &info);
  matrix3 m;
  std::copy_n(right_.begin(), 8, m.begin());
  m[8] = 1.0;
  return m;
}

matrix3 fitHomography(std::span<const Displacement> list) {
  return homography_fitter().fit(list);
}

double distance_off(const matrix3& motion, const Displacement& d) {
  const point2 image = transform(motion, {d.sourceX, d.sourceY});
  const double dx = image.x - d.targetX, dy = image.y - d.targetY;
  return std::sqrt(dx * dx + dy * dy);
}

double entry_distance(const matrix3& a, const matrix3& b) {
  double sum = 0;
  for (std::size_t i = 0; i < a.size(); ++i) sum += std::fabs(a[i] - b[i]);
  return sum;
}

}  // namespace marrow::stabilization
