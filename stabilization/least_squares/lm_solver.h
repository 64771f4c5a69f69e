#pragma once

#include <algorithm>
#include <cmath>
#include <cstdint>
#include <limits>
#include <type_traits>
#include <vector>

namespace marrow::stabilization {

// The text of a status code of lm_solver. Codes of 10 and above are failures.
inline const char* lm_status_text(std::int64_t code) {
  static const char* const texts[] = {
      "initial value",
      "fabs(actred)<=ftol && prered<=ftol && 0.5*ratio<=1. Both actual and predicted relative "
      "reductions in the sum of squares are at most ftol",
      "delta<=xtol*xnorm. Relative error between two consecutive iterations is at most xtol",
      "info==1 && info==2. Conditions for info = 1 and info = 2 both hold",
      "gnorm<gtol. The cosine of the angle between fvec and any column of the jacobian is at most "
      "gtol in absolute value",
      "nfev>=maxfev. The umber of calls to fcn with iflag = 1 has reached maxfev",
      "fabs(actred)<=epsmch && prered<=epsmch && 0.5*ratio<=1. ftol is too small. no further "
      "reduction in the sum of squares is possible",
      "delta<=epsmch*xnorm. xtol is too small. no further improvement in the approximate solution "
      "x is possible",
      "gnorm<=epsmch. gtol is too small. fvec is orthogonal to the columns of the jacobian to "
      "machine precision",
      "max_iter!=0 && iter>=max_iter. The number of iterations hits the maximum",
      "user error in compute_cost()",
      "user error in compute_sparse_jacobian()",
      "user error in update_unknown()",
      "user error in monitor_progress()",
      "n>m",
      "m==0 || n==0",
      "user error in j_norm()",
      "user error in jtf()",
      "user error in jtj_quadratic()",
      "user error in update_pinv_jtj_diag()",
      "user error in pinv_jtj_x()",
      "user error in j_fullrank()",
      "user error in pinv_jtj_quadratic()",
      "user error in report_initial_residual()",
      "user error in report_iteration_residual()",
      "user error in report_final_residual()",
      "monitor_progress() returns false"};
  constexpr std::int64_t count = sizeof(texts) / sizeof(texts[0]);
  return code >= 0 && code < count ? texts[code] : "unknown error code";
}

// Levenberg-Marquardt with a trust region (More, The Levenberg-Marquardt algorithm: implementation
// and theory, 1978; the tests and constants of MINPACK's lmder and lmpar), written against
// operations of a problem: J is never seen here, only products with it and solutions of
// (J'J + D) x = b, D = par diag^2. Minimises |f(x)|^2 over n unknowns and m residuals.
//
// Problem has (arrays of n unknowns x, g, d, v, p; of m residuals f):
//   bool user_error                   set by an operation that failed; looked at after each call
//   compute_cost(x, f)                residuals at x
//   compute_sparse_jacobian(x, f)     recompute and keep J at x
//   update_unknown(x, step, x_new)    x_new = x + step
//   bool monitor_progress(iter, x, f) once an outer iteration; false stops with code 26
//   j_norm(norms)                     Euclidean norm of each column of J
//   jtf(f, g)                         g = J'f
//   Real jtj_quadratic(p)             p'J'Jp
//   update_pinv_jtj_diag(d)           take d as D and refactorize
//   pinv_jtj_x(b, x)                  x = (J'J + D)+ b; x may be b
//   bool j_fullrank()                 of the last pinv_jtj_x
//   Real pinv_jtj_quadratic(v)        v'(J'J + D)+ v
//   report_initial_residual(sum_of_squares, residuals), report_iteration_residual(...),
//   report_final_residual(...)
// One solver serves one run. Exceptions of the problem and of the progress check pass through.
template <class Real>
class lm_solver {
 public:
  lm_solver(std::int64_t residuals, std::int64_t unknowns)
      : maxfev(400 * unknowns),
        m(residuals),
        n(unknowns),
        work(residuals >= unknowns ? static_cast<std::size_t>(2 * residuals + 5 * unknowns) : 0) {}

  Real xtol = Real(1e-8);   // relative step
  Real ftol = Real(1e-10);  // relative reduction
  Real gtol = Real(1e-5);   // cosine between f and J's columns
  std::int64_t maxfev;      // cost evaluations
  std::int64_t nfev = 0;
  std::int64_t njev = 0;
  std::int64_t iter = 0;  // accepted steps
  std::int64_t info = 0;
  std::int64_t m;
  std::int64_t n;
  std::vector<Real> work;

  const char* status_text() const { return lm_status_text(info); }
  bool failed() const { return info >= 10; }

  // x: start on entry, the best found on return; f: m numbers, the residuals at x. max_iter:
  // accepted steps, 0 for no limit. progress() is called once an outer iteration and once a step
  // computation; it may throw, and where it returns a bool false ends the run with code 30.
  template <class Problem, class Progress>
  std::int64_t solve(Problem& problem, Real* x, Real* f, std::int64_t max_iter,
                     Progress&& progress) {
    if (m == 0 || n == 0) return info = 15;
    if (n > m) return info = 14;
    iterate(problem, x, f, max_iter, progress);
    const bool user_error = problem.user_error;
    if (!user_error && info != kUserErrorInCost) {
      problem.report_final_residual(squared_norm(f, m), m / 2);
      if (problem.user_error) info = 25;
    }
    return info;
  }

