#include "host/effects/layer_time.h"

#include <gtest/gtest.h>

#include "host/timeline/layer.h"

namespace calmframe::host {
namespace {

LayerState Rated(std::int64_t ticks_per_frame, std::int32_t start, std::int32_t length) {
  LayerState layer;
  layer.ticks_per_frame = ticks_per_frame;
  layer.start_frame = start;
  layer.length = length;
  return layer;
}

TEST(LayerTimeTest, UsualRatesAreExact) {
  const LayerTime ntsc(Rated(23543520, -5, 300));
  EXPECT_EQ(ntsc.step(), 1001);
  EXPECT_EQ(ntsc.scale(), 30000u);
  EXPECT_EQ(ntsc.total(), 300300);
  EXPECT_EQ(ntsc.OfFrame(7), 7007);
  EXPECT_EQ(ntsc.OfFrame(-1), -1001);
  EXPECT_EQ(ntsc.MediaTicks(7007, 30000), 2 * 23543520);
  EXPECT_EQ(ntsc.MediaTicks(0, 1), -5 * std::int64_t{23543520});
  EXPECT_EQ(LayerTime(Rated(28224000, 0, 10)).step(), 1);
  EXPECT_EQ(LayerTime(Rated(28224000, 0, 10)).scale(), 25u);
}

// A rate without small numbers, over hours: every instant stays in 32 bits and within its frame.
TEST(LayerTimeTest, OddRatesNeverFallBeforeTheirFrame) {
  constexpr std::int64_t kTicks = 23543521;
  constexpr std::int32_t kLength = 400000;
  const LayerTime time(Rated(kTicks, 0, kLength));
  EXPECT_GT(time.total(), 0);
  EXPECT_LT(time.total(), std::int32_t{0x7fffffff});
  for (std::int64_t frame = 0; frame <= kLength; frame += 37) {
    const std::int64_t ticks = time.MediaTicks(time.OfFrame(frame), time.scale());
    ASSERT_EQ(ticks / kTicks, frame);
  }
}

}  // namespace
}  // namespace calmframe::host
