#include "platform/dss/dss.h"

#include <gtest/gtest.h>

#include <cmath>
#include <limits>
#include <numeric>
#include <random>
#include <vector>

namespace {

// A symmetric matrix as the solver takes it, kept dense beside it for the reference.
struct System {
  int n;
  std::vector<DssInt> starts, columns;
  std::vector<double> values, dense;
};

// Random band matrix, made positive definite by its diagonal.
System RandomSystem(int n, int band, unsigned seed) {
  std::mt19937 random(seed);
  std::uniform_real_distribution<double> entry(-1, 1);
  System s{n, {1}, {}, {}, std::vector<double>(static_cast<size_t>(n * n))};
  for (int r = 0; r < n; ++r) {
    for (int c = r; c < std::min(n, r + band + 1); ++c) {
      const double value = c == r ? 2.0 * band + 1 : entry(random);
      s.columns.push_back(c + 1);
      s.values.push_back(value);
      s.dense[r * n + c] = s.dense[c * n + r] = value;
    }
    s.starts.push_back(static_cast<DssInt>(s.columns.size()) + 1);
  }
  return s;
}

class DssTest : public ::testing::Test {
 protected:
  void Define(const System& s) {
    ASSERT_EQ(dss_create(handle_, MKL_DSS_DEFAULTS), 0);
    ASSERT_EQ(dss_define_structure(handle_, MKL_DSS_SYMMETRIC, s.starts.data(), s.n, s.n,
                                   s.columns.data(), static_cast<DssInt>(s.columns.size())),
              0);
    ASSERT_EQ(dss_reorder(handle_, MKL_DSS_DEFAULTS, nullptr), 0);
  }
  DssInt Factor(const std::vector<double>& values) {
    return dss_factor_real(handle_, MKL_DSS_POSITIVE_DEFINITE, values.data());
  }
  ~DssTest() override { dss_delete(handle_, MKL_DSS_DEFAULTS); }
  DssHandle handle_ = nullptr;
};

TEST_F(DssTest, OneStructureServesManyFactorizations) {
  System s = RandomSystem(60, 7, 1);
  Define(s);
  for (const double scale : {1.0, 3.0}) {
    for (double& v : s.values) v *= scale;
    for (double& v : s.dense) v *= scale;
    ASSERT_EQ(Factor(s.values), 0);
    std::vector<double> b(2 * 60), x(2 * 60);
    for (int i = 0; i < 120; ++i) b[i] = std::sin(i);
    ASSERT_EQ(dss_solve_real(handle_, MKL_DSS_DEFAULTS, b.data(), 2, x.data()), 0);
    for (int i = 0; i < 120; ++i) {
      const double* of = &x[i / 60 * 60];
      EXPECT_NEAR(std::inner_product(of, of + 60, &s.dense[i % 60 * 60], 0.0), b[i], 1e-12);
    }
  }
}

TEST_F(DssTest, NotPositiveDefiniteIsAFailureAndTheHandleStaysUsable) {
  System s = RandomSystem(40, 3, 2);
  Define(s);
  for (const double bad : {0.0, -5.0, std::numeric_limits<double>::quiet_NaN()}) {
    std::vector<double> values = s.values;
    values[s.starts[20] - 1] = bad;
    EXPECT_EQ(Factor(values), MKL_DSS_NOT_POSITIVE_DEFINITE) << bad;
    std::vector<double> b(40, 1.0), x(40);
    EXPECT_EQ(dss_solve_real(handle_, MKL_DSS_DEFAULTS, b.data(), 1, x.data()), MKL_DSS_STATE_ERR);
  }
  EXPECT_EQ(Factor(s.values), 0);
}

TEST_F(DssTest, CallsOutOfOrderAndBadStructuresAreRefused) {
  EXPECT_EQ(dss_reorder(handle_, MKL_DSS_DEFAULTS, nullptr), MKL_DSS_STATE_ERR);
  ASSERT_EQ(dss_create(handle_, MKL_DSS_DEFAULTS), 0);
  EXPECT_EQ(Factor({1.0}), MKL_DSS_STATE_ERR);
  const DssInt starts[] = {1, 2, 3};
  const DssInt no_diagonal[] = {2, 2};
  EXPECT_EQ(dss_define_structure(handle_, MKL_DSS_SYMMETRIC, starts, 2, 2, no_diagonal, 2),
            MKL_DSS_STRUCTURE_ERR);
  const DssInt outside[] = {1, 3};
  EXPECT_EQ(dss_define_structure(handle_, MKL_DSS_SYMMETRIC, starts, 2, 2, outside, 2),
            MKL_DSS_STRUCTURE_ERR);
}

}  // namespace
