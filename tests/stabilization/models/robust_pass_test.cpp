#include "stabilization/models/robust_pass.h"

#include <gtest/gtest.h>

#include <cmath>

#include "stabilization/warp/model_scores.h"
#include "tests/stabilization/clips.h"

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

// Groups of four, `calm` of them near the fit and four further away each. The unit is the median or
// half a pixel; weights fall from three units on and are gone from 4.75 on.
TEST(MedianDeviationTest, WeightsFallWithTheDistanceInUnits) {
  const struct {
    int calm;
    double median;
    std::vector<std::pair<double, double>> far;  // distance, weight
  } cases[] = {{6, 0.2, {{1.49, 1}, {1.6, .67032005}, {2.3, .04076220}, {2.376, 0}}},
               {4, 1.5, {{4.49, 1}, {6.0, .13533528}, {7.2, 0}}}};
  for (const auto& e : cases) {
    std::vector<Displacement> list;
    for (int i = 0; i < e.calm; ++i) push(list, e.median);
    for (const auto& [distance, weight] : e.far) push(list, distance);
    EXPECT_NEAR(medianDeviation(list), e.median, 1e-9);
    EXPECT_EQ(list[0].weight, 1);
    for (std::size_t k = 0; k < e.far.size(); ++k) {
      const Displacement& d = list[4 * (e.calm + k)];
      EXPECT_NEAR(d.weight, e.far[k].second, 1e-6) << e.far[k].first;
      EXPECT_EQ(d.outlier, e.far[k].second < 1) << e.far[k].first;
    }
  }
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

TEST(FadeAboutOutliersTest, WeightReturnsOverSixtyFramesInsideTheRangeAndTheTrack) {
  const struct {
    int first, end, track_end;
    double outlier;
    std::vector<std::pair<int, double>> weights;  // of frames
  } cases[] = {{0,
                200,
                200,
                0,
                {{99, 1 / 60.}, {101, 1 / 60.}, {70, .5}, {130, .5}, {40, 1}, {160, 1}, {161, 1}}},
               {90, 110, 104, .25, {{103, .3}, {104, 1}, {90, 10 / 60. + .25}, {89, 1}}},
               {90, 103, 200, .25, {{102, 2 / 60. + .25}, {103, 1}}}};
  for (const auto& e : cases) {
    displacement_lists lists = one_track(200, 100, e.outlier);
    lists[e.track_end - 1][0].nextIndex = -1;
    fade_about_outliers(lists, e.first, e.end, 60);
    for (const auto& [frame, weight] : e.weights) {
      EXPECT_NEAR(lists[frame][0].weight, weight, 1e-15) << frame;
    }
  }
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
