#include "stabilization/least_squares/lm_solver.h"

#include <gtest/gtest.h>

#include <algorithm>
#include <cmath>
#include <limits>
#include <set>
#include <string>
#include <vector>

#include "tests/stabilization/clips.h"
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
  return {{x[0] == 2 ? 1 : std::nan(""), 1, 0}, {0, 0, 1}};
}

// At x = 2 the cosine of the residuals and J's column is exactly 1 / sqrt(2).
equations diagonal(const vector& x) {
  return {{x[0] - 1, 1, 0}, {1, 0, 0}};
}

// Every operation of a problem in two unknowns, written out. Keeps the names of its calls; fails in
// the operation named `fail_in`.
struct dense_problem {
  equations (*at)(const vector&);
  bool user_error = false;
  std::string fail_in = {};
  int stop_at = -1;  // monitor_progress returns false at this iteration
  std::vector<std::string> calls = {};
  equations rows = {};
  vector jtj = {}, normal = {};  // J'J, and with D

  void called(const std::string& operation) {
    calls.push_back(operation);
    user_error = operation == fail_in;
  }
  std::int64_t count(const std::string& operation) const {
    return std::ranges::count(calls, operation);
  }

  void compute_cost(const double* x, double* f) {
    called("compute_cost");
    for (const vector& row : at({x[0], x[1]})) *f++ = row[0];
  }
  void compute_sparse_jacobian(const double* x, const double*) {
    called("compute_sparse_jacobian");
    rows = at({x[0], x[1]});
    dense_reference squares(2);
    for (const vector& row : rows) squares.add(1, {{0, row[1]}, {1, row[2]}}, 0);
    jtj = squares.matrix;
  }
  void update_unknown(const double* x, const double* step, double* x_new) {
    called("update_unknown");
    std::transform(x, x + 2, step, x_new, std::plus());
  }
  bool monitor_progress(std::int64_t iter, const double*, const double*) {
    called("monitor_progress");
    return iter != stop_at;
  }
  void j_norm(double* norms) {
    called("j_norm");
    for (const int k : {0, 1}) norms[k] = std::sqrt(jtj[3 * k]);
  }
  void jtf(const double* f, double* g) {
    called("jtf");
    g[0] = g[1] = 0;
    for (std::size_t i = 0; i < 2 * rows.size(); ++i) g[i % 2] += rows[i / 2][i % 2 + 1] * f[i / 2];
  }
  double jtj_quadratic(const double* p) {
    called("jtj_quadratic");
    return jtj[0] * p[0] * p[0] + 2 * jtj[1] * p[0] * p[1] + jtj[3] * p[1] * p[1];
  }
  void update_pinv_jtj_diag(const double* d) {
    called("update_pinv_jtj_diag");
    normal = {jtj[0] + d[0], jtj[1], jtj[2], jtj[3] + d[1]};
  }
  void pinv_jtj_x(const double* b, double* x) {
    called("pinv_jtj_x");
    std::ranges::copy(minimum_norm(normal, {b[0], b[1]}), x);
  }
  bool j_fullrank() {
    called("j_fullrank");
    std::size_t rank = 0;
    minimum_norm(normal, {0, 0}, &rank);
    return rank == 2;
  }
  double pinv_jtj_quadratic(const double* v) {
    called("pinv_jtj_quadratic");
    return dot({v[0], v[1]}, minimum_norm(normal, {v[0], v[1]}));
  }
  void report_initial_residual(double, std::int64_t) { called("report_initial_residual"); }
  void report_iteration_residual(double, std::int64_t) { called("report_iteration_residual"); }
  void report_final_residual(double, std::int64_t) { called("report_final_residual"); }
};

// A solver with the unknowns and residuals that it works on.
struct run : lm_solver<double> {
  vector x, f;

  explicit run(vector start, std::size_t residuals = 2)
      : lm_solver(static_cast<std::int64_t>(residuals), 2), x(std::move(start)), f(residuals) {}

  template <class Progress = progress_functor>
  run& of(dense_problem& p, std::int64_t max_iter = 0, Progress progress = kNoProgress) {
    solve(p, x.data(), f.data(), max_iter, progress);
    return *this;
  }
};

