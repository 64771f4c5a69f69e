#include <gtest/gtest.h>

#include <functional>
#include <new>
#include <stdexcept>
#include <string>
#include <utility>
#include <vector>

#include "effect/entry.h"
#include "effect/handle.h"
#include "effect/host_text.h"
#include "effect/param_checkout.h"
#include "effect/suite.h"
#include "effect/world.h"
#include "tests/effect/fake_host.h"

namespace kelp::effect {
namespace {

// The code that was thrown, 0 if none.
HX_Err Thrown(const std::function<void()>& body) {
  try {
    body();
    return 0;
  } catch (std::int32_t code) {
    return code;
  }
}

class HostAccessTest : public testing::Test {
 protected:
  HostAccessTest() : context_{27, &host_.in, &host_.out, nullptr, nullptr, nullptr} {}
  ~HostAccessTest() override { EXPECT_EQ(host_.Leaks(), ""); }

  FakeHost host_;
  const HostContext context_;
};

TEST_F(HostAccessTest, EverySuiteMayBeRefused) {
  const struct {
    std::function<void()> acquire;
    const char* name;
    std::int32_t version;
  } suites[] = {
      {[&] { ScopedSuite<HX_ParamUtilsSuite3> suite(context_); }, "HX Param Utils Suite", 3},
      {[&] { ScopedSuite<HX_UtilitySuite> suite(context_, 3); }, "HX Utility Suite", 3},
      {[&] { ScopedSuite<HX_UtilitySuite> suite(context_, 4); }, "HX Utility Suite", 4},
      {[&] { ScopedSuite<HX_UtilitySuite> suite(context_, 5); }, "HX Utility Suite", 5},
      {[&] { ScopedSuite<HX_PrivateEffectSuite3> suite(context_); }, "HX OV Private Effect Suite",
       3},
      {[&] { ScopedSuite<HX_AppSuite6> suite(context_); }, "HX OV App Suite", 6},
      {[&] { ScopedSuite<HX_AdvAppSuite1> suite(context_); }, "HX OV Adv App Suite", 1},
      {[&] { ScopedSuite<HX_WorldSuite2> suite(context_); }, "HX World Suite", 2},
      {[&] { ScopedSuite<HX_StringSuite1> suite(context_); }, "Rushbase StringSuite", 1},
      {[&] { ScopedSuite<HX_AnalysisHostSuite1> suite(context_); }, "Analysis Host Suite", 1},
      {[&] { ScopedSuite<HX_StabilizerHostSuite7> suite(context_); }, "Stabilizer Host Suite", 7},
      {[&] { ScopedSuite<HX_OpaqueEffectDataSuite1> suite(context_); }, "Opaque Effect Data Suite",
       1},
      {[&] { ScopedSuite<HX_SequenceInfoSuite> suite(context_, 2); },
       "Rushbase Sequence Info Suite", 2},
      {[&] { ScopedSuite<HX_SequenceInfoSuite> suite(context_, 3); },
       "Rushbase Sequence Info Suite", 3},
      {[&] { ScopedSuite<HX_VideoSegmentSuite5> suite(context_); }, "Rushbase Video Segment Suite",
       5},
      {[&] { ScopedSuite<HX_VideoSegmentRenderSuite3> suite(context_); },
       "Rushbase Video Segment Render Suite", 3},
      {[&] { ScopedSuite<HX_CutPixSuite1> suite(context_); }, "Cutline CutPix Suite", 1},
      {[&] { ScopedSuite<HX_CutPixCacheSuite5> suite(context_); }, "Cutline CutPix Cache Suite", 5},
      {[&] { ScopedSuite<HX_BlurSuite1> suite(context_); }, "FLT Blur Suite", 1}};
  for (const auto& suite : suites) {
    host_.Offer(suite.name, suite.version, &host_);
    EXPECT_EQ(Thrown(suite.acquire), 0) << suite.name;
    EXPECT_FALSE(host_.ShowsMessage());
    host_.FailOperation(1);
    EXPECT_EQ(Thrown(suite.acquire), 13) << suite.name;
    EXPECT_EQ(host_.operations().back().name,
              "acquire " + std::string(suite.name) + " " + std::to_string(suite.version));
    EXPECT_STREQ(host_.out.return_msg, "Not able to acquire OVK Suite.");
    EXPECT_TRUE(host_.ShowsMessage());
    host_.Prepare();
  }
  host_.RefuseSuite("HX World Suite");
  EXPECT_EQ(Thrown([&] { ScopedSuite<HX_WorldSuite2> suite(context_, "No worlds."); }), 13);
  EXPECT_STREQ(host_.out.return_msg, "No worlds.");
}

TEST_F(HostAccessTest, AllIsGivenBackWhenAFailureUnwinds) {
  host_.params.resize(2);
  OwnedHandle kept(*host_.in.cb, 8);
  EXPECT_THROW(
      {
        const ScopedSuite<HX_PrivateEffectSuite3> outer(context_);
        const ScopedSuite<HX_PrivateEffectSuite3> inner(context_);
        const OwnedHandle handle(*host_.in.cb, 16);
        const HandleLock lock(*host_.in.cb, handle.get());
        const HandleLock again(*host_.in.cb, handle.get());
        EXPECT_EQ(lock.data(), again.data());
        const ParamCheckout param(context_, 1);
        const ScopedWorld world(context_, 4, 3, true, HX_FORMAT_BGRA8);
        throw std::runtime_error("in the middle");
      },
      std::runtime_error);
  EXPECT_EQ(host_.Leaks(), "handle of 8 bytes, 0 locks\n");
}

TEST_F(HostAccessTest, RefusalsOfEachKindAreTheHostsCodes) {
  OwnedHandle handle(*host_.in.cb, 8);
  const auto lock = [&] { HandleLock guard(*host_.in.cb, handle.get()); };
  const auto null_lock = [&] { HandleLock guard(*host_.in.cb, nullptr); };
  const auto undeclared = [&] { ParamCheckout param(context_, 1); };
  const auto checkout = [&] { ParamCheckout param(context_, 0); };
  const auto world = [&] { ScopedWorld guard(context_, 4, 3, true, HX_FORMAT_ARGBF); };
  EXPECT_EQ(Thrown(null_lock), 3);
  EXPECT_EQ(Thrown(undeclared), HX_ERR_UNKNOWN);
  host_.FailOperation(1);
  EXPECT_EQ(Thrown(lock), 3);
  host_.FailOperation(1);
  EXPECT_EQ(Thrown(checkout), FakeHost::kFault);
  host_.FailOperation(1);
  EXPECT_EQ(Thrown(world), 13);
  host_.FailOperation(2);
  EXPECT_EQ(Thrown(world), FakeHost::kFault);
  host_.FailOperation(1);
  EXPECT_FALSE(OwnedHandle(*host_.in.cb, 8));
  for (const auto& body : {std::function<void()>(lock), std::function<void()>(checkout),
                           std::function<void()>(world)}) {
    EXPECT_EQ(Thrown(body), 0);
  }
  host_.in.cb->dispose_handle(handle.release());
}

TEST_F(HostAccessTest, ParametersAreReadAtTheCallsTimeOrAnother) {
  HX_ParamDef slider{};
  slider.u.fs.value = 0.5;
  ASSERT_EQ(host_.in.cb->add_param(host_.in.effect_ref, -1, &slider), 0);
  host_.in.current_time = 7;
  EXPECT_EQ(ParamCheckout(context_, 1)->u.fs.value, 0.5);
  EXPECT_EQ(ParamCheckout(context_, 1, 30, 1, 25)->u.fs.value, 0.5);
  EXPECT_EQ(host_.checkout_times, (std::vector<std::int32_t>{7, 30}));
}

// Orders of a planned render: frame 5 alone was ordered.
int planned_in_use = 0;
HX_World planned_world{};
HX_Err CheckoutPixels(HX_EffectRef, std::int32_t id, HX_World** world) {
  if (id != 5) return 88;
  ++planned_in_use;
  *world = &planned_world;
  return 0;
}
HX_Err CheckinPixels(HX_EffectRef, std::int32_t id) {
  if (id == 5) --planned_in_use;
  return 0;
}

TEST_F(HostAccessTest, PlannedFramesAreCheckedInUnlessThereWereNone) {
  HX_RenderExtra render{};
  render.checkout_layer_pixels = CheckoutPixels;
  render.checkin_layer_pixels = CheckinPixels;
  HostContext context = context_;
  context.extra = &render;
  {
    const PlannedLayer layer(context, 5);
    EXPECT_EQ(layer.get(), &planned_world);
    EXPECT_EQ(planned_in_use, 1);
  }
  EXPECT_EQ(planned_in_use, 0);
  EXPECT_EQ(Thrown([&] { PlannedLayer layer(context, 6); }), 88);
  EXPECT_EQ(planned_in_use, 0);
}

class FailingEffect final : public GenericEffect {
 public:
  explicit FailingEffect(const HostContext& context) noexcept : GenericEffect(context) {}
  void RenderFrame() override { throw std::bad_alloc(); }
  void IdleTick() override { throw std::runtime_error("tick"); }
  void ReportOutOfMemory() override { ReportOutOfMemoryOnFrame(context(), 12); }
  void ReportUnknownException() override {
    ReportUnknownExceptionOnFrame(context(), 1234567890123);
  }
  HX_Err AddParam(std::int32_t) override { return HX_ERR_NONE; }
};

TEST_F(HostAccessTest, ReportsNameTheFrameAndFailQuietly) {
  const auto run = [&](std::uint32_t command) {
    return host_.Call(EffectMain<FailingEffect>, command);
  };
  EXPECT_EQ(run(11), 4);
  EXPECT_STREQ(host_.out.return_msg, "Calmframe out of memory on frame 12.");
  EXPECT_TRUE(host_.ShowsMessage());
  EXPECT_EQ(run(27), 1);
  EXPECT_STREQ(host_.out.return_msg, "unknown exception on frame 1234567890123 in Calmframe.");
  EXPECT_TRUE(host_.ShowsMessage());

  host_.FailOperation(1);
  EXPECT_EQ(run(11), 4);
  EXPECT_STREQ(host_.out.return_msg, "Not able to acquire OVK Suite.");
  host_.FailOperation(2);
  EXPECT_EQ(run(27), 1);
  EXPECT_STREQ(host_.out.return_msg, "");
  EXPECT_FALSE(host_.ShowsMessage());
}

TEST_F(HostAccessTest, MessagesEndBetweenCharactersWithinTheirRoom) {
  std::string long_text = "a", expected = "a";
  for (int i = 0; i < 200; ++i) long_text += "\xE2\x82\xAC";  // three bytes each
  for (int i = 0; i < 84; ++i) expected += "\xE2\x82\xAC";    // 253 of 255 bytes
  HX_OutData& out = host_.out;
  const HX_OutData before = [&] {
    out.num_params = 77;
    out.instance_handle = reinterpret_cast<HX_Handle>(0x5a5a);
    return out;
  }();
  ShowMessage(context_, long_text.c_str());
  EXPECT_EQ(out.return_msg, expected);
  EXPECT_TRUE(host_.ShowsMessage());
  EXPECT_EQ(out.instance_handle, before.instance_handle);

  char name[HX_PARAM_NAME_SIZE + 1];
  name[HX_PARAM_NAME_SIZE] = 'x';
  ConvertToHostText(context_, long_text, name, HX_PARAM_NAME_SIZE);
  EXPECT_EQ(name, expected.substr(0, 31));
  EXPECT_EQ(name[HX_PARAM_NAME_SIZE], 'x');
  host_.FailOperation(2);
  EXPECT_EQ(Thrown([&] { ConvertToHostText(context_, "x", name, HX_PARAM_NAME_SIZE); }),
            FakeHost::kFault);
  ConvertToHostText(context_, "", name, HX_PARAM_NAME_SIZE);
  EXPECT_STREQ(name, "");
}

}  // namespace
}  // namespace kelp::effect
