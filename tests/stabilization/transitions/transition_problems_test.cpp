#include <gtest/gtest.h>

#include <algorithm>
#include <cmath>
#include <numeric>
#include <random>

#include "stabilization/transitions/sparse_bundle_adjuster3.h"
#include "stabilization/transitions/transition_refiner.h"
#include "stabilization/transitions/transition_smoother.h"
#include "stabilization/transitions/transition_tracks.h"
#include "tests/stabilization/clips.h"
#include "tests/stabilization/dense_reference.h"

namespace marrow::stabilization {
namespace {

using vector = std::vector<double>;

// Residuals and J, row-major, J through the problem's own products: a row is J'f of a unit f.
struct linearised {
  std::size_t m, n;
  vector f, j;

  template <class Problem>
  linearised(Problem& problem, const vector& x)
      : m(problem.residual_count()), n(problem.unknown_count()), f(m), j(m * n) {
    problem.compute_cost(x.data(), f.data());
    problem.compute_sparse_jacobian(x.data(), f.data());
    vector unit(m);
    for (std::size_t i = 0; i < m; ++i) {
      unit[i] = 1;
      problem.jtf(unit.data(), &j[i * n]);
      unit[i] = 0;
    }
  }

  // Least squares of J step = f.
  dense_reference dense() const {
    dense_reference reference(n);
    for (std::size_t i = 0; i < m; ++i) {
      std::vector<std::pair<std::size_t, double>> row;
      for (std::size_t k = 0; k < n; ++k) row.push_back({k, j[i * n + k]});
      reference.add(1, row, f[i]);
    }
    return reference;
  }
};

// J against central differences, and every operation of the problem against the dense J.
template <class Problem>
void expect_agrees_with_dense(Problem& problem, const vector& x, double damping) {
  const linearised at(problem, x);
  vector up(at.m), down(at.m), moved = x;
  for (std::size_t k = 0; k < at.n; ++k) {
    const double h = 1e-6;
    moved[k] = x[k] + h;
    problem.compute_cost(moved.data(), up.data());
    moved[k] = x[k] - h;
    problem.compute_cost(moved.data(), down.data());
    moved[k] = x[k];
    for (std::size_t i = 0; i < at.m; ++i) {
      const double expected = (up[i] - down[i]) / (2 * h);
      EXPECT_NEAR(at.j[i * at.n + k], expected, 1e-6 * (1000 + std::fabs(expected)))
          << "residual " << i << " unknown " << k;
    }
  }

  dense_reference dense = at.dense();
  const vector d(at.n, damping);
  vector norms(at.n), p(at.n), g(at.n), solution(at.n);
  for (std::size_t k = 0; k < at.n; ++k) p[k] = std::cos(2.0 * static_cast<double>(k));
  problem.j_norm(norms.data());
  double quadratic = 0;
  for (std::size_t i = 0; i < at.n * at.n; ++i) {
    quadratic += dense.matrix[i] * p[i / at.n] * p[i % at.n];
  }
  EXPECT_NEAR(problem.jtj_quadratic(p.data()) / quadratic, 1, 1e-12);
  for (std::size_t k = 0; k < at.n; ++k) {
    const double expected = std::sqrt(dense.matrix[k * at.n + k]);
    EXPECT_NEAR(norms[k], expected, 1e-9 * (1 + expected));
    dense.matrix[k * at.n + k] += damping;
  }
  problem.jtf(at.f.data(), g.data());
  problem.update_pinv_jtj_diag(d.data());
  std::size_t rank = 0;
  const vector expected = dense.solve(&rank);
  EXPECT_EQ(problem.j_fullrank(), rank == at.n);
  vector in_place = g;
  problem.pinv_jtj_x(g.data(), solution.data());
  problem.pinv_jtj_x(in_place.data(), in_place.data());
  EXPECT_EQ(solution, in_place);
  const double largest = largest_of(expected);
  for (std::size_t k = 0; k < at.n; ++k) EXPECT_NEAR(solution[k], expected[k], 1e-6 * largest) << k;
  EXPECT_NEAR(problem.pinv_jtj_quadratic(g.data()) /
                  std::inner_product(g.begin(), g.end(), expected.begin(), 0.0),
              1, 1e-6);
}

std::vector<smoothing_track> generic_tracks(int frames, int count) {
  std::mt19937 random(3);
  std::uniform_real_distribution<double> unit(0, 1);
  std::vector<smoothing_track> tracks;
  for (int t = 0; t < count; ++t) {
    smoothing_track track;
    track.first = t % 3;
    const int length = t < 3 ? frames : 2 + static_cast<int>(unit(random) * (frames - 4));
    for (int i = 0; i < length && track.first + i < frames; ++i) {
      track.points.push_back({300 * unit(random), 200 * unit(random)});
      track.data_weight.push_back(0.5 + unit(random));
      track.smoothness_weight.push_back(1 + 4 * unit(random));
    }
    tracks.push_back(track);
  }
  return tracks;
}

vector generic_motion(int frames) {
  vector x;
  for (int f = 0; f < frames; ++f) {
    x.insert(x.end(),
             {1 + 0.05 * std::sin(f), 0.1 * std::cos(3 * f), 4 * std::sin(2 * f), 1.0 * f});
  }
  return x;
}

TEST(TransitionSmoother, OperationsAgreeWithDifferencesAndTheDenseMatrix) {
  const auto tracks = generic_tracks(9, 12);
  transition_smoother smoother(9, tracks);
  for (const double damping : {0.0, 3.5}) {
    expect_agrees_with_dense(smoother, generic_motion(9), damping);
  }
}

TEST(TransitionSmoother, UnseenFramesStayAtTheIdentity) {
  auto tracks = generic_tracks(9, 12);
  for (smoothing_track& track : tracks) track.first += 2;  // frames 0 and 1 see nothing
  transition_smoother smoother(11, tracks);
  expect_agrees_with_dense(smoother, generic_motion(11), 0);
  EXPECT_FALSE(smoother.j_fullrank());

  vector motion;
  for (int f = 0; f < 11; ++f) motion.insert(motion.end(), {1, 0, 0, 0});
  ASSERT_TRUE(smoother.solve(motion, 10, kNoProgress));
  for (int k = 0; k < 8; ++k) EXPECT_EQ(motion[k], k % 4 == 0 ? 1 : 0);
}

TEST(TransitionRefiner, OperationsAgreeWithDifferencesAndTheDenseMatrix) {
  using points = std::vector<point2>;
  const std::vector<refiner_track> tracks = {
      {0, {12, 25}, points(5, {10, 20}), true, {8, 19}, {9, 19.5}},
      {2, {63, 22}, points(2, {60, 20})},
      {1, {163, 122}, points(3, {160, 120})}};
  transition_refiner refiner({1, 1, 2, 1, 10}, tracks, 3.0, 0.02);
  ASSERT_EQ(refiner.residual_count(), 2 * (10 + 3 + 1 + 2));
  expect_agrees_with_dense(refiner, generic_motion(5), 0.1);

  const linearised still(refiner, {1, 0, 0, 0, 1, 0, 1, 0, 1, 0, 0, 0, 1, 0, 0, 0, 1, 0, 0, 0});
  EXPECT_NEAR(still.f[16], 0.02 * 100 * (12 + 8 - 18), 1e-12);  // T0 + e1 - 2 e2
  EXPECT_NEAR(still.f[18], 0.02 * 100 * (13 + 9 - 24), 1e-12);  // T1 + e2 - 2 T0

  const std::vector<refiner_track> brief = {{0, {12, 25}, {{10, 20}}, true}};
  transition_refiner single({10}, brief, 3.0, 0.02);
  EXPECT_EQ(single.residual_count(), 4);
  expect_agrees_with_dense(single, generic_motion(1), 0.1);
}

class bundle : public sparse_bundle_adjuster3 {
 public:
  // Each point lives on `span` cameras, the first one moving on from point to point; the last third
  // of the points is the second group.
  bundle(int cameras, int points, int span, bool first_fixed) {
    std::mt19937 random(5);
    std::uniform_real_distribution<double> unit(0, 1);
    cameras_.resize(cameras);
    cameras_[0].variable = !first_fixed;
    for (int t = 0; t < points; ++t) {
      const int group = 3 * t >= 2 * points, start = t % (cameras - span + 1);
      const int point = static_cast<int>(points_[group].size());
      points_[group].push_back({300 * unit(random), 200 * unit(random)});
      for (int c = start; c < start + span; ++c) {
        observations_.push_back({c, group, point, {300 * unit(random), 200 * unit(random)}});
      }
    }
    setup_secondary_variables();
  }

