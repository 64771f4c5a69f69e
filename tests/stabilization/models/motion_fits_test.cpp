#include "stabilization/models/motion_fits.h"

#include <gtest/gtest.h>

#include <cmath>
#include <random>

#include "tests/stabilization/clips.h"

namespace marrow::stabilization {
namespace {

TEST(TranslationFitTest, IsTheWeightedMean) {
  const std::vector<Displacement> list = {displacement({0, 0}, {1, 2}, 1),
                                          displacement({5, 5}, {10, 4}, 3)};
  expect_matrix_near(fitTranslation(list), {1, 0, 4, 0, 1, -.25, 0, 0, 1}, 1e-15);
  EXPECT_TRUE(std::isnan(meanTranslation({}).x));
}

TEST(SimilarityFitTest, WorkedLists) {
  const matrix3 turned = similarity_matrix(1.2, 0.1, 3, -4);
  const struct {
    const char* situation;
    std::vector<Displacement> list;
    matrix3 expected;
  } cases[] = {
      {"exact",
       {displacement({0, 0}, {3, -4}, 1), displacement({10, 0}, transform(turned, {10, 0}), 2),
        displacement({0, 10}, transform(turned, {0, 10}), 3)},
       turned},
      {"noisy, with weights",
       {displacement({0, 0}, {1, 1}, 1), displacement({4, 0}, {1, 5}, 1),
        displacement({0, 2}, {-1.5, 1}, 2)},
       similarity_matrix(1.06433665, 1.51204050, 0.75, 0.875)},
      {"mirrored targets are turned",
       {displacement({0, 0}, {0, 0}), displacement({4, 0}, {-4, 0}), displacement({0, 2}, {0, 2})},
       {-.6, .4, -.8, -.4, -.6, 4.8 / 3, 0, 0, 1}},
      {"collinear",
       {displacement({0, 0}, {1, 0}), displacement({1, 0}, {3, 0}), displacement({2, 0}, {5, 0})},
       similarity_matrix(2, 0, 1, 0)}};
  for (const auto& e : cases) {
    SCOPED_TRACE(e.situation);
    expect_matrix_near(fitSimilarity(e.list), e.expected, 1e-7);
  }
  const std::vector<Displacement> one_place(3, displacement({5, 6}, {8, 8}));
  expect_point_near(transform(fitSimilarity(one_place), {5, 6}), {8, 8}, 1e-12);
  const std::vector<Displacement> weightless(3, displacement({5, 6}, {8, 8}, 0));
  EXPECT_TRUE(std::isnan(fitSimilarity(weightless)[0]));
}

// Random sources over a frame, targets under m.
std::vector<Displacement> displacements_under(const matrix3& m, int count) {
  std::mt19937 random(7);
  std::uniform_real_distribution<double> unit(0, 1);
  std::vector<Displacement> list;
  for (int i = 0; i < count; ++i) {
    const point2 p = {unit(random) * 1919, unit(random) * 1079};
    list.push_back(displacement(p, transform(m, p), 0.2 + 0.8 * unit(random)));
  }
  return list;
}

TEST(HomographyFitTest, ExactTargetsGiveTheMatrix) {
  const matrix3 truth = {1.02, 0.03, 5, -0.01, 0.98, -7, 1e-5, -2e-5, 1};
  homography_fitter fitter;
  for (const int count : {400, 8, 4}) {  // shrinking lists reuse the arrays
    const auto list = displacements_under(truth, count);
    const matrix3 m = fitter.fit(list);
    for (const Displacement& d : list) {
      expect_point_near(transform(m, {d.sourceX, d.sourceY}), {d.targetX, d.targetY}, 1e-7);
    }
    if (count == 400) expect_matrix_near(m, truth, 1e-9);
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
  const auto list = displacements_under(similarity_matrix(1, 0, 3, 4), 2);
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
