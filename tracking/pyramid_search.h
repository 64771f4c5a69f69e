#pragma once

#include <cstddef>

#include "tracking/affine_state.h"

namespace marrow::tracking {

// How far a search got.
struct search_result {
  int start_level = -1;  // of the attempt that succeeded, or -1
  // Correlation of the start level's template with the last sample on that level, if it was tested.
  float correlation = 0.0f;
  bool correlation_tested = false;

  bool found() const { return start_level >= 0; }
};

// A correlation limit that every window passes; none is computed then.
inline constexpr float kAnyCorrelation = -2.0f;

// Finds `state`, the motion of a template that has `start_levels` levels, from an initial guess in
// `state`, which stays as it was on failure. The finest level alone is tried first, then attempts
// that start one level coarser each and go down to the finest. An attempt ends when a level fails
// or does not converge, or when the correlation at its coarsest level is under `min_correlation`.
//
// Stage offers Solve(level, state) -> iteration of convergence, max_iterations or negative, with
// state's position and shift in pixels of the level; and Correlation(level) of that level's last
// sample.
template <class Stage>
search_result SearchPyramid(Stage& stage, std::size_t start_levels, float min_correlation,
                            int max_iterations, AffineState& state) {
  const auto scale_position = [](AffineState& s, float factor) {
    s.x *= factor;
    s.y *= factor;
    s.dx *= factor;
    s.dy *= factor;
  };
  for (std::size_t start = 0; start < start_levels; ++start) {
    search_result result;
    AffineState attempt = state;
    for (std::size_t l = 0; l < start; ++l) scale_position(attempt, 0.5f);
    for (std::size_t l = start;; --l) {
      const int iterations = stage.Solve(l, attempt);
      if (iterations < 0 || iterations == max_iterations) break;
      if (l == start && min_correlation > kAnyCorrelation) {
        result.correlation = stage.Correlation(l);
        result.correlation_tested = true;
        if (min_correlation > result.correlation) break;
      }
      if (l == 0) {
        state = attempt;
        result.start_level = static_cast<int>(start);
        return result;
      }
      scale_position(attempt, 2.0f);
    }
  }
  return {};
}

}  // namespace marrow::tracking
