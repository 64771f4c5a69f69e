#include "stabilization/least_squares/lm_solver.h"

#include <gtest/gtest.h>

#include <algorithm>
#include <cmath>
#include <functional>
#include <limits>
#include <set>
#include <string>
#include <vector>

#include "tests/stabilization/dense_reference.h"

namespace marrow::stabilization {
namespace {

using vector = std::vector<double>;

double dot(const vector& a, const vector& b) {
  double sum = 0;
  for (std::size_t i = 0; i < a.size(); ++i) sum += a[i] * b[i];
  return sum;
}

// A row for each residual: itself, then its derivatives.
using equations = std::vector<vector>;

equations rosenbrock(const vector& x) {
  return {{10 * (x[1] - x[0] * x[0]), -20 * x[0], 10}, {1 - x[0], -1, 0}};
}

// Freudenstein and Roth's function: from (0.5, -2) the iteration ends in a local minimum of
// 48.9842..., not in the zero at (5, 4).
equations freudenstein_roth(const vector& x) {
  const double y = x[1];
  return {{-13 + x[0] + ((5 - y) * y - 2) * y, 1, y * (10 - 3 * y) - 2},
          {-29 + x[0] + ((y + 1) * y - 14) * y, 1, y * (2 + 3 * y) - 14}};
}

// The normal equations [25 20; 20 169] x = (45, 225) give (69/85, 21/17).
equations straight(const vector& x) {
  return {{3 * x[0] - 3, 3, 0}, {4 * x[0] + 5 * x[1] - 9, 4, 5}, {12 * x[1] - 15, 0, 12}};
}

equations second_unseen(const vector& x) {
  return {{x[0] * x[0] - 4, 2 * x[0], 0}, {x[0] - 3, 1, 0}};
}

// The derivatives' signs are wrong, so every step goes uphill.
equations misled(const vector& x) {
  return {{10 * (x[1] - x[0] * x[0]), 20 * x[0], -10}, {1 - x[0], 1, 0}};
}

equations finite_only_at_two(const vector& x) {
  return {{x[0] == 2 ? 1 : std::nan(""), 1}};
}

// At x = 2 the cosine of the residuals and J's column is exactly 1 / sqrt(2).
equations diagonal(const vector& x) {
  return {{x[0] - 1, 1}, {1, 0}};
}

// Every operation of a problem, written out. Keeps the names of its calls; fails in the operation
// named `fail_in`.
struct dense_problem {
  std::function<equations(const vector&)> at;
  std::size_t m, n;
  bool user_error = false;
  std::string fail_in = {};
  int stop_at = -1;  // monitor_progress returns false at this iteration
  std::vector<std::string> calls = {};
  equations rows = {};
  vector jtj = {}, normal = {};  // J'J, and with D

  void called(const std::string& name) {
    calls.push_back(name);
    if (name == fail_in) user_error = true;
  }
  long count(const std::string& name) const { return std::count(calls.begin(), calls.end(), name); }

