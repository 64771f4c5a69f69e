#include "stabilization/least_squares/lm_solver.h"

#include <gtest/gtest.h>

#include <algorithm>
#include <cmath>
#include <functional>
#include <limits>
#include <string>
#include <vector>

#include "stabilization/least_squares/band_normal_system.h"

namespace marrow::stabilization {
namespace {

using vector = std::vector<double>;

// A problem with a dense Jacobian, every operation written out. Counts its calls by name; fails in
// the operation named `fail_in`.
struct dense_problem {
  int m;
  int n;
  std::function<vector(const vector&)> residuals;
  std::function<vector(const vector&)> jacobian;  // m x n, row-major

  bool user_error = false;
  std::string fail_in;
  int stop_at = -1;  // monitor_progress returns false at this iteration
  std::vector<std::string> calls;
  vector j;
  band_normal_system system;

  void called(const std::string& name) {
    calls.push_back(name);
    if (name == fail_in) user_error = true;
  }
  int count(const std::string& name) const {
    return static_cast<int>(std::count(calls.begin(), calls.end(), name));
  }

  void compute_cost(const double* x, double* f) {
    called("compute_cost");
    const vector r = residuals(vector(x, x + n));
    std::copy(r.begin(), r.end(), f);
  }
  void compute_sparse_jacobian(const double* x, const double*) {
    called("compute_sparse_jacobian");
    j = jacobian(vector(x, x + n));
  }
  void update_unknown(const double* x, const double* step, double* x_new) {
    called("update_unknown");
    for (int k = 0; k < n; ++k) x_new[k] = x[k] + step[k];
  }
  bool monitor_progress(std::int64_t iter, const double*, const double*) {
    called("monitor_progress");
    return iter != stop_at;
  }
  void j_norm(double* norms) {
    called("j_norm");
    for (int k = 0; k < n; ++k) {
      norms[k] = 0;
      for (int i = 0; i < m; ++i) norms[k] += j[i * n + k] * j[i * n + k];
      norms[k] = std::sqrt(norms[k]);
    }
  }
  void jtf(const double* f, double* g) {
    called("jtf");
    for (int k = 0; k < n; ++k) {
      g[k] = 0;
      for (int i = 0; i < m; ++i) g[k] += j[i * n + k] * f[i];
    }
  }
  double jtj_quadratic(const double* p) {
    called("jtj_quadratic");
    double sum = 0;
    for (int i = 0; i < m; ++i) {
      double r = 0;
      for (int k = 0; k < n; ++k) r += j[i * n + k] * p[k];
      sum += r * r;
    }
    return sum;
  }
  void update_pinv_jtj_diag(const double* diagonal) {
    called("update_pinv_jtj_diag");
    system.resize(n, n - 1);
    for (int b = 0; b < n; ++b) {
      for (int a = b; a < n; ++a)
        for (int i = 0; i < m; ++i) system.at(a, b) += j[i * n + a] * j[i * n + b];
      system.at(b, b) += diagonal[b];
    }
    system.factorize();
  }
  void pinv_jtj_x(const double* b, double* x) {
    called("pinv_jtj_x");
    const vector copy(b, b + n);
    std::copy(copy.begin(), copy.end(), x);
    system.solve(x);
  }
  bool j_fullrank() {
    called("j_fullrank");
    return static_cast<int>(system.rank()) == n;
  }
  double pinv_jtj_quadratic(const double* v) {
    called("pinv_jtj_quadratic");
    vector x(v, v + n);
    system.solve(x.data());
    double sum = 0;
    for (int k = 0; k < n; ++k) sum += v[k] * x[k];
    return sum;
  }
  void report_initial_residual(double, std::int64_t) { called("report_initial_residual"); }
  void report_iteration_residual(double, std::int64_t) { called("report_iteration_residual"); }
  void report_final_residual(double, std::int64_t) { called("report_final_residual"); }
};

dense_problem rosenbrock() {
  dense_problem p;
  p.m = 2;
  p.n = 2;
  p.residuals = [](const vector& x) { return vector{10 * (x[1] - x[0] * x[0]), 1 - x[0]}; };
  p.jacobian = [](const vector& x) { return vector{-20 * x[0], 10, -1, 0}; };
  return p;
}

// Freudenstein and Roth's function: from (0.5, -2) the iteration ends in a local minimum of
// 48.9842..., not in the zero at (5, 4).
dense_problem freudenstein_roth() {
  dense_problem p;
  p.m = 2;
  p.n = 2;
  p.residuals = [](const vector& x) {
    return vector{-13 + x[0] + ((5 - x[1]) * x[1] - 2) * x[1],
                  -29 + x[0] + ((x[1] + 1) * x[1] - 14) * x[1]};
  };
  p.jacobian = [](const vector& x) {
    return vector{1, x[1] * (10 - 3 * x[1]) - 2, 1, x[1] * (2 + 3 * x[1]) - 14};
  };
  return p;
}

// Powell's singular function: J has rank 2 at the solution 0.
dense_problem powell_singular() {
  dense_problem p;
  p.m = 4;
  p.n = 4;
  p.residuals = [](const vector& x) {
    const double a = x[1] - 2 * x[2], b = x[0] - x[3];
    return vector{x[0] + 10 * x[1], std::sqrt(5.0) * (x[2] - x[3]), a * a, std::sqrt(10.0) * b * b};
  };
  p.jacobian = [](const vector& x) {
    const double a = x[1] - 2 * x[2], b = std::sqrt(10.0) * (x[0] - x[3]), s = std::sqrt(5.0);
    return vector{1, 10, 0, 0, 0, 0, s, -s, 0, 2 * a, -4 * a, 0, 2 * b, 0, 0, -2 * b};
  };
  return p;
}

struct result {
  std::int64_t info;
  vector x;
  vector f;
  std::int64_t iter, nfev, njev;
  double cost() const {
    double sum = 0;
    for (const double r : f) sum += r * r;
    return sum;
  }
};

template <class Progress>
result run(dense_problem& p, vector x, std::int64_t max_iter, Progress&& progress) {
  lm_solver<double> solver(p.m, p.n);
  vector f(p.m);
  solver.solve(p, x.data(), f.data(), max_iter, progress);
  return {solver.info, x, f, solver.iter, solver.nfev, solver.njev};
}
result run(dense_problem& p, const vector& x, std::int64_t max_iter = 0) {
  return run(p, x, max_iter, [] {});
}

TEST(LmSolver, ClassicProblemsReachTheirMinima) {
  dense_problem r = rosenbrock();
  const result a = run(r, {-1.2, 1});
  EXPECT_LT(a.info, 5);
  EXPECT_NEAR(a.x[0], 1, 1e-6);
  EXPECT_NEAR(a.x[1], 1, 1e-6);
  EXPECT_LT(a.nfev, 40);

  dense_problem fr = freudenstein_roth();
  const result b = run(fr, {0.5, -2});
  EXPECT_GE(b.info, 1);
  EXPECT_LE(b.info, 4);
  EXPECT_NEAR(b.cost(), 48.98425, 1e-4);
  EXPECT_NEAR(b.x[0], 11.4128, 1e-2);
  EXPECT_NEAR(b.x[1], -0.89681, 1e-3);

  dense_problem ps = powell_singular();
  EXPECT_LT(run(ps, {3, -1, 0, 1}).cost(), 1e-9);
}

TEST(LmSolver, FirstStepOfALinearProblemSolvesIt) {
  // f = A x - b; the normal equations [25 20; 20 169] x = (45, 225) give (69/85, 21/17).
  dense_problem p;
  p.m = 3;
  p.n = 2;
  p.residuals = [](const vector& x) {
    return vector{3 * x[0] - 3, 4 * x[0] + 5 * x[1] - 9, 12 * x[1] - 15};
  };
  p.jacobian = [](const vector&) { return vector{3, 0, 4, 5, 0, 12}; };
  const result r = run(p, {2, 3});
  EXPECT_EQ(r.info, 4);  // the second gradient vanishes
  EXPECT_EQ(r.iter, 1);
  EXPECT_EQ(r.nfev, 2);
  EXPECT_EQ(r.njev, 2);
  EXPECT_NEAR(r.x[0], 69.0 / 85, 1e-12);
  EXPECT_NEAR(r.x[1], 21.0 / 17, 1e-12);
  EXPECT_EQ(p.count("update_pinv_jtj_diag"), 1);
  EXPECT_EQ(p.count("j_fullrank"), 0);
}

TEST(LmSolver, DampedStepKeepsToTheTrustRegion) {
  // Far from a start at 1e-3, so delta = 100 |diag x| binds: |diag p| within a tenth of it.
  dense_problem p;
  p.m = 2;
  p.n = 2;
  p.residuals = [](const vector& x) { return vector{2 * (x[0] - 1000), 3 * (x[1] - 1000)}; };
  p.jacobian = [](const vector&) { return vector{2, 0, 0, 3}; };
  const result r = run(p, {1e-3, 1e-3}, 1);
  EXPECT_EQ(r.info, 9);
  const double delta = 100 * std::hypot(2e-3, 3e-3);
  const double taken = std::hypot(2 * (r.x[0] - 1e-3), 3 * (r.x[1] - 1e-3));
  EXPECT_NEAR(taken, delta, 0.1 * delta);
  EXPECT_GE(p.count("update_pinv_jtj_diag"), 2);
  EXPECT_EQ(p.count("pinv_jtj_quadratic"), 1);
}

TEST(LmSolver, SizesAreCheckedBeforeAnyCall) {
  dense_problem p = rosenbrock();
  p.m = 1;
  EXPECT_EQ(run(p, {1, 1}).info, 14);
  p.m = 0;
  EXPECT_EQ(run(p, {1, 1}).info, 15);
  p.m = 2;
  p.n = 0;
  EXPECT_EQ(run(p, {}).info, 15);
  EXPECT_TRUE(p.calls.empty());
}

TEST(LmSolver, ZeroResidualStopsAfterOneJacobian) {
  dense_problem p = rosenbrock();
  const result r = run(p, {1, 1});
  EXPECT_EQ(r.info, 4);
  EXPECT_EQ(r.nfev, 1);
  EXPECT_EQ(r.njev, 1);
  EXPECT_EQ(r.iter, 0);
  EXPECT_EQ(p.count("report_final_residual"), 1);
}

TEST(LmSolver, GradientEqualToItsToleranceGoesOn) {
  // f = (x - 1, 1) at x = 2: the cosine of f and J's column is exactly 1 / sqrt(2).
  for (const bool above : {false, true}) {
    dense_problem p;
    p.m = 2;
    p.n = 1;
    p.residuals = [](const vector& x) { return vector{x[0] - 1, 1}; };
    p.jacobian = [](const vector&) { return vector{1, 0}; };
    lm_solver<double> solver(2, 1);
    const double cosine = 1.0 / std::sqrt(2.0);
    solver.gtol = above ? std::nextafter(cosine, 1.0) : cosine;
    vector x = {2}, f(2);
    solver.solve(p, x.data(), f.data(), 1, [] {});
    EXPECT_EQ(solver.iter, above ? 0 : 1);
  }
}

TEST(LmSolver, UnseenUnknownIsPassedOver) {
  dense_problem p;
  p.m = 2;
  p.n = 2;
  p.residuals = [](const vector& x) { return vector{x[0] * x[0] - 4, x[0] - 3}; };
  p.jacobian = [](const vector& x) { return vector{2 * x[0], 0, 1, 0}; };
  const result r = run(p, {7, 5});
  EXPECT_LT(r.info, 5);
  EXPECT_EQ(r.x[1], 5);
  const double h = r.x[0];
  EXPECT_NEAR(2 * h * (h * h - 4) + (h - 3), 0, 1e-3);
}

TEST(LmSolver, LimitsOfIterationsAndEvaluations) {
  dense_problem p = rosenbrock();
  const result limited = run(p, {-1.2, 1}, 3);
  EXPECT_EQ(limited.info, 9);
  EXPECT_EQ(limited.iter, 3);

  dense_problem q = rosenbrock();
  lm_solver<double> solver(2, 2);
  solver.maxfev = 4;
  vector x = {-1.2, 1}, f(2);
  EXPECT_EQ(solver.solve(q, x.data(), f.data(), 0, [] {}), 5);
  EXPECT_EQ(solver.nfev, 4);
}

TEST(LmSolver, UselessStepsLeaveXAndShrinkTheRegion) {
  // The Jacobian's sign is wrong, so every step goes uphill.
  dense_problem p = rosenbrock();
  p.jacobian = [](const vector& x) { return vector{20 * x[0], -10, 1, 0}; };
  const vector start = {-1.2, 1.3};
  const result r = run(p, start);
  EXPECT_EQ(r.info, 2);
  EXPECT_EQ(r.x, start);
  EXPECT_EQ(r.iter, 0);
  EXPECT_EQ(r.njev, 1);
  EXPECT_EQ(r.f, p.residuals(start));
}

TEST(LmSolver, CostNeverRisesFromIterationToIteration) {
  double previous = std::numeric_limits<double>::infinity();
  for (int limit = 1; limit < 25; ++limit) {
    dense_problem p = rosenbrock();
    const result r = run(p, {-1.2, 1}, limit);
    EXPECT_LE(r.cost(), previous);
    const vector f = p.residuals(r.x);
    EXPECT_EQ(r.f, f) << "residuals belong to x";
    previous = r.cost();
  }
}

TEST(LmSolver, FailureOfAnOperationEndsTheRunWithItsCode) {
  const std::pair<const char*, int> codes[] = {{"compute_cost", 10},
                                               {"compute_sparse_jacobian", 11},
                                               {"update_unknown", 12},
                                               {"monitor_progress", 13},
                                               {"j_norm", 16},
                                               {"jtf", 17},
                                               {"jtj_quadratic", 18},
                                               {"update_pinv_jtj_diag", 19},
                                               {"pinv_jtj_x", 20},
                                               {"j_fullrank", 21},
                                               {"pinv_jtj_quadratic", 22},
                                               {"report_initial_residual", 23},
                                               {"report_iteration_residual", 24},
                                               {"report_final_residual", 25}};
  for (const auto& [operation, code] : codes) {
    dense_problem p = rosenbrock();
    p.fail_in = operation;
    // From near 0 the trust region binds at once, so that every operation is reached.
    const result r = run(p, {1e-4, 1e-4});
    EXPECT_EQ(r.info, code) << operation;
    EXPECT_EQ(p.calls.back(), operation);
    EXPECT_EQ(std::string(lm_status_text(code)).find("user error in " + p.fail_in), 0u);
  }
}

TEST(LmSolver, ResidualThatIsNotFiniteIsAnErrorOfTheCost) {
  dense_problem p = rosenbrock();
  int evaluation = 0;
  p.residuals = [&evaluation](const vector&) {
    return vector{++evaluation == 1 ? 1.0 : std::numeric_limits<double>::quiet_NaN(), 1};
  };
  const result r = run(p, {-1.2, 1});
  EXPECT_EQ(r.info, 10);
  EXPECT_EQ(r.nfev, 2);
  EXPECT_EQ(r.x, (vector{-1.2, 1}));
}

TEST(LmSolver, MonitorRunsOnceAnOuterIterationAndMayStop) {
  dense_problem p = rosenbrock();
  p.stop_at = 2;
  const result r = run(p, {-1.2, 1});
  EXPECT_EQ(r.info, 26);
  EXPECT_EQ(r.iter, 2);
  EXPECT_EQ(p.count("monitor_progress"), 3);
  EXPECT_EQ(p.count("compute_sparse_jacobian"), 2);
}

TEST(LmSolver, ProgressMayThrowOrEndTheRun) {
  dense_problem p = rosenbrock();
  EXPECT_THROW(run(p, {-1.2, 1}, 0, [] { throw 5; }), int);
  int polls = 0;
  const result r = run(p, {-1.2, 1}, 0, [&polls] { return ++polls < 4; });
  EXPECT_EQ(r.info, 30);
  EXPECT_STREQ(lm_status_text(30), "unknown error code");
}

}  // namespace
}  // namespace marrow::stabilization
