#include "stabilization/least_squares/hermitian_band_system.h"

#include <gtest/gtest.h>

#include <algorithm>
#include <cmath>
#include <complex>
#include <limits>
#include <random>
#include <utility>
#include <vector>

#include "tests/support/each_instruction_set.h"

namespace marrow::stabilization {
namespace {

using Complex = std::complex<double>;

// A band matrix whose diagonal outweighs the rest of its row, and a solution to be found again.
struct Problem {
  Problem(std::size_t unknowns, std::size_t band)
      : n(unknowns), half_bandwidth(band), lower(n * n), expected(n), right(n) {
    std::mt19937 random(static_cast<unsigned>(100 * n + band));
    std::uniform_real_distribution<double> unit(-1, 1);
    for (std::size_t j = 0; j < n; ++j) {
      expected[j] = {unit(random), unit(random)};
      lower[j * n + j] = 3.0 * static_cast<double>(band) + 1 + unit(random);
      for (std::size_t i = j + 1; i < std::min(n, j + band + 1); ++i) {
        lower[i * n + j] = {unit(random), unit(random)};
      }
    }
    for (std::size_t i = 0; i < n; ++i) {
      for (std::size_t j = 0; j < n; ++j) {
        right[i] += (i >= j ? lower[i * n + j] : std::conj(lower[j * n + i])) * expected[j];
      }
    }
  }

  void FillIn(hermitian_band_system& system) const {
    system.clear();
    for (std::size_t j = 0; j < n; ++j) {
      system.set_right(j, right[j].real(), right[j].imag());
      for (std::size_t i = j; i < std::min(n, j + half_bandwidth + 1); ++i) {
        system.set(i, j, lower[i * n + j].real(), lower[i * n + j].imag());
      }
    }
  }

  std::size_t n, half_bandwidth;
  std::vector<Complex> lower, expected, right;
};

TEST(HermitianBandSystem, FindsTheSolutionWhateverTheSizes) {
  tests::OnEachInstructionSet([] {
    const std::size_t sizes[][2] = {{1, 0},  {5, 4},  {7, 0},    {8, 1}, {16, 8},
                                    {17, 7}, {30, 3}, {130, 37}, {9, 30}};
    for (const auto& [n, band] : sizes) {
      const Problem problem(n, band);
      hermitian_band_system system(n, band);
      for (int turn = 0; turn < 2; ++turn) {  // nothing of the first may be left
        problem.FillIn(system);
        ASSERT_TRUE(system.solve());
        for (std::size_t i = 0; i < n; ++i) {
          const Complex found(system.solution_re(i), system.solution_im(i));
          EXPECT_LT(std::abs(found - problem.expected[i]), 1e-13) << n << " " << band;
        }
      }
    }
  });
}

TEST(HermitianBandSystem, RefusesWhatIsNotPositiveDefinite) {
  constexpr double kInfinite = std::numeric_limits<double>::infinity();
  const Problem problem(29, 5);
  hermitian_band_system system(29, 5);
  for (const std::size_t at : {0u, 13u, 28u}) {
    for (const double pivot : {0.0, -3.0, std::nan(""), kInfinite}) {
      problem.FillIn(system);
      system.set(at, at, pivot, 0);
      EXPECT_FALSE(system.solve()) << at << " " << pivot;
    }
  }
  // Coupled as strongly as it is weighted: [[1, i], [-i, 1]] has the eigenvalue 0.
  hermitian_band_system pair(2, 1);
  pair.set(0, 0, 1, 0);
  pair.set(1, 1, 1, 0);
  pair.set(1, 0, 0, -1);
  EXPECT_FALSE(pair.solve());
  problem.FillIn(system);
  EXPECT_TRUE(system.solve());
}

}  // namespace
}  // namespace marrow::stabilization
