#include "platform/dss/dss.h"

#include <gtest/gtest.h>

#include <limits>
#include <vector>

namespace {

// | 10 1 2 3 |
// |  1 5 0 0 |
// |  2 0 6 0 |
// |  3 0 0 7 |: its upper triangle by rows. The first column is best eliminated last.
const std::vector<DssInt> kStarts = {1, 5, 6, 7, 8}, kColumns = {1, 2, 3, 4, 2, 3, 4};
const std::vector<double> kValues = {10, 1, 2, 3, 5, 6, 7};

class DssTest : public ::testing::Test {
 protected:
  DssTest() { EXPECT_EQ(dss_create(handle_, MKL_DSS_DEFAULTS), 0); }
  ~DssTest() override { dss_delete(handle_, MKL_DSS_DEFAULTS); }
  DssInt Define(const std::vector<DssInt>& columns) {
    return dss_define_structure(handle_, MKL_DSS_SYMMETRIC, kStarts.data(), 4, 4, columns.data(),
                                7);
  }
  DssInt Reorder() { return dss_reorder(handle_, MKL_DSS_DEFAULTS, nullptr); }
  DssInt Factor(const std::vector<double>& values) {
    return dss_factor_real(handle_, MKL_DSS_POSITIVE_DEFINITE, values.data());
  }
  DssInt Solve(const std::vector<double>& b, std::vector<double>* x) {
    x->resize(b.size());
    return dss_solve_real(handle_, MKL_DSS_DEFAULTS, b.data(), static_cast<DssInt>(b.size() / 4),
                          x->data());
  }
  DssHandle handle_ = nullptr;
  std::vector<double> x_;
};

TEST_F(DssTest, OneStructureServesManyFactorizations) {
  ASSERT_EQ(Define(kColumns), 0);
  ASSERT_EQ(Reorder(), 0);
  const double expected[] = {1, -2, 3, -1, 0, 1, 0, 2};
  for (const double scale : {1.0, 3.0}) {
    std::vector<double> values = kValues;
    for (double& v : values) v *= scale;
    ASSERT_EQ(Factor(values), 0);
    ASSERT_EQ(Solve({11, -9, 20, -4, 7, 5, 0, 14}, &x_), 0);
    for (int i = 0; i < 8; ++i) EXPECT_NEAR(x_[i], expected[i] / scale, 1e-15) << i;
  }
}

TEST_F(DssTest, NotPositiveDefiniteIsAFailureAndTheHandleStaysUsable) {
  ASSERT_EQ(Define(kColumns), 0);
  ASSERT_EQ(Reorder(), 0);
  for (const double bad : {0.0, -5.0, std::numeric_limits<double>::quiet_NaN()}) {
    std::vector<double> values = kValues;
    values[5] = bad;  // on the diagonal
    EXPECT_EQ(Factor(values), MKL_DSS_NOT_POSITIVE_DEFINITE) << bad;
    EXPECT_EQ(Solve({1, 1, 1, 1}, &x_), MKL_DSS_STATE_ERR);
  }
  EXPECT_EQ(Factor(kValues), 0);
}

TEST_F(DssTest, CallsOutOfOrderAndBadStructuresAreRefused) {
  EXPECT_EQ(Reorder(), MKL_DSS_STATE_ERR);
  EXPECT_EQ(Factor(kValues), MKL_DSS_STATE_ERR);
  EXPECT_EQ(Define({1, 2, 3, 4, 3, 3, 4}), MKL_DSS_STRUCTURE_ERR) << "no diagonal";
  EXPECT_EQ(Define({1, 2, 3, 5, 2, 3, 4}), MKL_DSS_STRUCTURE_ERR) << "outside";
  dss_delete(handle_, MKL_DSS_DEFAULTS);
  EXPECT_EQ(Reorder(), MKL_DSS_STATE_ERR);
}

}  // namespace
