#pragma once

#include <cstdint>
#include <vector>

#include "stabilization/stabilizer_global.h"

// What passes between the stages of a solve. Frames are half-open ranges [first, end), counted from
// 0.
namespace marrow::stabilization {

// The result of one factorization: over [first, end) the position of trajectory t on frame f is
// (C_x(t) . basis(f), C_y(t) . basis(f)) plus the centre (the track matrix approximated by one of
// low rank; Golub and Van Loan, Matrix Computations, 4th ed., 2.4).
struct factorization_window {
  std::uint64_t first = 0;
  std::uint64_t end = 0;
  std::uint64_t rank = 0;
  // Flags are kept for the trajectories [trajectories_begin, trajectories_begin + flag count)
  // alone: trajectories are ordered by start, so those that meet the window lie close together.
  // Outside it all are 0. A flag is 0, or 1 + the place of the trajectory's coefficients: it takes
  // part then.
  std::uint64_t trajectories_begin = 0;
  std::vector<std::int32_t> trajectory_flags;
  std::vector<double> coefficients;  // 2 x rank a place: rank for x, then rank for y
  // rank rows; column 0 is frame `first`, row stride end - first.
  std::vector<double> basis;
  // Up to overlap_end the window's start has solved positions to agree with: the rows of `output`
  // of [first, overlap_end) as they were before this window was solved.
  std::uint64_t overlap_end = 0;
  std::vector<track_sample> overlap_rows;

  bool takes_part(std::size_t trajectory) const {
    return trajectory >= trajectories_begin &&
           trajectory - trajectories_begin < trajectory_flags.size() &&
           trajectory_flags[trajectory - trajectories_begin] != 0;
  }
  // Of a trajectory that takes part.
  const double* coefficients_of(std::size_t trajectory) const {
    const auto place =
        static_cast<std::size_t>(trajectory_flags[trajectory - trajectories_begin] - 1);
    return &coefficients[2 * rank * place];
  }
};

// One stretch of frames that no factorization window covers, in ascending order of frames.
struct transition_record {
  enum kind_t : std::int32_t { unsolved = 0, solved = 1 };

  std::int32_t kind = unsolved;
  std::uint64_t first = 0;
  std::uint64_t end = 0;
  // Four numbers a frame: scale, angle (radians), tx, ty. A frame's stabilizing map takes (x, y) to
  // (scale (cos angle x - sin angle y) + tx, scale (cos angle y + sin angle x) + ty). Identity
  // where unsolved.
  std::vector<double> motion;
};

}  // namespace marrow::stabilization
