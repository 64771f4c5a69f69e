#include "stabilization/models/robust_pass.h"

#include <gtest/gtest.h>

#include <cmath>

#include "stabilization/warp/model_scores.h"
#include "tests/stabilization/displacement_lists.h"

namespace marrow::stabilization {
namespace {

// Four points on the axes, those on x pushed outwards and those on y inwards: scale and turn of the
// whole stay 1 and 0, so the fit is the identity and every residual is the push.
void push(std::vector<Displacement>& list, double push, double radius = 1000) {
  list.push_back(displacement({radius, 0}, {radius + push, 0}));
  list.push_back(displacement({-radius, 0}, {-radius - push, 0}));
  list.push_back(displacement({0, radius}, {0, radius - push}));
  list.push_back(displacement({0, -radius}, {0, -radius + push}));
}

TEST(MedianDeviationTest, UnitIsHalfAPixelAtLeast) {
  std::vector<Displacement> list;
  for (int i = 0; i < 6; ++i) push(list, 0.2);
  for (const double far : {1.49, 1.6, 2.3, 2.376}) push(list, far);
  EXPECT_NEAR(medianDeviation(list), 0.2, 1e-9);
  const double weight[] = {1, 0.67032005, 0.04076220, 0};
  for (int k = 0; k < 4; ++k) {
    EXPECT_NEAR(list[24 + 4 * k].weight, weight[k], 1e-6) << k;
    EXPECT_EQ(list[24 + 4 * k].outlier, k > 0) << k;
  }
  EXPECT_EQ(list[0].weight, 1);
}

TEST(MedianDeviationTest, UnitIsTheMedian) {
  std::vector<Displacement> list;
  for (int i = 0; i < 4; ++i) push(list, 1.5);
  for (const double far : {4.49, 6.0, 7.2}) push(list, far);
  EXPECT_NEAR(medianDeviation(list), 1.5, 1e-9);
  EXPECT_FALSE(list[16].outlier);
  EXPECT_NEAR(list[20].weight, 0.13533528, 1e-6);
  EXPECT_EQ(list[24].weight, 0);
}

TEST(MedianDeviationTest, ShortAndWeightlessListsAreLeftAlone) {
  std::vector<Displacement> list;
  push(list, 0.1);
  list.push_back(displacement({5, 5}, {500, 5}));
  ASSERT_EQ(list.size(), 5u);
  EXPECT_EQ(medianDeviation(list), 0.0);
  EXPECT_FALSE(list[4].outlier);
  list.push_back(displacement({5, 5}, {5, 5}));
  EXPECT_GT(medianDeviation(list), 0.0);
  EXPECT_TRUE(list[4].outlier);
  for (Displacement& d : list) d.weight = 0;
  EXPECT_TRUE(std::isnan(medianDeviation(list)));
}

// One track, a record a frame, one outlier.
displacement_lists one_track(int frames, int outlier, double weight) {
  displacement_lists lists(frames);
  for (int f = 0; f < frames; ++f) {
    lists[f].push_back(displacement({0, 0}, {0, 0}));
    lists[f][0].prevIndex = f ? 0 : -1;
    lists[f][0].nextIndex = f + 1 < frames ? 0 : -1;
  }
  lists[outlier][0].outlier = true;
  lists[outlier][0].weight = weight;
  return lists;
}

TEST(FadeAboutOutliersTest, WeightReturnsOverSixtyFramesOnBothSides) {
  displacement_lists lists = one_track(200, 100, 0.0);
  fade_about_outliers(lists, 0, 200, 60);
  for (const int side : {-1, 1}) {
    EXPECT_NEAR(lists[100 + side][0].weight, 1.0 / 60, 1e-15);
    EXPECT_NEAR(lists[100 + 30 * side][0].weight, 0.5, 1e-15);
    EXPECT_EQ(lists[100 + 60 * side][0].weight, 1);
    EXPECT_EQ(lists[100 + 61 * side][0].weight, 1);
  }
}

TEST(FadeAboutOutliersTest, StaysInsideTheRangeAndStopsWhereTheTrackEnds) {
  displacement_lists lists = one_track(200, 100, 0.25);
  lists[103][0].nextIndex = -1;
  fade_about_outliers(lists, 90, 110, 60);
  EXPECT_NEAR(lists[103][0].weight, 0.3, 1e-15);
  EXPECT_EQ(lists[104][0].weight, 1);
  EXPECT_NEAR(lists[90][0].weight, 10.0 / 60 + 0.25, 1e-15);
  EXPECT_EQ(lists[89][0].weight, 1);
}

TEST(RampScoresTest, OneLimitedFrameIsApproachedOverFifteenFramesAStep) {
  std::vector<double> scores(101, 4.0);
  scores[50] = 2.0;
  ramp_scores(scores, 15);
  const double expected[][2] = {{1, 2.0666667}, {7, 2.4666667}, {14, 2.9333333},
                                {15, 3.0},      {30, 4.0},      {31, 4.0}};
  for (const auto& [distance, score] : expected) {
    EXPECT_NEAR(scores[50 - static_cast<int>(distance)], score, 1e-7);
    EXPECT_NEAR(scores[50 + static_cast<int>(distance)], score, 1e-7);
  }
  std::vector<double> at_start(60, 4.0);
  at_start[0] = 1.0;
  ramp_scores(at_start, 15);
  EXPECT_NEAR(at_start[1], 1.0666667, 1e-7);
  EXPECT_NEAR(at_start[2], 1.1333333, 1e-7);
  EXPECT_NEAR(at_start[44], 1 + 44.0 / 15, 1e-12);
  EXPECT_NEAR(at_start[45], 4.0, 1e-12);
  EXPECT_EQ(at_start[50], 4.0);
}

}  // namespace
}  // namespace marrow::stabilization