  void compute_cost(const double* x, double* f) {
    called("compute_cost");
    for (const vector& row : at(vector(x, x + n))) *f++ = row[0];
  }
  void compute_sparse_jacobian(const double* x, const double*) {
    called("compute_sparse_jacobian");
    rows = at(vector(x, x + n));
    jtj.assign(n * n, 0);
    for (std::size_t i = 0; i < n * n; ++i) {
      for (const vector& row : rows) jtj[i] += row[i / n + 1] * row[i % n + 1];
    }
  }
  void update_unknown(const double* x, const double* step, double* x_new) {
    called("update_unknown");
    for (std::size_t k = 0; k < n; ++k) x_new[k] = x[k] + step[k];
  }
  bool monitor_progress(std::int64_t iter, const double*, const double*) {
    called("monitor_progress");
    return iter != stop_at;
  }
  void j_norm(double* norms) {
    called("j_norm");
    for (std::size_t k = 0; k < n; ++k) norms[k] = std::sqrt(jtj[k * n + k]);
  }
  void jtf(const double* f, double* g) {
    called("jtf");
    std::fill(g, g + n, 0.0);
    for (std::size_t i = 0; i < m * n; ++i) g[i % n] += rows[i / n][i % n + 1] * f[i / n];
  }
  double jtj_quadratic(const double* p) {
    called("jtj_quadratic");
    double sum = 0;
    for (std::size_t i = 0; i < n * n; ++i) sum += jtj[i] * p[i / n] * p[i % n];
    return sum;
  }
  void update_pinv_jtj_diag(const double* d) {
    called("update_pinv_jtj_diag");
    normal = jtj;
    for (std::size_t k = 0; k < n; ++k) normal[k * n + k] += d[k];
  }
  void pinv_jtj_x(const double* b, double* x) {
    called("pinv_jtj_x");
    std::ranges::copy(minimum_norm(normal, vector(b, b + n)), x);
  }
  bool j_fullrank() {
    called("j_fullrank");
    std::size_t rank = 0;
    minimum_norm(normal, vector(n), &rank);
    return rank == n;
  }
  double pinv_jtj_quadratic(const double* v) {
    called("pinv_jtj_quadratic");
    return dot(vector(v, v + n), minimum_norm(normal, vector(v, v + n)));
  }
  void report_initial_residual(double, std::int64_t) { called("report_initial_residual"); }
  void report_iteration_residual(double, std::int64_t) { called("report_iteration_residual"); }
  void report_final_residual(double, std::int64_t) { called("report_final_residual"); }
};

struct result {
  std::int64_t info, iter, nfev, njev;
  vector x, f;
};

struct no_progress {
  void operator()() const {}
};

template <class Progress = no_progress>
result run(
    dense_problem& p, vector x, std::int64_t max_iter = 0, Progress progress = {},
    const std::function<void(lm_solver<double>&)>& set_limits = [](auto&) {}) {
  lm_solver<double> solver(static_cast<std::int64_t>(p.m), static_cast<std::int64_t>(p.n));
  set_limits(solver);
  vector f(p.m);
  solver.solve(p, x.data(), f.data(), max_iter, progress);
  return {solver.info, solver.iter, solver.nfev, solver.njev, x, f};
}

TEST(LmSolver, ClassicProblemsReachTheirMinima) {
  const struct {
    dense_problem problem;
    vector start, found, tolerance;
    double cost;
  } cases[] = {{{rosenbrock, 2, 2}, {-1.2, 1}, {1, 1}, {1e-6, 1e-6}, 0},
               {{straight, 3, 2}, {2, 3}, {69.0 / 85, 21.0 / 17}, {1e-12, 1e-12}, .52941},
               // 2 x (x^2 - 4) + x - 3 = 0 at 2.0565; the unseen unknown stays.
               {{second_unseen, 2, 2}, {7, 5}, {2.0565, 5}, {1e-3, 0}, .9425}};
  for (const auto& e : cases) {
    dense_problem p = e.problem;
    const result r = run(p, e.start);
    EXPECT_GE(r.info, 1);
    EXPECT_LE(r.info, 4);
    EXPECT_LT(r.nfev, 40);
    EXPECT_NEAR(dot(r.f, r.f), e.cost, 1e-3);
    for (std::size_t k = 0; k < e.found.size(); ++k) {
      EXPECT_NEAR(r.x[k], e.found[k], e.tolerance[k]) << k;
    }
  }
}

TEST(LmSolver, WhatEndsARun) {
  const struct {
    const char* situation;
    dense_problem problem;
    vector start;
    std::int64_t max_iter, info, iter, nfev, njev;
  } cases[] = {{"no residual", {rosenbrock, 2, 2}, {1, 1}, 0, 4, 0, 1, 1},
               {"a linear problem's first step", {straight, 3, 2}, {2, 3}, 0, 4, 1, 2, 2},
               {"iterations", {rosenbrock, 2, 2}, {-1.2, 1}, 3, 9, 3, -1, 3},
               {"no number", {finite_only_at_two, 1, 1}, {2}, 0, 10, 0, 2, 1},
               {"useless steps", {misled, 2, 2}, {-1.2, 1.3}, 0, 2, 0, -1, 1},
               {"fewer residuals than unknowns", {rosenbrock, 1, 2}, {1, 1}, 0, 14, 0, 0, 0},
               {"no residuals", {rosenbrock, 0, 2}, {1, 1}, 0, 15, 0, 0, 0}};
  for (const auto& e : cases) {
    SCOPED_TRACE(e.situation);
    dense_problem p = e.problem;
    const result r = run(p, e.start, e.max_iter);
    EXPECT_EQ(r.info, e.info);
    EXPECT_EQ(r.iter, e.iter);
    EXPECT_TRUE(e.nfev < 0 || r.nfev == e.nfev) << r.nfev;
    EXPECT_EQ(r.njev, e.njev);
    EXPECT_EQ(p.count("report_final_residual"), e.info < 10);
    EXPECT_EQ(p.calls.empty(), e.njev == 0);
    EXPECT_EQ(r.x == e.start, e.iter == 0);
  }
}

// From 1e-3 the first step is bound to delta = 100 |diag x|, |diag p| within a tenth of it. 1000 is
// ten thousand times further than that, and each kept promise doubles the region: 1 + 2 + 4 + ...
// comes there in 14 steps.
TEST(LmSolver, DampedStepsKeepToATrustRegionThatDoubles) {
  dense_problem p = {[](const vector& x) {
                       return equations{{2 * (x[0] - 1000), 2, 0}, {3 * (x[1] - 1000), 0, 3}};
                     },
                     2, 2};
  const result first = run(p, {1e-3, 1e-3}, 1);
  const double delta = 100 * std::hypot(2e-3, 3e-3);
  const double taken = std::hypot(2 * (first.x[0] - 1e-3), 3 * (first.x[1] - 1e-3));
  EXPECT_NEAR(taken, delta, 0.1 * delta);
  EXPECT_EQ(p.count("pinv_jtj_quadratic"), 1);
  const result all = run(p, {1e-3, 1e-3});
  EXPECT_NEAR(all.x[1], 1000, 1e-6);
  EXPECT_GE(all.iter, 13);
  EXPECT_LE(all.iter, 15);
}

TEST(LmSolver, LimitsGoByTheirComparison) {
  const double cosine = 1.0 / std::sqrt(2.0);
  for (const auto& [limit, steps] : {std::pair(cosine, 1), {std::nextafter(cosine, 1.0), 0}}) {
    dense_problem p = {diagonal, 2, 1};
    const double gtol = limit;
    EXPECT_EQ(run(p, {2}, 1, no_progress(), [=](auto& solver) { solver.gtol = gtol; }).iter, steps);
  }
  dense_problem p = {rosenbrock, 2, 2};
  const result r = run(p, {-1.2, 1}, 0, no_progress(), [](auto& solver) {
    EXPECT_EQ(solver.maxfev, 800);
    solver.maxfev = 4;
  });
  EXPECT_EQ(r.info, 5);
  EXPECT_EQ(r.nfev, 4);
}

// The counts that MINPACK's lmder takes from the usual start and from ten times it (More,
// Garbow and Hillstrom, Testing Unconstrained Optimization Software, 1981).
TEST(LmSolver, EvaluationsAreThoseOfLmder) {
  const struct {
    dense_problem problem;
    vector start;
    std::int64_t nfev, njev;
  } cases[] = {{{rosenbrock, 2, 2}, {-12, 10}, 8, 5},
               {{rosenbrock, 2, 2}, {-120, 100}, 6, 4},
               {{freudenstein_roth, 2, 2}, {0.5, -2}, 14, 8},
               {{freudenstein_roth, 2, 2}, {5, -20}, 19, 12}};
  for (const auto& e : cases) {
    dense_problem p = e.problem;
    const result r = run(p, e.start, 0, no_progress(), [](auto& solver) {
      solver.xtol = solver.ftol = std::sqrt(std::numeric_limits<double>::epsilon());
      solver.gtol = 0;
    });
    EXPECT_EQ(r.nfev, e.nfev) << e.start[0];
    EXPECT_EQ(r.njev, e.njev) << e.start[0];
  }
}

TEST(LmSolver, FailureOfAnOperationEndsTheRunWithItsCode) {
  // From near 0 the trust region binds at once, so that every operation is reached.
  dense_problem whole = {rosenbrock, 2, 2};
  run(whole, {1e-4, 1e-4});
  const std::set<std::string> operations(whole.calls.begin(), whole.calls.end());
  EXPECT_EQ(operations.size(), 14u);
  for (const std::string& operation : operations) {
    dense_problem p = {rosenbrock, 2, 2, false, operation};
    const std::int64_t code = run(p, {1e-4, 1e-4}).info;
    EXPECT_EQ(p.calls.back(), operation);
    EXPECT_GE(code, 10);
    EXPECT_TRUE(std::string(lm_status_text(code)).starts_with("user error in " + operation));
  }
}

TEST(LmSolver, MonitorAndProgressMayEndTheRun) {
  dense_problem p = {rosenbrock, 2, 2};
  p.stop_at = 2;
  EXPECT_EQ(run(p, {-1.2, 1}).info, 26);
  EXPECT_EQ(p.count("compute_sparse_jacobian"), 2);

  p.stop_at = -1;
  EXPECT_THROW(run(p, {-1.2, 1}, 0, [] { throw 5; }), int);
  int polls = 0;
  EXPECT_EQ(run(p, {-1.2, 1}, 0, [&polls] { return ++polls < 4; }).info, 30);
  EXPECT_STREQ(lm_status_text(30), "unknown error code");
}

}  // namespace
}  // namespace marrow::stabilization
