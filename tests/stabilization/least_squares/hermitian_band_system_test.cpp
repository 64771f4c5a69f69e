#include "stabilization/least_squares/hermitian_band_system.h"

#include <gtest/gtest.h>

#include <algorithm>
#include <cmath>
#include <complex>
#include <limits>
#include <random>
#include <vector>

#include "tests/support/each_instruction_set.h"

namespace marrow::stabilization {
namespace {

using Complex = std::complex<double>;

// Fills in a band matrix whose diagonal outweighs the rest of its row; returns the solution.
std::vector<Complex> fill_in(hermitian_band_system& system, std::size_t n, std::size_t band) {
  std::mt19937 random(static_cast<unsigned>(100 * n + band));
  std::uniform_real_distribution<double> unit(-1, 1);
  const auto next = [&] { return Complex{unit(random), unit(random)}; };
  std::vector<Complex> expected(n), right(n);
  std::ranges::generate(expected, next);
  system.clear();
  for (std::size_t j = 0; j < n; ++j) {
    for (std::size_t i = j; i < std::min(n, j + band + 1); ++i) {
      const Complex a = i == j ? 3.0 * static_cast<double>(band) + 1 + unit(random) : next();
      system.set(i, j, a.real(), a.imag());
      right[i] += a * expected[j];
      if (i > j) right[j] += std::conj(a) * expected[i];
    }
  }
  for (std::size_t j = 0; j < n; ++j) system.set_right(j, right[j].real(), right[j].imag());
  return expected;
}

TEST(HermitianBandSystem, FindsTheSolutionWhateverTheSizes) {
  tests::OnEachInstructionSet([] {
    const std::size_t sizes[][2] = {{1, 0},  {5, 4},  {7, 0},    {8, 1}, {16, 8},
                                    {17, 7}, {30, 3}, {130, 37}, {9, 30}};
    for (const auto& [n, band] : sizes) {
      hermitian_band_system system(n, band);
      for (int turn = 0; turn < 2; ++turn) {  // nothing of the first may be left
        const std::vector<Complex> expected = fill_in(system, n, band);
        ASSERT_TRUE(system.solve());
        for (std::size_t i = 0; i < n; ++i) {
          const Complex found(system.solution_re(i), system.solution_im(i));
          EXPECT_LT(std::abs(found - expected[i]), 1e-13) << n << " " << band;
        }
      }
    }
  });
}

TEST(HermitianBandSystem, RefusesWhatIsNotPositiveDefinite) {
  constexpr double kInfinite = std::numeric_limits<double>::infinity();
  hermitian_band_system system(29, 5);
  for (const std::size_t at : {0u, 13u, 28u}) {
    for (const double pivot : {0.0, -3.0, std::nan(""), kInfinite}) {
      fill_in(system, 29, 5);
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
  fill_in(system, 29, 5);
  EXPECT_TRUE(system.solve());
}

}  // namespace
}  // namespace marrow::stabilization
