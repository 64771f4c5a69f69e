#pragma once

#include <cstddef>
#include <vector>

namespace calmframe::host {

// A row of a band matrix: coefficients of neighbouring unknowns, from `first` on, which its
// programme has from `place` on. Most rows are short, and there are some thirty a frame.
struct BandRow {
  static constexpr int kMost = 16;
  int first = 0, count = 0;
  std::size_t place = 0;
};

// Minimise  linear' z + tether/2 |z|^2 + sum_i weight_i |(row_i z) - target_i|
// subject to  row_j z <= limit_j.
struct BandProgramme {
  struct Charge {
    BandRow row;
    double target = 0, weight = 1;  // above 0
  };
  struct Limit {
    BandRow row;
    double limit = 0;
  };
  int unknowns = 0;
  std::vector<double> linear;  // one an unknown
  double tether = 0;           // keeps what nothing else decides near 0
  std::vector<Charge> charges;
  std::vector<Limit> limits;
  std::vector<double> coefficients;  // of all rows

  // Of zeros.
  BandRow AddRow(int first, int count) {
    const std::size_t place = coefficients.size();
    coefficients.resize(place + static_cast<std::size_t>(count));
    return {first, count, place};
  }
  double* Of(const BandRow& row) { return coefficients.data() + row.place; }
  const double* Of(const BandRow& row) const { return coefficients.data() + row.place; }
};

// A primal-dual interior point method with Mehrotra's predictor and corrector (Nocedal and Wright,
// Numerical Optimization, 2nd ed., ch. 14 and 16.6); each step is a band Cholesky factorization.
// `start`: any values, best within the limits. The result may pass a limit by 1e-6 of the unit.
// Throws std::bad_alloc.
std::vector<double> Solve(const BandProgramme& programme, std::vector<double> start);

}  // namespace calmframe::host
