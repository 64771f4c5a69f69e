#include <gtest/gtest.h>

#include <cmath>
#include <random>

#include "platform/lapack/lapack.h"
#include "stabilization/least_squares/least_squares_run.h"
#include "stabilization/transitions/sparse_bundle_adjuster3.h"
#include "stabilization/transitions/transition_refiner.h"
#include "stabilization/transitions/transition_smoother.h"
#include "stabilization/transitions/transition_tracks.h"

namespace marrow::stabilization {
namespace {

using vector = std::vector<double>;

// J through the problem's own products: column k is J'f's k-th entry over the unit residuals.
template <class Problem>
vector jacobian(Problem& problem, const vector& x) {
  const std::size_t m = problem.residual_count(), n = problem.unknown_count();
  vector f(m), j(m * n), unit(m), row(n);
  problem.compute_cost(x.data(), f.data());
  problem.compute_sparse_jacobian(x.data(), f.data());
  for (std::size_t i = 0; i < m; ++i) {
    unit[i] = 1;
    problem.jtf(unit.data(), row.data());
    std::copy(row.begin(), row.end(), &j[i * n]);
    unit[i] = 0;
  }
  return j;
}

template <class Problem>
void expect_central_differences(Problem& problem, const vector& x) {
  const std::size_t m = problem.residual_count(), n = problem.unknown_count();
  const vector j = jacobian(problem, x);
  vector up(m), down(m), moved = x;
  double nonzero = 0;
  for (std::size_t k = 0; k < n; ++k) {
    const double h = 1e-6;
    moved[k] = x[k] + h;
    problem.compute_cost(moved.data(), up.data());
    moved[k] = x[k] - h;
    problem.compute_cost(moved.data(), down.data());
    moved[k] = x[k];
    for (std::size_t i = 0; i < m; ++i) {
      const double expected = (up[i] - down[i]) / (2 * h);
      EXPECT_NEAR(j[i * n + k], expected, 1e-6 * (1000 + std::fabs(expected)))
          << "residual " << i << " unknown " << k;
      nonzero += expected != 0;
    }
  }
  EXPECT_GT(nonzero, static_cast<double>(m));
}

// (J'J + D)+ v by singular values of the dense matrix.
vector dense_pinv(const vector& j, std::size_t m, std::size_t n, const vector& d, vector v) {
  vector a(n * n);
  for (std::size_t i = 0; i < m; ++i)
    for (std::size_t p = 0; p < n; ++p)
      for (std::size_t q = 0; q < n; ++q) a[p * n + q] += j[i * n + p] * j[i * n + q];
  for (std::size_t p = 0; p < n; ++p) a[p * n + p] += d[p];
  vector s(n), work(50 * n + 5000);
  const int size = static_cast<int>(n), one = 1, lwork = static_cast<int>(work.size());
  const double rcond = -1;
  int rank = 0, info = 0;
  lapack::dgelss(&size, &size, &one, a.data(), &size, v.data(), &size, s.data(), &rcond, &rank,
                 work.data(), &lwork, &info);
  EXPECT_EQ(info, 0);
  return v;
}

// Every operation of the problem against the dense J.
template <class Problem>
void expect_operations_agree_with_dense(Problem& problem, const vector& x, const vector& d) {
  const std::size_t m = problem.residual_count(), n = problem.unknown_count();
  const vector j = jacobian(problem, x);
  vector norms(n), p(n), f(m), g(n);
  for (std::size_t k = 0; k < n; ++k) p[k] = std::cos(2.0 * k);
  problem.compute_cost(x.data(), f.data());
  problem.compute_sparse_jacobian(x.data(), f.data());
  problem.j_norm(norms.data());
  double quadratic = 0;
  for (std::size_t i = 0; i < m; ++i) {
    double r = 0;
    for (std::size_t k = 0; k < n; ++k) r += j[i * n + k] * p[k];
    quadratic += r * r;
  }
  EXPECT_NEAR(problem.jtj_quadratic(p.data()) / quadratic, 1, 1e-12);
  for (std::size_t k = 0; k < n; ++k) {
    double sum = 0;
    for (std::size_t i = 0; i < m; ++i) sum += j[i * n + k] * j[i * n + k];
    EXPECT_NEAR(norms[k], std::sqrt(sum), 1e-9 * (1 + std::sqrt(sum)));
  }
  problem.jtf(f.data(), g.data());
  problem.update_pinv_jtj_diag(d.data());
  const vector expected = dense_pinv(j, m, n, d, g);
  vector solution(n), in_place = g;
  problem.pinv_jtj_x(g.data(), solution.data());
  problem.pinv_jtj_x(in_place.data(), in_place.data());
  double largest = 0, product = 0;
  for (std::size_t k = 0; k < n; ++k) {
    largest = std::max(largest, std::fabs(expected[k]));
    product += g[k] * expected[k];
  }
  for (std::size_t k = 0; k < n; ++k) {
    EXPECT_NEAR(solution[k], expected[k], 1e-6 * largest) << k;
    EXPECT_EQ(solution[k], in_place[k]);
  }
  EXPECT_NEAR(problem.pinv_jtj_quadratic(g.data()) / product, 1, 1e-6);
}

std::vector<smoothing_track> generic_tracks(int frames, int count, unsigned seed = 3) {
  std::mt19937 random(seed);
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

TEST(TransitionSmoother, WorkedResidualsOfThreeFrames) {
  smoothing_track track;
  track.points = {{100, 50}, {104, 53}, {109, 55}};
  track.data_weight = {1, 2, 1};
  track.smoothness_weight = {7, 3, 7};
  const std::vector<smoothing_track> tracks = {track};
  transition_smoother smoother(3, tracks);
  ASSERT_EQ(smoother.residual_count(), 8);
  const vector x = {1, 0, 0, 0, 1.02, 0.01, 3, -2, 0.99, -0.02, 5, 1};
  vector f(8);
  smoother.compute_cost(x.data(), f.data());
  EXPECT_EQ(f[0], 0);
  EXPECT_NEAR(f[2], 2 * 4.53410505, 1e-7);
  EXPECT_NEAR(f[3], 2 * 0.11807934, 1e-7);
  EXPECT_NEAR(f[4], 113.97734612 - 109, 1e-7);
  EXPECT_NEAR(f[6], 3 * -3.05907843, 1e-7);
  EXPECT_NEAR(f[7], 3 * -2.86671428, 1e-7);
}

TEST(TransitionSmoother, JacobianIsTheDerivative) {
  const auto tracks = generic_tracks(6, 5);
  transition_smoother smoother(6, tracks);
  expect_central_differences(smoother, generic_motion(6));
}

TEST(TransitionSmoother, BandOperationsAgreeWithTheDenseMatrix) {
  const auto tracks = generic_tracks(9, 12);
  transition_smoother smoother(9, tracks);
  const vector x = generic_motion(9);
  expect_operations_agree_with_dense(smoother, x, vector(36, 0.0));
  EXPECT_TRUE(smoother.j_fullrank());
  expect_operations_agree_with_dense(smoother, x, vector(36, 3.5));
}

TEST(TransitionSmoother, UnseenFramesStayAtTheIdentity) {
  auto tracks = generic_tracks(9, 12);
  for (smoothing_track& track : tracks) track.first += 2;  // frames 0 and 1 see nothing
  transition_smoother smoother(11, tracks);
  expect_operations_agree_with_dense(smoother, generic_motion(11), vector(44, 0.0));
  EXPECT_FALSE(smoother.j_fullrank());

  vector motion;
  for (int f = 0; f < 11; ++f) motion.insert(motion.end(), {1, 0, 0, 0});
  ASSERT_TRUE(smoother.solve(motion, 10, [] {}));
  for (int k = 0; k < 8; ++k) EXPECT_EQ(motion[k], k % 4 == 0 ? 1 : 0);
}

TEST(TransitionRefiner, JacobianIsTheDerivative) {
  std::vector<refiner_track> tracks(3);
  tracks[0].observations.assign(5, {10, 20});
  tracks[0].point = {12, 25};
  tracks[0].continues = true;
  tracks[0].two_before = {8, 19};
  tracks[0].one_before = {9, 19.5};
  tracks[1].first = 2;
  tracks[1].observations.assign(2, {60, 20});
  tracks[1].point = {63, 22};
  tracks[2].first = 1;
  tracks[2].observations.assign(3, {160, 120});
  tracks[2].point = {163, 122};
  transition_refiner refiner({1, 1, 2, 1, 10}, tracks, 3.0, 0.02);
  ASSERT_EQ(refiner.residual_count(), 2 * (10 + 3 + 1 + 2));
  expect_central_differences(refiner, generic_motion(5));
  expect_operations_agree_with_dense(refiner, generic_motion(5), vector(20, 0.1));

  vector f(refiner.residual_count());
  const vector still = {1, 0, 0, 0, 1, 0, 1, 0, 1, 0, 0, 0, 1, 0, 0, 0, 1, 0, 0, 0};
  refiner.compute_cost(still.data(), f.data());
  EXPECT_NEAR(f[8], 10 * (12 - 10), 1e-12);               // last frame's weight
  EXPECT_NEAR(f[10], 3 * (12 + 12 - 2 * 13), 1e-12);      // frame 1 moved by one pixel
  EXPECT_NEAR(f[16], 0.02 * 100 * (12 + 8 - 18), 1e-12);  // T0 + e1 - 2 e2
  EXPECT_NEAR(f[18], 0.02 * 100 * (13 + 9 - 24), 1e-12);  // T1 + e2 - 2 T0
}

TEST(TransitionRefiner, TrackThatContinuesIntoASingleFrame) {
  std::vector<refiner_track> tracks(1);
  tracks[0].observations = {{10, 20}};
  tracks[0].point = {12, 25};
  tracks[0].continues = true;
  transition_refiner refiner({10}, tracks, 3.0, 0.02);
  EXPECT_EQ(refiner.residual_count(), 4);
  expect_central_differences(refiner, generic_motion(1));
}

class bundle : public sparse_bundle_adjuster3 {
 public:
  // Each point lives on `span` cameras, the first one moving on from point to point; every third
  // point is in the second group.
  bundle(int cameras, int points, int span, bool first_fixed) {
    std::mt19937 random(5);
    std::uniform_real_distribution<double> unit(0, 1);
    cameras_.resize(cameras);
    cameras_[0].variable = !first_fixed;
    for (int pass = 0; pass < 2; ++pass) {
      for (int t = 0; t < points; ++t) {
        const int group = t % 3 == 2;
        if (group != pass) continue;
        points_[group].push_back({300 * unit(random), 200 * unit(random)});
        const int start = t % (cameras - span + 1);
        for (int c = start; c < start + span; ++c) {
          observations_.push_back({c,
                                   group,
                                   static_cast<int>(points_[group].size()) - 1,
                                   {300 * unit(random), 200 * unit(random)}});
        }
      }
    }
    setup_secondary_variables();
  }

  vector generic() const {
    vector x(unknown_count());
    gather(x.data());
    const vector motion = generic_motion(static_cast<int>(cameras_.size()));
    std::size_t at = 0;
    for (std::size_t c = 0; c < cameras_.size(); ++c) {
      if (!cameras_[c].variable) continue;
      for (int k = 0; k < 4; ++k) x[at++] = motion[4 * c + k];
    }
    return x;
  }
};

class one_observation : public sparse_bundle_adjuster3 {
 public:
  one_observation() {
    cameras_.resize(1);
    points_[0] = {{100, 50}};
    observations_ = {{0, 0, 0, {104, 53}}};
    setup_secondary_variables();
  }
};

TEST(SparseBundleAdjuster, WorkedResidual) {
  one_observation problem;
  const vector x = {1.02, 0.01, 3, -2, 100, 50};
  vector f(2);
  problem.compute_cost(x.data(), f.data());
  EXPECT_NEAR(f[0], 0.48490854, 1e-8);
  EXPECT_NEAR(f[1], -2.98256698, 1e-8);
}

TEST(SparseBundleAdjuster, JacobianIsTheDerivative) {
  for (const bool first_fixed : {true, false}) {
    bundle problem(5, 7, 3, first_fixed);
    expect_central_differences(problem, problem.generic());
  }
}

TEST(SparseBundleAdjuster, SchurSolutionAgreesWithTheDenseMatrix) {
  for (const int span : {3, 8}) {  // a narrow band, and a full matrix
    bundle problem(8, 30, span, true);
    const vector x = problem.generic();
    expect_operations_agree_with_dense(problem, x, vector(x.size(), 0.0));
    EXPECT_TRUE(problem.j_fullrank());
    expect_operations_agree_with_dense(problem, x, vector(x.size(), 2.5));
  }
}

TEST(SparseBundleAdjuster, FreeGaugeIsNotFullRankAndStillSolves) {
  bundle problem(6, 20, 6, false);
  const vector x = problem.generic();
  vector f(problem.residual_count()), g(x.size()), step(x.size());
  problem.compute_cost(x.data(), f.data());
  problem.compute_sparse_jacobian(x.data(), f.data());
  problem.jtf(f.data(), g.data());
  problem.update_pinv_jtj_diag(vector(x.size(), 0.0).data());
  problem.pinv_jtj_x(g.data(), step.data());
  ASSERT_FALSE(problem.user_error);
  // The step satisfies the normal equations although the scene may float.
  const vector j = jacobian(problem, x);
  const std::size_t m = f.size(), n = x.size();
  vector product(n);
  for (std::size_t i = 0; i < m; ++i) {
    double r = 0;
    for (std::size_t k = 0; k < n; ++k) r += j[i * n + k] * step[k];
    for (std::size_t k = 0; k < n; ++k) product[k] += j[i * n + k] * r;
  }
  double scale = 0;
  for (const double v : g) scale = std::max(scale, std::fabs(v));
  for (std::size_t k = 0; k < n; ++k) EXPECT_NEAR(product[k], g[k], 1e-6 * scale);
}

TEST(MapBetween, TakesBundledPlacesToRefinedOnes) {
  const similarity map = map_between({1.01, 0.02, 4, -1}, {1.03, -0.01, 2, 2});
  EXPECT_NEAR(map.scale, 1.01980198, 1e-8);
  EXPECT_NEAR(map.angle, -0.03, 1e-12);
  EXPECT_NEAR(map.tx, -2.04678294, 1e-8);
  EXPECT_NEAR(map.ty, 3.14170099, 1e-8);
  const point2 p = transform(map, transform(similarity{1.01, 0.02, 4, -1}, {100, 50}));
  EXPECT_NEAR(p.x, 105.50984146, 1e-7);
  EXPECT_NEAR(p.y, 52.46744219, 1e-7);
}

}  // namespace
}  // namespace marrow::stabilization
