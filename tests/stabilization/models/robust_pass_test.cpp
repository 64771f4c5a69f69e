#include "stabilization/models/robust_pass.h"

#include <gtest/gtest.h>

#include <cmath>
#include <random>

#include "tests/stabilization/clips.h"

namespace marrow::stabilization {
namespace {

// Four points on the axes, those on x pushed outwards and those on y inwards: scale and turn of the
// whole stay 1 and 0, so the fit is the identity and every residual is the push.
void push(std::vector<Displacement>& list, double push) {
  list.push_back(displacement({1000, 0}, {1000 + push, 0}));
  list.push_back(displacement({-1000, 0}, {-1000 - push, 0}));
  list.push_back(displacement({0, 1000}, {0, 1000 - push}));
  list.push_back(displacement({0, -1000}, {0, -1000 + push}));
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

TEST(FadeAboutOutliersTest, WeightReturnsInsideTheRangeAndTheTrack) {
  const struct {
    int end, track_end;
    std::vector<std::pair<int, double>> weights;  // of frames
  } cases[] = {{110, 104, {{103, .3}, {104, 1}, {90, 10 / 60. + .25}, {89, 1}}},
               {103, 200, {{102, 2 / 60. + .25}, {103, 1}}}};
  for (const auto& e : cases) {
    // One track, a record a frame, one outlier.
    displacement_lists lists(200, {displacement({0, 0}, {0, 0})});
    for (int f = 0; f < 200; ++f) {
      lists[f][0].prevIndex = f ? 0 : -1;
      lists[f][0].nextIndex = f + 1 < e.track_end ? 0 : -1;
    }
    lists[100][0].outlier = true;
    lists[100][0].weight = .25;
    fade_about_outliers(lists, 90, e.end, 60);
    for (const auto& [frame, weight] : e.weights) {
      EXPECT_NEAR(lists[frame][0].weight, weight, 1e-15) << frame;
    }
  }
}

// Tracks that begin and end along a clip of 400 frames; a fifth of the samples of some frames stand
// where no motion takes them.
stabilizer_global ClipWithOutliers() {
  std::mt19937 random(3);
  std::uniform_real_distribution<float> place(0, 600), off(2, 30);
  stabilizer_global global;
  global.frame_count = 400;
  global.feature_count = 40;
  global.input.assign(400 * 40, {0, 0, -1, 0});
  for (std::size_t s = 0; s < 40; ++s) {
    const std::size_t life = 30 + 9 * s;
    const float x = place(random), y = place(random);
    for (std::size_t f = 0; f < 400; ++f) {
      const auto at = static_cast<float>(f);
      global.input[f * 40 + s] = {x + at, y - at, f % life == 0 ? static_cast<int>(f) + 1 : 0, 0};
    }
  }
  global.output = global.input;
  for (std::size_t f = 0; f < 400; ++f) {
    for (std::size_t s = 0; s < 40; ++s) {
      track_sample& sample = global.output_at(f, s);
      if (f % 7 == 3 && random() % 5 == 0) sample.x += off(random);
      if (random() % 300 == 0) sample.status = -1;
    }
  }
  global.trajectories = tracking::BuildTrajectories(global.input.data(), 40, 400);
  return global;
}

TEST(RobustWalkTest, SameAsBothStepsOverAllListsFromAnyFrameOn) {
  const stabilizer_global global = ClipWithOutliers();
  displacement_lists lists = blended_displacements(global, {}, {});
  std::vector<double> medians;
  for (auto& list : lists) medians.push_back(medianDeviation(list));
  fade_about_outliers(lists, 0, 400, 60);

  const blended_tracks tracks(global, {}, {});
  std::size_t outliers = 0, faded = 0;
  for (const std::size_t first : {0, 1, 119, 120, 250, 399}) {
    std::size_t looked = 0;
    robust_walk walk(tracks, 60, first, [&](std::size_t, const auto&) { ++looked; });
    for (std::size_t f = first; f < 400; ++f) {
      const auto [list, median] = walk.next();
      EXPECT_EQ(median, medians[f]);
      ASSERT_EQ(list.size(), lists[f].size());
      for (std::size_t i = 0; i < list.size(); ++i) {
        ASSERT_EQ(list[i].weight, lists[f][i].weight) << f << " from " << first;
        ASSERT_EQ(list[i].targetX, lists[f][i].targetX);
        outliers += list[i].outlier;
        faded += !list[i].outlier && list[i].weight < 0.2;
      }
    }
    EXPECT_EQ(looked, std::min<std::size_t>(400, 520 - first));
  }
  EXPECT_GT(outliers, 500u);
  EXPECT_GT(faded, 1000u);
}

}  // namespace
}  // namespace marrow::stabilization