  vector generic() const {
    vector x(unknown_count());
    gather(x.data());
    const vector motion = generic_motion(static_cast<int>(cameras_.size()));
    std::copy(motion.begin() + (cameras_[0].variable ? 0 : 4), motion.end(), x.begin());
    return x;
  }
};

TEST(SparseBundleAdjuster, OperationsAgreeWithDifferencesAndTheDenseMatrix) {
  for (const int span : {3, 8}) {  // a narrow band, and a full matrix
    for (const double damping : {0.0, 2.5}) {
      bundle problem(8, 30, span, true);
      expect_agrees_with_dense(problem, problem.generic(), damping);
    }
  }
}

TEST(SparseBundleAdjuster, FreeGaugeIsNotFullRankAndStillSolves) {
  bundle problem(6, 20, 6, false);
  expect_agrees_with_dense(problem, problem.generic(), 0.1);
  const linearised at(problem, problem.generic());
  const dense_reference dense = at.dense();
  vector step(at.n);
  problem.update_pinv_jtj_diag(vector(at.n, 0.0).data());
  problem.pinv_jtj_x(dense.right.data(), step.data());
  ASSERT_FALSE(problem.user_error);
  // The step satisfies the normal equations although the scene may float.
  const double largest = largest_of(dense.right);
  for (std::size_t k = 0; k < at.n; ++k) {
    const double product =
        std::inner_product(step.begin(), step.end(), &dense.matrix[k * at.n], 0.0);
    EXPECT_NEAR(product, dense.right[k], 1e-6 * largest);
  }
}

}  // namespace
}  // namespace marrow::stabilization
