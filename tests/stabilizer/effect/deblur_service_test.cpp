#include <gtest/gtest.h>

#include <boost/make_shared.hpp>
#include <cstdint>
#include <vector>

#include "stabilization/warp/frame_map.h"
#include "tests/stabilizer/effect/render_service_fixture.h"

namespace kelp::effect {
namespace {

using marrow::stabilization::point2;

// What the blur suite was asked; it copies.
struct BlurCalls {
  int count = 0;
  HX_Err answer = HX_ERR_NONE;
  static BlurCalls& Get() {
    static BlurCalls calls;
    return calls;
  }
};

HX_Err CopyAsBlur(HX_EffectRef, const HX_World* from, HX_World* to, float radius,
                  std::int32_t passes, std::int32_t mode, std::int32_t reserved,
                  std::int32_t flag) {
  ++BlurCalls::Get().count;
  EXPECT_EQ(radius, 2.5f);
  EXPECT_EQ(passes, 1);
  EXPECT_EQ(mode, 110);
  EXPECT_EQ(reserved, 0);
  EXPECT_EQ(flag, 1);
  for (const HX_World* world : {from, static_cast<const HX_World*>(to)}) {
    EXPECT_EQ(world->origin_x, 0);
    EXPECT_EQ(world->origin_y, 0);
  }
  for (int y = 0; y < from->height; ++y) {
    for (int x = 0; x < from->width; ++x) StoreFakePixel(*to, x, y, LoadFakePixel(*from, x, y));
  }
  return BlurCalls::Get().answer;
}

// Seven frames of speeds 0 8 4 7 3 0 0; every pair's motion is known. One picture stands for all
// frames, so that what is taken agrees.
class DeblurServiceTest : public RenderServiceTest {
 protected:
  void SetUp() override {
    using marrow::stabilization::CPWarper;
    using marrow::stabilization::MtoNMap;
    const double shifts[] = {0, 0, 8, 4, 1, 1, 1};
    std::vector<point2> points;
    MtoNMap::entries_t pairs;
    for (int n = 0; n < 7; ++n) {
      points.push_back({shifts[n], 0});
      for (int m = 0; m < 7; ++m) {
        if (m != n) pairs[{m, n}] = {1, 0, shifts[n], 0, 1, 0, 0, 0, 1};
      }
    }
    const auto warper =
        boost::const_pointer_cast<CPWarper>(ShiftingWarper(kWidth, kHeight, points));
    warper->setFrameMap(boost::make_shared<MtoNMap>(7, 6, pairs));
    test.Solved(warper, {});
    test.RenderCopy();
    SetFraming(Framing::synthesize_edges);
    test.Set(kSynthesisInputRangeIndex, 0.01);  // no margin of its own
    test.Set(kDeblurIndex, 1);
    test.Set(kDeblurComparisonBlurIndex, 2.5);
    static constexpr HX_BlurSuite1 kBlur = {CopyAsBlur};
    test.host.Offer(HX_BLUR_SUITE, HX_BLUR_SUITE_VERSION, &kBlur);
    BlurCalls::Get() = {};
    test.host.in.current_time = 3;
  }
};

TEST_F(DeblurServiceTest, APlanOrdersWhatMayBeTaken) {
  using Ids = std::vector<std::int32_t>;
  const auto ids = [&] {
    EXPECT_EQ(test.Plan({0, 0, 64, 48}, 8), HX_ERR_NONE);
    Ids found;
    for (const auto& order : test.orders) found.push_back(order.first);
    return found;
  };
  test.Set(kDeblurFrameRangeIndex, 2.9);
  EXPECT_EQ(ids(), (Ids{1, 2, 3, 4, 5}));
  SetFraming(Framing::crop);
  EXPECT_EQ(ids(), (Ids{1, 2, 3, 4, 5}));
  SetFraming(Framing::synthesize_edges);
  test.Set(kDeblurDebugIndex, static_cast<int>(DeblurDebug::aligned_frame));
  test.Set(kAlignedFrameIndex, -3);
  EXPECT_EQ(ids(), (Ids{0, 1, 2, 3, 4, 5, 6}));
  TestWorld output(kWidth, kHeight, 8);
  EXPECT_EQ(test.RenderPlan(output, 8), HX_ERR_NONE);
  test.Set(kDeblurIndex, 0);
  EXPECT_EQ(ids(), (Ids{3}));
}

TEST_F(DeblurServiceTest, BothPathsTakeTheSharperFrameAtEveryDepth) {
  test.Set(kShowDeblurMapIndex, 1);
  for (const std::int32_t depth : {8, 16, 32}) {
    UseDepth(depth);
    BlurCalls::Get() = {};
    ASSERT_EQ(test.Plan({-100, -100, 200, 200}, depth), HX_ERR_NONE);
    const HX_Rect& full = test.plan.full_rect;
    const int width = full.right - full.left, height = full.bottom - full.top;
    TestWorld planned(width, height, depth, full.left, full.top);
    ASSERT_EQ(test.RenderPlan(planned, depth), HX_ERR_NONE);
    EXPECT_EQ(BlurCalls::Get().count, 2);
    for (const int channel : {0, 1, 2, 3}) EXPECT_EQ(planned.At(30, 20, channel), 1);
    EXPECT_EQ(planned.At(0, 20, 1), 0) << "outside of the frame, which lies 4 to the right";
    EXPECT_EQ(planned.At(0, 20, 0), 1);
    if (depth == 32) continue;
    TestWorld direct(width, height, depth, full.left, full.top);
    ASSERT_EQ(RenderDirect(direct), HX_ERR_NONE);
    EXPECT_TRUE(direct == planned);
  }
}

TEST_F(DeblurServiceTest, AHostWithoutTheBlurIsTold) {
  TestWorld output(kWidth, kHeight, 8);
  test.host.RefuseSuite(HX_BLUR_SUITE);
  EXPECT_EQ(RenderDirect(output), HX_ERR_MISSING_SUITE);
  EXPECT_STREQ(test.host.out.return_msg, "Not able to acquire OVK Suite.");
  test.host.in.current_time = 5;  // which is slow
  EXPECT_EQ(RenderDirect(output), HX_ERR_NONE);
  test.host.OfferAllSuites();
  test.host.in.current_time = 3;
  BlurCalls::Get().answer = 77;
  EXPECT_EQ(RenderDirect(output), 77);
  BlurCalls::Get().answer = HX_ERR_NONE;
  EXPECT_EQ(RenderDirect(output), HX_ERR_NONE);
}

// What was taken is given back, or the fake host complains at its end.
TEST_F(DeblurServiceTest, EveryCallMayFail) {
  for (int n = 1; n < 500; ++n) {
    test.host.ForgetOperations();
    test.host.FailOperation(n);
    TestWorld output(kWidth, kHeight, 8);
    HX_Err code = test.Call(HX_CMD_PREPARE_FRAME);
    if (code == HX_ERR_NONE) code = test.Call(HX_CMD_RENDER_FRAME, output.get());
    const auto& operations = test.host.operations();
    if (operations.size() < static_cast<std::size_t>(n)) {
      EXPECT_EQ(code, HX_ERR_NONE);
      EXPECT_GE(test.host.Count("acquire FLT Blur Suite 1"), 2);
      test.host.FailOperation(0);
      return;
    }
    if (operations[static_cast<std::size_t>(n) - 1].name == "acquire FLT Blur Suite 1") {
      EXPECT_EQ(code, HX_ERR_MISSING_SUITE);
    }
  }
  FAIL() << "no end of host calls";
}

}  // namespace
}  // namespace kelp::effect
