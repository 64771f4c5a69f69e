#include "platform/tesselmedia/time.h"

#include <gtest/gtest.h>

#include <cstdint>
#include <limits>
#include <stdexcept>

#include "platform/hx/hx_types.h"

namespace tesselmedia {
namespace {

constexpr std::int64_t kMost = std::numeric_limits<std::int64_t>::max();

TEST(TimeTest, FramesOfTheUsualRatesAreWholeTicks) {
  EXPECT_EQ(TickTime::kTicksPerSecond, HX_TICKS_PER_SECOND);
  EXPECT_EQ(ToTickTime({1001, 30000}).ticks(), 23543520);
  EXPECT_EQ(ToTickTime({1, 25}).ticks(), 28224000);
  EXPECT_EQ(ToTickTime({-1001, 60000}).ticks(), -11771760);
  // A day of frames, where value times ticks leaves 64 bits.
  EXPECT_EQ(ToTickTime({std::int64_t{86400} * 30000, 30000}).ticks(), 86400 * 705600000LL);
}

TEST(TimeTest, RoundsAndLimits) {
  EXPECT_EQ(ToTickTime({1, 1411200000}).ticks(), 1);  // half a tick
  EXPECT_EQ(ToTickTime({-1, 1411200000}).ticks(), -1);
  EXPECT_EQ(ToTickTime({1, 1411200001}).ticks(), 0);
  EXPECT_EQ(ToTickTime({kMost, 1}).ticks(), kMost);
  EXPECT_EQ(ToTickTime({-kMost, 1}).ticks(), -kMost - 1);
  EXPECT_EQ(ToTickTime({kMost, kMost}).ticks(), 705600000);
  EXPECT_THROW(ToTickTime({1, 0}), std::domain_error);
  EXPECT_THROW(ToTickTime({1, -25}), std::domain_error);
}

TEST(TimeTest, LegacyScalesAreReExpressed) {
  const auto expect = [](std::int64_t value, std::int64_t scale, std::int64_t new_value,
                         std::int64_t new_scale) {
    const LegacyRatioTime time = CorrectLegacyRatioTimeAtTimeScale(value, scale);
    EXPECT_EQ(time.value, new_value) << value << '/' << scale;
    EXPECT_EQ(time.scale, new_scale) << value << '/' << scale;
    EXPECT_EQ(IsLegacyTimeScale(scale), scale != new_scale);
  };
  // One frame, and others.
  expect(100, 2997, 1001, 30000);
  expect(1000, 29970, 1001, 30000);
  expect(100000, 2398, 1001000, 24000);
  expect(1000, 23976, 1001, 24000);
  expect(-300, 5994, -3003, 60000);
  expect(0, 59940, 0, 60000);
  for (const std::int64_t scale : {1, 25, 24000, 30000, 60000, 2996, 0}) {
    expect(1001, scale, 1001, scale);
  }
}

}  // namespace
}  // namespace tesselmedia
