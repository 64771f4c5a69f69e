#include <gtest/gtest.h>

#include <vector>

#include "effect/parameter_row.h"
#include "tests/stabilizer/effect/shifted_clip.h"

namespace calmframe::host {
namespace {

// Seven frames of speeds 0 16 8 8 0 0 0: frame 3 takes from 5. One picture stands for all of them,
// so that what is taken agrees.
class ExperimentalDeblurTest : public ShiftedClipTest {
 protected:
  void SetUp() override {
    if (!kelp::effect::ShowsExperimentalParameters()) GTEST_SKIP();
    Solve({{0, 0}, {0, 0}, {16, 0}, {8, 0}, {8, 0}, {8, 0}, {8, 0}},
          {{kFraming, 4},
           {kSynthesisInputRange, 0.01},  // no margin of its own
           {kDeblur, 1},
           {kDeblurComparisonBlur, 2.5}},
          6, [](std::int64_t, int x, int y) { return Ramp(4, x, y); });
  }
  HX_Err Code(std::int64_t frame) { return hosted().Render(frame, 8, Path::direct).result.code; }
};

TEST_F(ExperimentalDeblurTest, APlanOrdersWhatMayBeTaken) {
  hosted().Set(kDeblurFrameRange, 2.9);
  EXPECT_EQ(OrdersOf(3), 5u);
  EXPECT_EQ(OrdersOf(1), 4u) << "nothing before the first";
  hosted().Set(kFraming, 1);
  EXPECT_EQ(OrdersOf(3), 5u);
  hosted().Set(kDeblurDebug, 6);
  hosted().Set(kAlignedFrame, -3);
  EXPECT_EQ(OrdersOf(3), 7u);
  hosted().Set(kDeblur, 0);
  EXPECT_EQ(OrdersOf(3), 1u);
}

TEST_F(ExperimentalDeblurTest, BothPathsTakeTheSharperFrameAtEveryDepth) {
  hosted().Set(kShowDeblurMap, 1);
  for (const int depth : {8, 16, 32}) {
    const auto names = HostedEffect::OperationsOf([&] { Draw(Whole(3, depth)); });
    EXPECT_EQ(std::count(names.begin(), names.end(), "Blur.Blur"), 2);
    const auto map = DrawBoth(Whole(3, depth));
    for (const int channel : {0, 1, 2, 3}) EXPECT_EQ(ChannelAt(*map, 30, 20, channel), 1);
    const int left = map->rect().left;
    EXPECT_EQ(ChannelAt(*map, left, 20, 1), 0) << "outside of the frame, which lies further right";
    EXPECT_EQ(ChannelAt(*map, left, 20, 0), 1);
  }
}

TEST_F(ExperimentalDeblurTest, AHostWithoutTheBlurIsTold) {
  Operations::Get().FailAlways("acquire " HX_BLUR_SUITE);
  EXPECT_EQ(Code(3), HX_ERR_MISSING_SUITE);
  EXPECT_EQ(hosted().Messages().at(0), "Not able to acquire OVK Suite.");
  EXPECT_EQ(Code(5), HX_ERR_NONE) << "which is slow";
  Operations::Get().FailNone();
  Operations::Get().FailAlways("Blur.Blur");
  EXPECT_EQ(Code(3), kFaultCode);
  Operations::Get().FailNone();
  EXPECT_EQ(Code(3), HX_ERR_NONE);
}

}  // namespace
}  // namespace calmframe::host
