// Plug-ins that misbehave.

#include <stdexcept>
#include <vector>

#include "platform/hx/hx_suites.h"
#include "tests/host/effects/probe_test.h"

namespace calmframe::host {
namespace {

class FaultsTest : public FrameProbe {
 protected:
  // An effect on a layer, and a frame by each path.
  void Play() {
    Effect& effect = session->Apply(MakeDrawnLayer());
    const auto renderer = effect.MakeRenderer();
    direct = renderer->Direct({3}).result;
    planned = renderer->Planned({3}).result;
  }
  static HX_Err Refuse(const Call&) { return 77; }

  CommandResult direct, planned;
};

TEST_F(FaultsTest, WhatAPlugInKeepsOrDoesWrongIsTold) {
  static const char* const kTexts[] = {"$$$/A=B", nullptr};
  static const HX_StringTable kTable = {2, 7, kTexts};
  const auto usual = on;
  const struct {
    const char* told;
    std::uint32_t command;
    std::function<void(const Call&)> deed;
  } misdeeds[] = {
      {"1 of handle left\n1 of handle lock left\n", HX_CMD_STOP_PLUGIN,
       [](const Call& call) { call.cb().lock_handle(call.cb().new_handle(8)); }},
      {"1 of handle left\nDestroyInstance: the handle is still there\n", HX_CMD_CREATE_INSTANCE,
       [](const Call& call) { call.out->instance_handle = call.cb().new_handle(8); }},
      {"1 of world left\n", HX_CMD_RENDER_FRAME,
       [](const Call& call) {
         HX_World world;
         call.Suite<HX_WorldSuite2>(HX_WORLD_SUITE, 2)
             ->NewWorld(call.ref(), 3, 2, 1, HX_FORMAT_ARGB16, &world);
       }},
      {"1 of opaque data use left\n", HX_CMD_CREATE_INSTANCE,
       [](const Call& call) {
         void* winner = nullptr;
         call.Suite<HX_OpaqueEffectDataSuite1>(HX_OPAQUE_EFFECT_DATA_SUITE, 1)
             ->Set(7, &winner, &winner);
       }},
      {"1 of parameter checkout left\ncheckout_param: a frame was not checked in\n",
       HX_CMD_RENDER_FRAME,
       [](const Call& call) {
         HX_ParamDef input;
         call.cb().checkout_param(call.ref(), 0, 0, 1, 25, &input);
       }},
      {"-1 of parameter checkout left\ncheckin_param: a frame that is not checked out\n",
       HX_CMD_RENDER_FRAME,
       [](const Call& call) { call.cb().checkin_param(call.ref(), call.params[0]); }},
      {"1 of direct render left\n", HX_CMD_RENDER_FRAME,
       [](const Call& call) { call.cb().utility(call.ref(), HX_UTILITY_BEGIN_RENDER, kTexts); }},
      {"1 of string table left\n", HX_CMD_START_PLUGIN,
       [](const Call& call) {
         std::uint64_t token = 0;
         call.cb().open_strings(nullptr, 7, &kTable, &token);
         EXPECT_STREQ(call.cb().get_string(token, 0, 0, 0), "B");
         EXPECT_EQ(call.cb().get_string(token, 1, 0, 0), nullptr);
       }},
      {"close_strings: not open\n", HX_CMD_STOP_PLUGIN,
       [](const Call& call) { call.cb().close_strings(99); }},
      {"1 of segments left\n", HX_CMD_CREATE_INSTANCE,
       [](const Call& call) {
         HX_Segments segments = 0;
         const auto sequence = call.Suite<HX_SequenceInfoSuite>(HX_SEQUENCE_INFO_SUITE, 3);
         EXPECT_EQ(sequence->AcquireSegments(call.ref(), &segments), HX_ERR_NONE);
       }},
      {"1 of suite HX World Suite left\n", HX_CMD_CREATE_INSTANCE,
       [](const Call& call) {
         const void* table = nullptr;
         EXPECT_EQ(call.in->basic->acquire("HX World Suite", 3, &table), HX_ERR_MISSING_SUITE);
         EXPECT_EQ(call.in->basic->acquire("HX World Suite", 2, &table), HX_ERR_NONE);
       }},
      {"HX World Suite: given back but not held\n", HX_CMD_CREATE_INSTANCE,
       [](const Call& call) { call.in->basic->release("HX World Suite", 2); }},
      {"entry: an exception came out\n", HX_CMD_CREATE_INSTANCE,
       [](const Call&) { throw std::runtime_error("not caught"); }},
      {"plan.checkout_layer: one id for two times\n", HX_CMD_PLAN_FRAME,
       [&](const Call& call) {
         call.in->current_time += call.in->time_step;
         EXPECT_EQ(usual.at(HX_CMD_PLAN_FRAME)(call), HX_ERR_UNKNOWN);
       }},
      {"render.checkout_layer_pixels: a frame was not checked in\n", HX_CMD_RENDER_PLANNED_FRAME,
       [](const Call& call) {
         HX_World* world = nullptr;
         const auto& render = *static_cast<HX_RenderExtra*>(call.extra);
         EXPECT_EQ(render.checkout_layer_pixels(call.ref(), 0, &world), HX_ERR_NONE);
         EXPECT_NE(render.checkout_layer_pixels(call.ref(), 8, &world), HX_ERR_NONE);
       }},
      {"render.checkin_layer_pixels: a frame that is not checked out\n",
       HX_CMD_RENDER_PLANNED_FRAME,
       [](const Call& call) {
         static_cast<HX_RenderExtra*>(call.extra)->checkin_layer_pixels(call.ref(), 0);
       }},
      {"output: written behind its rows\n", HX_CMD_RENDER_FRAME,
       [](const Call& call) {
         static_cast<std::uint8_t*>(call.output->data)[4 * call.output->width] = 0;
       }},
  };
  for (const auto& misdeed : misdeeds) {
    SCOPED_TRACE(misdeed.told);
    on = usual;
    on[misdeed.command] = [&, deed = on[misdeed.command]](const Call& call) -> HX_Err {
      const HX_Err code = deed ? deed(call) : HX_ERR_NONE;
      misdeed.deed(call);
      return code;
    };
    Start();
    Play();
    EXPECT_EQ(LeftBehind(), misdeed.told);
  }
}

TEST_F(FaultsTest, AnswersThatMakeNoFrameAreErrors) {
  const auto say = [](const Call& call) {
    call.out->out_flags |= HX_OUT_FLAG_SHOW_MESSAGE;
    call.cb().copy_text(call.out->return_msg, HX_RETURN_MSG_SIZE, "No room.");
    return HX_ERR_MEMORY;
  };
  const auto grow = [](const Call& call) {
    call.out->width = (1 << 17) + 1;
    call.out->height = 1;
    return HX_ERR_NONE;
  };
  const auto exceed = [](const Call& call) {
    auto& plan = *static_cast<HX_PlanExtra*>(call.extra);
    plan.result_rect = {-(1 << 30), 0, 1 << 30, 1};
    plan.may_exceed = 1;
    return HX_ERR_NONE;
  };
  // 2^28 pixels.
  const auto spread = [](const Call& call) {
    call.out->width = call.out->height = 1 << 14;
    return HX_ERR_NONE;
  };
  const auto flood = [](const Call& call) {
    auto& plan = *static_cast<HX_PlanExtra*>(call.extra);
    plan.result_rect = {0, 0, 1 << 14, 1 << 14};
    plan.may_exceed = 1;
    return HX_ERR_NONE;
  };
  const std::string unknown = "it: the plug-in answered " + std::to_string(HX_ERR_UNKNOWN);
  const struct {
    Deed prepare, plan;
    std::string line;
  } cases[] = {{Refuse, Refuse, "it: the plug-in answered 77"},
               {say, say, "it: No room."},
               {grow, exceed, unknown},
               {spread, flood, unknown}};
  for (const auto& c : cases) {
    on = {{HX_CMD_PREPARE_FRAME, c.prepare}, {HX_CMD_PLAN_FRAME, c.plan}};
    Start();
    Play();
    EXPECT_EQ(direct.Line("it"), c.line);
    EXPECT_EQ(planned.Line("it"), c.line);
    EXPECT_EQ(LeftBehind(), "");
  }
}

TEST_F(FaultsTest, AStartThatFailsIsToldAndLeavesNothing) {
  const auto miscount = [](const Call& call) -> HX_Err {
    call.out->num_params = 3;
    return HX_ERR_NONE;
  };
  const auto make = [](const Call& call) -> HX_Err {
    return call.cb().new_handle(8) ? HX_ERR_NONE : HX_ERR_MEMORY;
  };
  const struct {
    std::uint32_t command;
    Deed deed;
    std::string told;
  } cases[] = {
      {HX_CMD_START_PLUGIN, Refuse, "Probe: the plug-in answered 77"},
      {HX_CMD_START_PLUGIN, make, "Probe: the plug-in answered " + std::to_string(HX_ERR_MEMORY)},
      {HX_CMD_DECLARE_PARAMS, Refuse, "Probe: the plug-in answered 77"},
      {HX_CMD_DECLARE_PARAMS, miscount, "Probe: tells of 3 parameters and declares 1"}};
  Operations::Get().FailAlways("new_handle");
  for (const auto& c : cases) {
    on = {{c.command, c.deed}};
    EXPECT_THAT([&] { Start(); }, testing::ThrowsMessage<PluginError>(c.told));
    EXPECT_EQ(Host::calling(), nullptr);
    EXPECT_EQ(Ledger::Get().Report(), "");
  }
  Operations::Get().FailNone();
  on.clear();
  Start();
}

TEST_F(FaultsTest, TextsAreCutBetweenCharacters) {
  on[HX_CMD_IDLE_TICK] = [](const Call& call) -> HX_Err {
    std::uint16_t name[6] = {7, 7, 7, 7, 7, 7};
    const std::uint16_t film[] = {u'a', 0xD83C, 0xDFA5, 0};
    char bytes[5] = {};
    const auto utility = call.Suite<HX_UtilitySuite>(HX_UTILITY_SUITE, 5);
    EXPECT_EQ(utility->GetLayerName(call.ref(), name, 5), HX_ERR_NONE);
    EXPECT_EQ(std::vector(name, name + 6), (std::vector<std::uint16_t>{'a', 'b', 'c', 0, 7, 7}));
    const auto own = call.Suite<HX_PrivateEffectSuite3>(HX_PRIVATE_EFFECT_SUITE, 3);
    EXPECT_EQ(own->ConvertText(film, bytes, 5), HX_ERR_NONE);
    EXPECT_STREQ(bytes, "a");
    return 33;
  };
  Start();
  const auto layer = MakeDrawnLayer();
  layer->Change([](LayerState& state) { state.name = "abc\xF0\x9F\x8E\xA5"; });
  EXPECT_EQ(session->Apply(layer).Tick().code, 33) << "as it ran";
}

}  // namespace
}  // namespace calmframe::host
