#include "tracking/correlation.h"

#include <gtest/gtest.h>

#include <cmath>
#include <vector>

namespace marrow::tracking {
namespace {

// Windows of three by one pixels, in planes that hold other things too.
constexpr std::size_t kPixels = 3;
std::vector<float> Window(std::vector<std::vector<float>> channels) {
  const window_shape shape{1, 0, channels.size()};
  std::vector<float> window(shape.plane_size(), 99.0f);
  for (std::size_t c = 0; c < channels.size(); ++c) {
    for (std::size_t i = 0; i < kPixels; ++i) window[i * channels.size() + c] = channels[c][i];
  }
  return window;
}

float Correlate(const std::vector<std::vector<float>>& first,
                const std::vector<std::vector<float>>& second) {
  const window_shape shape{1, 0, first.size()};
  return NormalisedCorrelation(shape, Window(first).data(), Window(second).data());
}

TEST(NormalisedCorrelationTest, MeanOverTheChannels) {
  EXPECT_FLOAT_EQ(Correlate({{1, 2, 3}}, {{10, 30, 50}}), 1.0f);
  EXPECT_FLOAT_EQ(Correlate({{1, 2, 3}}, {{7, 6, 5}}), -1.0f);
  // Deviations (-1, 0, 1) and (-1, 2, -1) are perpendicular; (-1, 0, 1) and (-4, -1, 5) give
  // 9 / sqrt(2 * 42).
  EXPECT_NEAR(Correlate({{1, 2, 3}}, {{0, 3, 0}}), 0.0f, 1e-7f);
  const float third = 9.0f / std::sqrt(84.0f);
  EXPECT_NEAR(Correlate({{1, 2, 3}, {1, 2, 3}, {1, 2, 3}}, {{2, 4, 6}, {3, 2, 1}, {0, 3, 9}}),
              third / 3, 1e-6f);
  EXPECT_NEAR(Correlate({{1, 2, 3}, {1, 2, 3}, {1, 2, 3}, {1, 2, 3}},
                        {{1, 2, 3}, {1, 2, 3}, {0, 3, 9}, {0, 3, 0}}),
              (2 + third) / 4, 1e-6f);
}

TEST(NormalisedCorrelationTest, AFlatChannelAddsNothingButCounts) {
  EXPECT_FLOAT_EQ(Correlate({{1, 2, 3}, {77.3f, 77.3f, 77.3f}}, {{1, 2, 3}, {1, 2, 3}}), 0.5f);
  EXPECT_FLOAT_EQ(Correlate({{1, 2, 3}, {1, 2, 3}}, {{1, 2, 3}, {0.1f, 0.1f, 0.1f}}), 0.5f);
  EXPECT_EQ(Correlate({{5, 5, 5}}, {{5, 5, 5}}), 0.0f);
}

TEST(NormalisedCorrelationTest, FaintContrastOnABrightGround) {
  EXPECT_NEAR(Correlate({{250.0f, 250.01f, 250.02f}}, {{10, 20, 30}}), 1.0f, 1e-3f);
  EXPECT_NEAR(Correlate({{250.0f, 250.01f, 250.0f}}, {{10, 20, 30}}), 0.0f, 1e-3f);
}

// A window whose channels have the given root mean squares.
std::size_t Primary(const std::vector<float>& levels, float threshold) {
  std::vector<std::vector<float>> channels;
  for (const float level : levels) channels.push_back({level, -level, level});
  return FindPrimaryChannel(Window(channels).data(), {1, 0, levels.size()}, threshold);
}

TEST(FindPrimaryChannelTest, ThreeChannels) {
  EXPECT_EQ(Primary({5, 5, 5}, 5), 0u) << "at the threshold is bright enough";
  EXPECT_EQ(Primary({0, 0, 0}, 0), 0u) << "the test is off";
  EXPECT_EQ(Primary({1, 9, 8}, 5), 2u);
  EXPECT_EQ(Primary({1, 8, 9}, 5), 3u);
  EXPECT_EQ(Primary({1, 8, 8}, 5), 2u);
  EXPECT_EQ(Primary({8, 1, 9}, 5), 3u);
  EXPECT_EQ(Primary({9, 1, 8}, 5), 1u);
  EXPECT_EQ(Primary({8, 1, 8}, 5), 3u);
  EXPECT_EQ(Primary({9, 8, 1}, 5), 1u);
  EXPECT_EQ(Primary({8, 9, 1}, 5), 2u);
  EXPECT_EQ(Primary({8, 8, 1}, 5), 1u);
  // Only the first dark channel counts, even against a brighter one in front of it.
  EXPECT_EQ(Primary({4, 1, 2}, 5), 3u);
  EXPECT_EQ(Primary({90, 1, 2}, 5), 1u);
}

TEST(FindPrimaryChannelTest, OtherNumbersOfChannelsTakeTheBrightest) {
  EXPECT_EQ(Primary({7}, 5), 0u);
  EXPECT_EQ(Primary({1}, 5), 1u);
  EXPECT_EQ(Primary({1, 9}, 5), 2u);
  EXPECT_EQ(Primary({6, 9, 30, 1}, 5), 3u);
}

}  // namespace
}  // namespace marrow::tracking