 private:
  static constexpr Real kFactor = Real(100);
  static constexpr Real kEpsilon = std::numeric_limits<Real>::epsilon();
  static constexpr Real kDwarf = std::numeric_limits<Real>::min();
  static constexpr std::int64_t kUserErrorInCost = 10;

  static Real squared_norm(const Real* v, std::int64_t count) {
    Real sum = 0;
    for (std::int64_t i = 0; i < count; ++i) sum += v[i] * v[i];
    return sum;
  }
  static Real norm(const Real* v, std::int64_t count) { return std::sqrt(squared_norm(v, count)); }
  static Real scaled_norm(const Real* scale, const Real* v, std::int64_t count) {
    Real sum = 0;
    for (std::int64_t i = 0; i < count; ++i) sum += scale[i] * v[i] * (scale[i] * v[i]);
    return std::sqrt(sum);
  }
  static Real dot(const Real* a, const Real* b, std::int64_t count) {
    Real sum = 0;
    for (std::int64_t i = 0; i < count; ++i) sum += a[i] * b[i];
    return sum;
  }

  // True, with the code set, where the operation just called failed.
  template <class Problem>
  bool stopped(const Problem& problem, std::int64_t code) {
    if (problem.user_error) info = code;
    return problem.user_error;
  }

  template <class Progress>
  bool go_on(Progress& progress) {
    if constexpr (std::is_void_v<decltype(progress())>) {
      progress();
      return true;
    } else {
      if (progress()) return true;
      info = 30;
      return false;
    }
  }

  template <class Problem, class Progress>
  void iterate(Problem& problem, Real* x, Real* f, std::int64_t max_iter, Progress& progress) {
    Real* const diag = work.data();
    Real* const qtf = diag + n;
    Real* const step = qtf + n;
    Real* const wa2 = step + n;  // column norms; lmpar's scratch once they are used
    Real* const trial = wa2 + n;
    Real* const wa4 = trial + n;

    problem.compute_cost(x, f);
    ++nfev;
    if (stopped(problem, 10)) return;
    Real fnorm = norm(f, m);
    if (!std::isfinite(fnorm)) {
      info = kUserErrorInCost;
      return;
    }
    problem.report_initial_residual(fnorm * fnorm, m / 2);
    if (stopped(problem, 23)) return;

    Real par = 0;
    Real delta = 0;
    Real xnorm = 0;
    for (bool first = true;; first = false) {
      if (!go_on(progress)) return;
      const bool monitored = problem.monitor_progress(iter, x, f);
      if (stopped(problem, 13)) return;
      if (!monitored) {
        info = 26;
        return;
      }
      problem.compute_sparse_jacobian(x, f);
      ++njev;
      if (stopped(problem, 11)) return;
      problem.j_norm(wa2);
      if (stopped(problem, 16)) return;
      if (first) {
        for (std::int64_t j = 0; j < n; ++j) diag[j] = wa2[j] != 0 ? wa2[j] : Real(1);
        xnorm = scaled_norm(diag, x, n);
        delta = kFactor * xnorm;
        if (delta == 0) delta = kFactor;
      }
      problem.jtf(f, qtf);
      if (stopped(problem, 17)) return;
      Real gnorm = 0;
      if (fnorm != 0) {
        // A zero column gives a quotient that is not a number; the comparison passes it over.
        for (std::int64_t j = 0; j < n; ++j) {
          const Real cosine = std::fabs(qtf[j] / (fnorm * wa2[j]));
          if (cosine > gnorm) gnorm = cosine;
        }
      }
      if (gtol > gnorm) {
        info = 4;
        return;
      }
      for (std::int64_t j = 0; j < n; ++j) diag[j] = std::max(diag[j], wa2[j]);

      bool limit_first_step = first;
      for (Real ratio = 0; !(ratio >= Real(0.0001)); limit_first_step = false) {
        if (!lmpar(problem, diag, qtf, delta, par, step, wa2, wa4 + m, progress)) return;
        for (std::int64_t j = 0; j < n; ++j) step[j] = -step[j];
        problem.update_unknown(x, step, trial);
        if (stopped(problem, 12)) return;
        const Real pnorm = scaled_norm(diag, step, n);
        if (limit_first_step) delta = std::min(delta, pnorm);

        problem.compute_cost(trial, wa4);
        ++nfev;
        if (stopped(problem, 10)) return;
        const Real fnorm1 = norm(wa4, m);
        if (!std::isfinite(fnorm1)) {
          // It could neither be accepted nor shrink delta sensibly.
          info = kUserErrorInCost;
          return;
        }

        Real actred = -1;
        if (fnorm1 / 10 < fnorm) actred = 1 - (fnorm1 / fnorm) * (fnorm1 / fnorm);
        const Real quadratic = problem.jtj_quadratic(step);
        if (stopped(problem, 18)) return;
        const Real temp1 = quadratic / (fnorm * fnorm);
        const Real temp2 = par * pnorm * pnorm / (fnorm * fnorm);
        const Real prered = temp1 + 2 * temp2;
        const Real dirder = -(temp1 + temp2);
        ratio = prered != 0 ? actred / prered : Real(0);

        if (ratio > Real(0.25)) {
          if (par == 0 || ratio >= Real(0.75)) {
            delta = 2 * pnorm;
            par *= Real(0.5);
          }
        } else {
          Real temp = actred >= 0 ? Real(0.5) : dirder / (2 * dirder + actred);
          if (fnorm1 / 10 >= fnorm || !(temp >= Real(0.1))) temp = Real(0.1);
          delta = temp * std::min(delta, pnorm * 10);
          par /= temp;
        }

        if (ratio >= Real(0.0001)) {
          std::copy(trial, trial + n, x);
          std::copy(wa4, wa4 + m, f);
          xnorm = scaled_norm(diag, x, n);
          fnorm = fnorm1;
          ++iter;
          problem.report_iteration_residual(fnorm * fnorm, m / 2);
          if (stopped(problem, 24)) return;
        }

        const bool reduced = std::fabs(actred) <= ftol && prered <= ftol && ratio / 2 <= 1;
        const bool small_step = delta <= xtol * xnorm;
        if (reduced) info = 1;
        if (small_step) info = reduced ? 3 : 2;
        if (info != 0) return;
        if (nfev >= maxfev) info = 5;
        if (std::fabs(actred) <= kEpsilon && prered <= kEpsilon && ratio / 2 <= 1) info = 6;
        if (delta <= kEpsilon * xnorm) info = 7;
        if (gnorm <= kEpsilon) info = 8;
        if (max_iter != 0 && iter >= max_iter) info = 9;
        if (info != 0) return;
      }
    }
  }

