#include "stabilization/models/similarity.h"

#include <gtest/gtest.h>

namespace marrow::stabilization {
namespace {

std::vector<point2> moved(const similarity& motion, const std::vector<point2>& points) {
  std::vector<point2> result;
  for (const point2 p : points) result.push_back(transform(motion, p));
  return result;
}

TEST(FitSimilarityPairs, ExactMotionIsRecovered) {
  const std::vector<point2> source = {{900, 500}, {910, 500}, {900, 510}, {911, 512}};
  for (const similarity motion : {similarity{1.2, 0.1, 3, -4}, similarity{0.5, -3.0, -700, 90}}) {
    const similarity fit = fit_similarity_pairs(source, moved(motion, source));
    for (const point2 p : source) {
      EXPECT_NEAR(transform(fit, p).x, transform(motion, p).x, 1e-7);
      EXPECT_NEAR(transform(fit, p).y, transform(motion, p).y, 1e-7);
    }
    EXPECT_NEAR(fit.scale, motion.scale, 1e-9);
    EXPECT_NEAR(fit.angle, motion.angle, 1e-9);
  }
}

TEST(FitSimilarityPairs, NoisyPairsGiveTheLeastSquaresMotion) {
  const std::vector<point2> source = {{0, 0}, {4, 0}, {0, 2}, {5, 7}, {-3, 1}};
  const std::vector<point2> target = {{1, 1}, {1.2, 5}, {-1.5, 1}, {-6, 6.5}, {0, -2}};
  const auto cost = [&](const similarity& m) {
    double sum = 0;
    for (std::size_t i = 0; i < source.size(); ++i) {
      const point2 p = transform(m, source[i]);
      sum += (p.x - target[i].x) * (p.x - target[i].x) + (p.y - target[i].y) * (p.y - target[i].y);
    }
    return sum;
  };
  const similarity fit = fit_similarity_pairs(source, target);
  for (const double h : {1e-3, -1e-3}) {
    EXPECT_LT(cost(fit), cost({fit.scale + h, fit.angle, fit.tx, fit.ty}));
    EXPECT_LT(cost(fit), cost({fit.scale, fit.angle + h, fit.tx, fit.ty}));
    EXPECT_LT(cost(fit), cost({fit.scale, fit.angle, fit.tx + h, fit.ty}));
    EXPECT_LT(cost(fit), cost({fit.scale, fit.angle, fit.tx, fit.ty + h}));
  }
}

TEST(FitSimilarityPairs, TooFewOrCoincidentPairsGiveTheIdentity) {
  const std::vector<point2> one = {{3, 4}};
  const std::vector<point2> same = {{1900.1, 1000.3}, {1900.1, 1000.3}, {1900.1, 1000.3}};
  for (const auto& source : {std::vector<point2>{}, one, same}) {
    const similarity fit = fit_similarity_pairs(source, moved({2, 1, 5, 6}, source));
    EXPECT_EQ(fit.scale, 1.0);
    EXPECT_EQ(fit.angle, 0.0);
    EXPECT_EQ(fit.tx, 0.0);
    EXPECT_EQ(fit.ty, 0.0);
  }
  const std::vector<point2> two = {{0, 0}, {2, 0}};
  EXPECT_NEAR(fit_similarity_pairs(two, {{1, 1}, {1, 5}}).scale, 2.0, 1e-12);
}

}  // namespace
}  // namespace marrow::stabilization
