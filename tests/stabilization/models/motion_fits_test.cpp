#include "stabilization/models/motion_fits.h"

#include <gtest/gtest.h>

#include <cmath>

#include "stabilization/models/similarity.h"
#include "tests/stabilization/clips.h"

namespace marrow::stabilization {
namespace {

TEST(SimilarityFitTest, WorkedLists) {
  const std::vector<Displacement> noisy = {displacement({0, 0}, {1, 1}, 1),
                                           displacement({4, 0}, {1, 5}, 1),
                                           displacement({0, 2}, {-1.5, 1}, 2)};
  expect_matrix_near(fitSimilarity(noisy), similarity_matrix(1.06433665, 1.51204050, 0.75, 0.875),
                     1e-7);
  // Mirrored targets are turned.
  const std::vector<Displacement> mirrored = {
      displacement({0, 0}, {0, 0}), displacement({4, 0}, {-4, 0}), displacement({0, 2}, {0, 2})};
  expect_matrix_near(fitSimilarity(mirrored), {-.6, .4, -.8, -.4, -.6, 1.6, 0, 0, 1}, 1e-7);
  const std::vector<Displacement> one_place(3, displacement({5, 6}, {8, 8}));
  expect_point_near(transform(fitSimilarity(one_place), {5, 6}), {8, 8}, 1e-12);
  const std::vector<Displacement> weightless(3, displacement({5, 6}, {8, 8}, 0));
  EXPECT_TRUE(std::isnan(fitSimilarity(weightless)[0]));
}

TEST(HomographyFitTest, WeightMultipliesTheRows) {
  // One source seen at two places, three exact anchors: at the doubled point the cost is
  // w1^2 (x - X1)^2 + w2^2 (x - X2)^2, up to the scale of its denominator, and 8 unknowns meet it.
  std::vector<Displacement> list = {displacement({0, 0}, {0, 0}), displacement({100, 0}, {100, 0}),
                                    displacement({0, 100}, {0, 100}),
                                    displacement({100, 100}, {100, 100}, 1),
                                    displacement({100, 100}, {101, 100}, 2)};
  const point2 p = transform(fitHomography(list), {100, 100});
  EXPECT_NEAR(p.x, 100.8, 0.02);  // 4 / 5 of the way; 2 / 3 if the weight were linear
}

TEST(HomographyFitTest, TooFewPointsStillGiveAMatrixThroughThem) {
  const std::vector<Displacement> list = {displacement({100, 20}, {103, 24}),
                                          displacement({1800, 900}, {1803, 904}, .5)};
  const matrix3 m = fitHomography(list);
  for (const Displacement& d : list) {
    expect_point_near(transform(m, {d.sourceX, d.sourceY}), {d.targetX, d.targetY}, 1e-3);
  }
  EXPECT_EQ(fitHomography({})[8], 1.0);
  const std::vector<Displacement> bad(6, displacement({NAN, 1}, {2, 3}));
  EXPECT_TRUE(std::isnan(fitHomography(bad)[0]));
}

TEST(SquareToQuadTest, TakesTheCornersOfTheUnitSquareToTheQuad) {
  const matrix3 m = square_to_quad({10, 20}, {110, 25}, {5, 130}, {120, 118});
  expect_point_near(transform(m, {1, 1}), {120, 118}, 1e-9);
  expect_point_near(transform(m, {.25, .75}), {37.7702033, 97.2297968}, 1e-7);
  // A parallelogram in either coordinate is affine.
  expect_matrix_near(square_to_quad({0, 0}, {100, 0}, {0, 100}, {100, 110}),
                     {100, 0, 0, 0, 110, 0, 0, 0, 1}, 0);
}

TEST(FitSimilarityPairs, FindsTheLeastSquaresMotion) {
  // About the means (5/3, 1) and (-1/3, 2) the products sum to 47/3, those across to 13, the
  // sources' squares to 44/3.
  const similarity fit = fit_similarity_pairs({{0, 0}, {4, 0}, {1, 3}}, {{0, 0}, {3, 2}, {-4, 4}});
  EXPECT_NEAR(fit.scale, std::hypot(47, 39) / 44, 1e-9);
  EXPECT_NEAR(fit.angle, std::atan2(39, 47), 1e-9);
  expect_point_near({fit.tx, fit.ty}, {-27 / 22., -6 / 11.}, 1e-9);
  // Too few, or all in one place: the identity.
  const std::vector<point2> one = {{9, 9}}, same(2, {1900.1, 1000.3});
  EXPECT_EQ(fit_similarity_pairs(one, {{3, 4}}).tx, 0);
  EXPECT_EQ(fit_similarity_pairs(same, {{5, 6}, {7, 8}}).tx, 0);
}

}  // namespace
}  // namespace marrow::stabilization
