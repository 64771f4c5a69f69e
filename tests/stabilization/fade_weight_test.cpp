#include "stabilization/fade_weight.h"

#include <gmock/gmock.h>

#include <cmath>
#include <vector>

namespace marrow::stabilization {
namespace {

using testing::DoubleNear;
using testing::Each;
using testing::Pointwise;

MATCHER(Near, "") {
  return std::abs(std::get<0>(arg) - std::get<1>(arg)) < 1e-12;
}

// Weights of a whole track in a clip, flanks of 100 frames, tracks under 5 frames dropped.
std::vector<double> track(int first, int last, int frame_count) {
  std::vector<double> weights;
  for (int f = first; f < last; ++f) {
    weights.push_back(fade_weight(first, last, frame_count, f, 100, 5));
  }
  return weights;
}

// Weights of a span with flanks of 30 frames, in units of one flank step.
std::vector<double> span(int length, bool at_start, bool at_end) {
  std::vector<double> weights;
  for (int p = 0; p < length; ++p) {
    weights.push_back(30 * fade_weight({length, at_start, at_end}, p, 30));
  }
  return weights;
}

TEST(FadeWeight, WholeClipTrackIsFlat) {
  EXPECT_THAT(track(0, 300, 300), Each(1.0));
  EXPECT_THAT(track(0, 150, 150), Each(0.75));
  EXPECT_THAT(span(40, true, true), Each(DoubleNear(20, 1e-12)));
  EXPECT_THAT(span(20, true, true), Each(DoubleNear(20, 1e-12)));
}

TEST(FadeWeight, TrackFromTheClipsStartFallsOnly) {
  const auto below = track(0, 99, 300);
  const auto equal = track(0, 100, 300);
  const auto above = track(0, 101, 300);
  for (int p = 0; p < 99; ++p) EXPECT_NEAR(below[p], 0.99 - 0.01 * p, 1e-12) << p;
  for (int p = 0; p < 100; ++p) EXPECT_NEAR(equal[p], p < 50 ? 0.5 : 0.01 * (100 - p), 1e-12) << p;
  EXPECT_NEAR(above[0], 0.505, 1e-12);
  EXPECT_NEAR(above[50], 0.505, 1e-12);
  EXPECT_NEAR(above[100], 0.01, 1e-12);
}

TEST(FadeWeight, TrackToTheClipsEndRisesOnly) {
  const auto weights = track(250, 300, 300);
  for (int p = 0; p < 50; ++p) EXPECT_NEAR(weights[p], 0.01 * (p + 1), 1e-12) << p;
}

TEST(FadeWeight, TrackInMidClipRisesAndFalls) {
  EXPECT_THAT(track(10, 15, 300), Pointwise(Near(), {0.01, 0.02, 0.025, 0.02, 0.01}));
  EXPECT_THAT(track(10, 16, 300), Pointwise(Near(), {0.01, 0.02, 0.03, 0.03, 0.02, 0.01}));
  EXPECT_THAT(track(10, 14, 300), Each(0.0));
  const auto wide = track(50, 350, 1000);
  EXPECT_NEAR(wide[0], 0.01, 1e-12);
  EXPECT_NEAR(wide[98], 0.99, 1e-12);
  EXPECT_EQ(wide[99], 1.0);
  EXPECT_EQ(wide[200], 1.0);
  EXPECT_NEAR(wide[201], 0.99, 1e-12);
  EXPECT_NEAR(wide[299], 0.01, 1e-12);
}

TEST(FadeWeight, ShortSpanKeepsIntegerFlanks) {
  EXPECT_THAT(span(3, false, false), Pointwise(Near(), {1.0, 1.5, 1.0}));
  const auto forty = span(40, false, false);
  for (int p = 0; p < 40; ++p) EXPECT_NEAR(forty[p], p < 20 ? p + 1 : 40 - p, 1e-12) << p;
}

TEST(FadeWeight, NoFlanksMeansFullWeight) {
  for (int p = 0; p < 7; ++p) EXPECT_EQ(fade_weight({7, false, false}, p, 0), 1.0);
}

}  // namespace
}  // namespace marrow::stabilization