  // The parameter par and p = (J'J + par diag^2)+ qtf with |diag p| within a tenth of delta, or par
  // 0 where the undamped step is short enough. False where the run ends. wa, wa2: scratch of n.
  template <class Problem, class Progress>
  bool lmpar(Problem& problem, const Real* diag, const Real* qtf, Real delta, Real& par, Real* p,
             Real* wa2, Real* wa, Progress& progress) {
    std::fill(wa, wa + n, Real(0));
    problem.update_pinv_jtj_diag(wa);
    if (stopped(problem, 19)) return false;
    problem.pinv_jtj_x(qtf, p);
    if (stopped(problem, 20)) return false;
    if (!go_on(progress)) return false;
    Real dxnorm = scaled_norm(diag, p, n);
    Real fp = dxnorm - delta;
    if (fp <= Real(0.1) * delta) {
      par = 0;
      return true;
    }

    Real parl = 0;
    const bool full_rank = problem.j_fullrank();
    if (stopped(problem, 21)) return false;
    if (full_rank) {
      for (std::int64_t j = 0; j < n; ++j) wa[j] = diag[j] * diag[j] * p[j];
      const Real quadratic = problem.pinv_jtj_quadratic(wa);
      if (stopped(problem, 22)) return false;
      parl = fp / delta / (quadratic / (dxnorm * dxnorm));
    }
    Real gnorm = 0;
    for (std::int64_t j = 0; j < n; ++j) gnorm += (qtf[j] / diag[j]) * (qtf[j] / diag[j]);
    gnorm = std::sqrt(gnorm);
    Real paru = gnorm / delta;
    if (paru == 0) paru = kDwarf / std::min(delta, Real(0.1));
    par = std::min(std::max(par, parl), paru);
    if (par == 0) par = gnorm / dxnorm;

    for (int count = 1;; ++count) {
      if (par == 0) par = std::max(kDwarf, Real(0.001) * paru);
      for (std::int64_t j = 0; j < n; ++j) wa[j] = par * diag[j] * diag[j];
      problem.update_pinv_jtj_diag(wa);
      if (stopped(problem, 19)) return false;
      problem.pinv_jtj_x(qtf, p);
      if (stopped(problem, 20)) return false;
      dxnorm = scaled_norm(diag, p, n);
      const Real fp_old = fp;
      fp = dxnorm - delta;
      if (count == 10 || std::fabs(fp) <= Real(0.1) * delta ||
          (parl == 0 && fp <= fp_old && fp_old < 0)) {
        return true;
      }
      for (std::int64_t j = 0; j < n; ++j) wa[j] = diag[j] * diag[j] * p[j];
      std::copy(wa, wa + n, wa2);
      problem.pinv_jtj_x(wa, wa);
      if (stopped(problem, 20)) return false;
      const Real parc = fp / delta / (dot(wa, wa2, n) / (dxnorm * dxnorm));
      if (fp > 0) parl = std::max(parl, par);
      if (fp < 0) paru = std::min(paru, par);
      par = std::max(parl, par + parc);
    }
  }
};

}  // namespace marrow::stabilization
