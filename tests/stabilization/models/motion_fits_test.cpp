#include "stabilization/models/motion_fits.h"

#include <gtest/gtest.h>

#include <cmath>

#include "tests/stabilization/displacement_lists.h"

namespace marrow::stabilization {
namespace {

TEST(TranslationFitTest, IsTheWeightedMean) {
  const std::vector<Displacement> list = {displacement({0, 0}, {1, 2}, 1),
                                          displacement({5, 5}, {10, 4}, 3)};
  expect_matrix_near(fitTranslation(list), {1, 0, 4, 0, 1, -.25, 0, 0, 1}, 1e-15);
  EXPECT_TRUE(std::isnan(meanTranslation({}).x));
}

TEST(SimilarityFitTest, RecoversScaleTurnAndShiftInTheRightSense) {
  const matrix3 truth = similarity_matrix(1.2, 0.1, 3, -4);
  std::vector<Displacement> list;
  double weight = 1;
  for (const point2 p : {point2{0, 0}, point2{10, 0}, point2{0, 10}, point2{10, 10}}) {
    list.push_back(displacement(p, transform(truth, p), weight++));
  }
  expect_matrix_near(fitSimilarity(list), truth, 1e-12);
}

TEST(SimilarityFitTest, NoisyPointsWithWeights) {
  const std::vector<Displacement> list = {displacement({0, 0}, {1, 1}, 1),
                                          displacement({4, 0}, {1, 5}, 1),
                                          displacement({0, 2}, {-1.5, 1}, 2)};
  expect_matrix_near(fitSimilarity(list), similarity_matrix(1.06433665, 1.51204050, 0.75, 0.875),
                     1e-7);
}

TEST(SimilarityFitTest, MirroredTargetsAreTurnedNotMirrored) {
  const std::vector<Displacement> list = {
      displacement({0, 0}, {0, 0}), displacement({4, 0}, {-4, 0}), displacement({0, 2}, {0, 2})};
  const matrix3 m = fitSimilarity(list);
  const double s = 0.72111026;
  EXPECT_NEAR(m[0], s * -.83205029, 1e-7);
  EXPECT_NEAR(m[1], s * .55470020, 1e-7);
  EXPECT_NEAR(m[3], s * -.55470020, 1e-7);
  EXPECT_NEAR(m[4], s * -.83205029, 1e-7);
}

TEST(SimilarityFitTest, DegenerateLists) {
  const std::vector<Displacement> one_place(3, displacement({5, 6}, {8, 8}));
  const point2 image = transform(fitSimilarity(one_place), {5, 6});
  EXPECT_NEAR(image.x, 8, 1e-12);
  EXPECT_NEAR(image.y, 8, 1e-12);
  const std::vector<Displacement> collinear = {
      displacement({0, 0}, {1, 0}), displacement({1, 0}, {3, 0}), displacement({2, 0}, {5, 0})};
  expect_matrix_near(fitSimilarity(collinear), similarity_matrix(2, 0, 1, 0), 1e-12);
  const std::vector<Displacement> weightless(3, displacement({5, 6}, {8, 8}, 0));
  EXPECT_TRUE(std::isnan(fitSimilarity(weightless)[0]));
}

TEST(HomographyFitTest, ExactTargetsGiveTheMatrix) {
  const matrix3 truth = {1.02, 0.03, 5, -0.01, 0.98, -7, 1e-5, -2e-5, 1};
  homography_fitter fitter;
  for (const int count : {400, 8, 4}) {  // shrinking lists reuse the arrays
    const auto list = displacements_under(truth, count, 1920, 1080, 7);
    const matrix3 m = fitter.fit(list);
    for (const Displacement& d : list) {
      const point2 p = transform(m, {d.sourceX, d.sourceY});
      EXPECT_NEAR(p.x, d.targetX, 1e-7);
      EXPECT_NEAR(p.y, d.targetY, 1e-7);
    }
    if (count == 400) expect_matrix_near(m, truth, 1e-10);
  }
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
  const auto list = displacements_under(similarity_matrix(1, 0, 3, 4), 2, 1920, 1080);
  const matrix3 m = fitHomography(list);
  for (const Displacement& d : list) {
    EXPECT_NEAR(transform(m, {d.sourceX, d.sourceY}).x, d.targetX, 1e-3);
  }
  EXPECT_EQ(fitHomography({})[8], 1.0);
  const std::vector<Displacement> bad(6, displacement({NAN, 1}, {2, 3}));
  EXPECT_TRUE(std::isnan(fitHomography(bad)[0]));
}

}  // namespace
}  // namespace marrow::stabilization
