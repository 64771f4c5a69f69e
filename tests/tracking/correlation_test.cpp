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

// Of three channels the brighter of the two behind the first dark one, even against a brighter one
// in front of it; of other numbers the brightest. At the threshold is bright enough.
TEST(FindPrimaryChannelTest, WhereAChannelIsDark) {
  const std::pair<std::vector<float>, std::size_t> cases[] = {
      {{5, 5, 5}, 0}, {{1, 9, 8}, 2}, {{1, 8, 9}, 3}, {{1, 8, 8}, 2},
      {{8, 1, 9}, 3}, {{9, 1, 8}, 1}, {{8, 1, 8}, 3}, {{9, 8, 1}, 1},
      {{8, 9, 1}, 2}, {{8, 8, 1}, 1}, {{4, 1, 2}, 3}, {{90, 1, 2}, 1},
      {{7}, 0},       {{1}, 1},       {{1, 9}, 2},    {{6, 9, 30, 1}, 3}};
  for (const auto& [levels, expected] : cases) {
    EXPECT_EQ(Primary(levels, 5), expected) << ::testing::PrintToString(levels);
  }
  EXPECT_EQ(Primary({0, 0, 0}, 0), 0u) << "the test is off";
}

}  // namespace
}  // namespace marrow::tracking
