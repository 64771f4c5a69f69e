#include "stabilizer/effect/src/frame_time.h"

#include <gtest/gtest.h>

#include <boost/rational.hpp>
#include <tuple>

namespace kelp::effect {
namespace {

TEST(FrameTimeTest, WhatDoesNotFitIsHalvedRoundedUpAndReduced) {
  const struct {
    std::int64_t frame;
    analysis::RationalTime duration;
    HostTime at;
  } cases[] = {
      {7, {1, 25}, {7, 1, 25}},
      {-3, {1001, 30000}, {-3003, 1001, 30000}},
      {2145337, {1001, 30000}, {2147482337, 1001, 30000}},  // the last that fits
      {2200001, {1001, 30000}, {1101100501, 500, 15000}},   // 2202201001 / 2, rounded up
      {3000000, {1001, 30000}, {100100, 1, 1}},             // 1501500000 / 15000
  };
  for (const auto& c : cases) {
    const auto [time, step, scale] = FrameTime(c.frame, c.duration);
    EXPECT_EQ(std::tie(time, step, scale), std::tie(c.at.time, c.at.step, c.at.scale)) << c.frame;
  }
  EXPECT_THROW(FrameTime(10000, {1000000, 1}), boost::bad_rational);
  const FrameClock clock{12, {1, 50}};
  EXPECT_EQ(clock.At(37).time, 25) << "of the layer's first frame";
}

}  // namespace
}  // namespace kelp::effect
