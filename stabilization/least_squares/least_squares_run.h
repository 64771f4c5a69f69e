#pragma once

#include <stdexcept>

#include "platform/tessel/debug.h"
#include "stabilization/least_squares/lm_solver.h"
#include "stabilization/progress.h"

namespace marrow::stabilization {

// A linear solve beneath a problem failed. The run that meets it counts as failed; it does not end
// the clip's solve.
struct lapack_failure : std::runtime_error {
  using std::runtime_error::runtime_error;
};

// One run of lm_solver on x (problem.unknown_count() numbers), at most max_iter accepted steps,
// with its log lines. True unless it failed; what `progress` throws passes through. A problem whose
// construction failed is not run.
template <class Problem>
bool run_least_squares(Problem& problem, std::vector<double>& x, std::int64_t max_iter,
                       const progress_functor& progress, bool counts_end_the_line) {
  if (problem.failed) return false;
  const auto check = [&progress] {
    if (progress) progress();
  };
  try {
    lm_solver<double> solver(problem.residual_count(), problem.unknown_count());
    std::vector<double> residuals(static_cast<std::size_t>(problem.residual_count()));
    solver.solve(problem, x.data(), residuals.data(), max_iter, check);
    tessel::debug::Log(counts_end_the_line
                           ? "%d iterations, %d function evaluations, %d jacobian evaluations.\n"
                           : "%d iterations, %d function evaluations, %d jacobian evaluations",
                       static_cast<int>(solver.iter), static_cast<int>(solver.nfev),
                       static_cast<int>(solver.njev));
    tessel::debug::Log("%s\n", solver.status_text());
    problem.failed = solver.failed();
  } catch (const lapack_failure&) {
    problem.failed = true;
  }
  return !problem.failed;
}

}  // namespace marrow::stabilization