TEST(LmSolver, WhatEndsARunAndWhere) {
  const struct {
    const char* situation;
    dense_problem problem;
    vector start;
    std::int64_t max_iter, info, iter, nfev, njev;  // -1: any number
    vector found = {}, tolerance = {0, 0};
  } cases[] = {{"no residual", {rosenbrock}, {1, 1}, 0, 4, 0, 1, 1, {1, 1}},
               {"linear", {straight}, {2, 3}, 0, 4, 1, 2, 2, {69. / 85, 21. / 17}, {1e-12, 1e-12}},
               // 2 x (x^2 - 4) + x - 3 = 0 at 2.0565; the unseen unknown stays.
               {"unseen", {second_unseen}, {7, 5}, 0, 4, -1, -1, -1, {2.0565, 5}, {1e-3, 0}},
               {"iterations", {rosenbrock}, {-1.2, 1}, 3, 9, 3, -1, 3},
               {"no number", {finite_only_at_two}, {2, 0}, 0, 10, 0, 2, 1, {2, 0}},
               {"useless steps", {misled}, {-1.2, 1.3}, 0, 2, 0, -1, 1, {-1.2, 1.3}}};
  for (const auto& e : cases) {
    SCOPED_TRACE(e.situation);
    dense_problem p = e.problem;
    run r(e.start, p.at(e.start).size());
    r.of(p, e.max_iter);
    EXPECT_EQ(r.info, e.info);
    EXPECT_TRUE(e.iter < 0 || r.iter == e.iter) << r.iter;
    EXPECT_TRUE(e.nfev < 0 || r.nfev == e.nfev) << r.nfev;
    EXPECT_TRUE(e.njev < 0 || r.njev == e.njev) << r.njev;
    EXPECT_EQ(p.count("report_final_residual"), e.info < 10);
    for (std::size_t k = 0; k < e.found.size(); ++k) {
      EXPECT_NEAR(r.x[k], e.found[k], e.tolerance[k]) << k;
    }
    for (std::size_t i = 0; i < r.f.size(); ++i) EXPECT_EQ(r.f[i], p.at(r.x)[i][0]);
  }
  dense_problem none = {rosenbrock};
  EXPECT_EQ(run({1, 1}, 1).of(none).info, 14);  // fewer residuals than unknowns
  EXPECT_EQ(run({1, 1}, 0).of(none).info, 15);
  EXPECT_TRUE(none.calls.empty());
}

TEST(LmSolver, LimitsGoByTheirComparison) {
  const double cosine = 1.0 / std::sqrt(2.0);
  for (const auto& [limit, steps] : {std::pair(cosine, 1), {std::nextafter(cosine, 1.0), 0}}) {
    dense_problem p = {diagonal};
    run r({2, 0});
    r.gtol = limit;
    EXPECT_EQ(r.of(p, 1).iter, steps);
  }
  dense_problem p = {rosenbrock};
  run r({-1.2, 1});
  EXPECT_EQ(r.maxfev, 800);
  r.maxfev = 4;
  EXPECT_EQ(r.of(p).info, 5);
  EXPECT_EQ(r.nfev, 4);

  // The first step is bound to 100 |diag x|, |diag p| within a tenth of it.
  dense_problem bound = {straight};
  const vector x = run({1e-4, 1e-4}, 3).of(bound, 1).x;
  const double delta = 100 * std::hypot(5e-4, 13e-4);
  EXPECT_NEAR(std::hypot(5 * (x[0] - 1e-4), 13 * (x[1] - 1e-4)), delta, 0.1 * delta);
}

// The counts that MINPACK's lmder takes from the usual start and from ten times it (More,
// Garbow and Hillstrom, Testing Unconstrained Optimization Software, 1981).
TEST(LmSolver, EvaluationsAreThoseOfLmder) {
  const struct {
    dense_problem problem;
    vector start;
    std::int64_t nfev, njev;
    double cost;
  } cases[] = {{{rosenbrock}, {-12, 10}, 8, 5, 0},
               {{rosenbrock}, {-120, 100}, 6, 4, 0},
               {{freudenstein_roth}, {0.5, -2}, 14, 8, 48.98425},
               {{freudenstein_roth}, {5, -20}, 19, 12, 48.98425}};
  for (const auto& e : cases) {
    dense_problem p = e.problem;
    run r(e.start);
    r.xtol = r.ftol = std::sqrt(std::numeric_limits<double>::epsilon());
    r.gtol = 0;
    r.of(p);
    EXPECT_EQ(r.nfev, e.nfev) << e.start[0];
    EXPECT_EQ(r.njev, e.njev) << e.start[0];
    EXPECT_NEAR(dot(r.f, r.f), e.cost, 1e-5) << e.start[0];
  }
}

TEST(LmSolver, FailureOfAnOperationEndsTheRunWithItsCode) {
  // From near 0 the trust region binds at once, so that every operation is reached.
  dense_problem whole = {rosenbrock};
  run({1e-4, 1e-4}).of(whole);
  const std::set<std::string> operations(whole.calls.begin(), whole.calls.end());
  EXPECT_EQ(operations.size(), 14u);
  for (const std::string& operation : operations) {
    dense_problem p = {rosenbrock, false, operation};
    const std::int64_t code = run({1e-4, 1e-4}).of(p).info;
    EXPECT_EQ(p.calls.back(), operation);
    EXPECT_GE(code, 10);
    EXPECT_TRUE(std::string(lm_status_text(code)).starts_with("user error in " + operation));
  }
}

TEST(LmSolver, MonitorAndProgressMayEndTheRun) {
  dense_problem p = {rosenbrock, false, "", 2};
  EXPECT_EQ(run({-1.2, 1}).of(p).info, 26);
  EXPECT_EQ(p.count("compute_sparse_jacobian"), 2);

  p.stop_at = -1;
  EXPECT_THROW(run({-1.2, 1}).of(p, 0, [] { throw 5; }), int);
  int polls = 0;
  EXPECT_EQ(run({-1.2, 1}).of(p, 0, [&polls] { return ++polls < 4; }).info, 30);
  EXPECT_STREQ(lm_status_text(30), "unknown error code");
}

}  // namespace
}  // namespace marrow::stabilization
