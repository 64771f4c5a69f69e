#include "analysis/src/rational_time.h"

#include <gtest/gtest.h>

#include <limits>
#include <stdexcept>

namespace kelp::analysis {
namespace {

constexpr std::int64_t kMax = std::numeric_limits<std::int64_t>::max();
constexpr std::int64_t kMin = std::numeric_limits<std::int64_t>::min();

TEST(RationalTime, ComparesByValueWhereCrossProductsOverflow) {
  EXPECT_EQ(Compare({1001, 30000}, {2002, 60000}), 0);
  EXPECT_FALSE(IdenticalTimes({1001, 30000}, {2002, 60000}));
  EXPECT_EQ(Compare({kMax, kMax - 1}, {kMax, kMax - 1}), 0);
  // k / (k - 1) falls with k.
  EXPECT_LT(Compare({kMax, kMax - 1}, {kMax - 1, kMax - 2}), 0);
  EXPECT_GT(Compare({kMax - 1, kMax}, {kMax - 2, kMax - 1}), 0);
  EXPECT_LT(Compare({kMin, 1}, {kMax, 1}), 0);
  EXPECT_LT(Compare({kMin, 1}, {kMin, 2}), 0);
  EXPECT_GT(Compare({-1, kMax}, {-1, kMax - 1}), 0);
}

TEST(RationalTime, AgreesWithCrossProductsOnAllSmallFractions) {
  for (int a = -7; a <= 7; ++a) {
    for (int b = 1; b <= 7; ++b) {
      for (int c = -7; c <= 7; ++c) {
        for (int d = 1; d <= 7; ++d) {
          const int sign = (a * d > c * b) - (a * d < c * b);
          ASSERT_EQ(Compare({a, b}, {c, d}), sign) << a << '/' << b << ' ' << c << '/' << d;
          // a/b + c/d against twice c/d
          ASSERT_EQ(CompareSums({a, b}, {c, d}, {c, d}, {c, d}), sign);
        }
      }
    }
  }
}

TEST(RationalTime, ArithmeticReducesAndRefusesWhatHasNoForm) {
  EXPECT_TRUE(IdenticalTimes(Reduced(23543520, 705600000), {1001, 30000}));
  EXPECT_TRUE(IdenticalTimes(RationalTime{1001, 30000} * 30, {1001, 1000}));
  EXPECT_TRUE(IdenticalTimes(RationalTime{1001, 30000} / 2, {1001, 60000}));
  EXPECT_TRUE(IdenticalTimes(RationalTime{1, 6} + RationalTime{1, 3}, {1, 2}));
  EXPECT_TRUE(IdenticalTimes(RationalTime{5, 7} * 0, {0, 1}));
  EXPECT_THROW(RationalTime({kMax, 1}) * 2, std::overflow_error);
  EXPECT_THROW(RationalTime({1, kMax}) + RationalTime({1, kMax - 1}), std::overflow_error);
  EXPECT_THROW(Compare({1, 0}, {1, 2}), std::domain_error);
  EXPECT_THROW(Reduced(1, -1), std::domain_error);
}

TEST(RationalTime, StepsRoundTowardsBothSides) {
  const RationalTime step{1001, 30000};
  EXPECT_EQ(FloorSteps(step * 10, step), 10);
  EXPECT_EQ(CeilSteps(step * 10, step), 10);
  EXPECT_EQ(FloorSteps({1, 3}, step), 9);  // 9.99
  EXPECT_EQ(CeilSteps({1, 3}, step), 10);
  EXPECT_EQ(FloorSteps({-1, 3}, step), -10);
  EXPECT_EQ(CeilSteps({-1, 3}, step), -9);
  EXPECT_THROW(FloorSteps({1, 3}, {0, 1}), std::domain_error);
}

}  // namespace
}  // namespace kelp::analysis
