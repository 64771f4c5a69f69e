#pragma once

#include <gtest/gtest.h>

#include <boost/shared_ptr.hpp>
#include <cstdint>
#include <utility>

#include "stabilizer/effect/src/stabilizer_effect.h"
#include "tests/effect/fake_pixels.h"
#include "tests/stabilizer/effect/stabilizer_host.h"

namespace kelp::effect {

inline constexpr int kWidth = 64, kHeight = 48;

// Two frames, the second moved by (10, 6): the outlines' union is (0, 0) to (73, 53), so a plane of
// 73 x 53 whose surplus of 9 x 5 puts the layer at trunc(4.5), trunc(2.5) = (4, 2) of the output.
class RenderServiceTest : public ::testing::Test {
 protected:
  RenderServiceTest() : source_(kWidth, kHeight, 8) { UseDepth(8); }

  void UseDepth(std::int32_t depth) {
    source_ = TestWorld(kWidth, kHeight, depth);
    for (int y = 0; y < kHeight; ++y) {
      for (int x = 0; x < kWidth; ++x) source_.Set(x, y, x / 100.0, y / 100.0);
    }
    test.host.params[0].u.ld = *source_.get();
    test.pixels = source_.get();
  }
  void Solve(boost::shared_ptr<const cropper> crop = {}) {
    test.Solved(ShiftingWarper(kWidth, kHeight, {{0, 0}, {10, 6}}), std::move(crop));
    test.RenderCopy();
  }
  void SetFraming(Framing framing) { test.Set(kFramingIndex, static_cast<int>(framing)); }
  void ExpectRect(const HX_Rect& rect, int left, int top, int right, int bottom) {
    EXPECT_EQ(rect.left, left);
    EXPECT_EQ(rect.top, top);
    EXPECT_EQ(rect.right, right);
    EXPECT_EQ(rect.bottom, bottom);
  }
  // The direct path, over the whole output.
  HX_Err RenderDirect(TestWorld& output) {
    EXPECT_EQ(test.Call(HX_CMD_PREPARE_FRAME), HX_ERR_NONE);
    return test.Call(HX_CMD_RENDER_FRAME, output.get());
  }
  // Of the red ramp: source column x has x / 100.
  void ExpectColumn(const TestWorld& world, int x, int y, double column, double tolerance) {
    EXPECT_NEAR(100 * world.At(x, y, 1), column, tolerance) << x << ", " << y;
    EXPECT_NEAR(world.At(x, y, 0), 1, tolerance);
  }

  StabilizerHost test;
  TestWorld source_;
};

}  // namespace kelp::effect
