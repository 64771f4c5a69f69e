#pragma once

#include <gmock/gmock.h>

#include <boost/make_shared.hpp>
#include <cstdint>
#include <functional>
#include <map>
#include <memory>
#include <string>

#include "host/base/operations.h"
#include "host/effects/session.h"
#include "platform/hx/hx.h"
#include "tests/host/timeline/drawn_media.h"

namespace calmframe::host {

inline constexpr int kClipWidth = 23, kClipHeight = 20, kClipFrames = 10;

inline boost::shared_ptr<Layer> MakeDrawnLayer() {
  const SourceInfo info = DrawnInfo(kClipWidth, kClipHeight, kClipFrames);
  return boost::make_shared<Layer>(MakeDrawnSource(info, DrawFrame));
}

// A host of a plug-in that does at each command what the test wants; what it leaves behind or does
// wrong fails the test. One at a time.
class ProbeTest : public testing::Test {
 protected:
  struct Call {
    std::uint32_t command;
    HX_InData* in;
    HX_OutData* out;
    HX_ParamDef** params;
    HX_World* output;
    void* extra;
    const HX_Callbacks& cb() const { return *in->cb; }
    HX_EffectRef ref() const { return in->effect_ref; }
    // Goes back with the pointer.
    template <class Table>
    std::shared_ptr<const Table> Suite(const char* name, std::int32_t version) const {
      const void* table = nullptr;
      EXPECT_EQ(in->basic->acquire(name, version, &table), HX_ERR_NONE) << name;
      return {static_cast<const Table*>(table),
              [=, basic = in->basic](const Table*) { basic->release(name, version); }};
    }
  };
  using Deed = std::function<HX_Err(const Call&)>;

  ProbeTest() { current_ = this; }
  ~ProbeTest() override { current_ = nullptr; }
  void TearDown() override {
    Operations::Get().FailNone();
    if (host) {
      EXPECT_EQ(LeftBehind(), "");
    }
  }

  static PluginLibrary Probe() {
    PluginProperties record;
    record.match_name = "Probe";
    return PluginLibrary(
        [](std::uint32_t command, HX_InData* in, HX_OutData* out, HX_ParamDef* params[],
           HX_World* output, void* extra) -> HX_Err {
          const auto deed = current_->on.find(command);
          if (deed == current_->on.end()) return HX_ERR_NONE;
          return deed->second({command, in, out, params, output, extra});
        },
        record);
  }

  // Starts the plug-in.
  void Start() {
    host = std::make_unique<Host>(Probe());
    host->worlds().SetRowPadding(8);
    host->handles().MoveOnUnlock(true);
    session = std::make_unique<Session>(*host);
  }
  // What the plug-in holds, and did wrong, when all is gone.
  std::string LeftBehind() {
    session.reset();
    EXPECT_TRUE(host->Stop().ok());
    const std::string report = host->LeakReport();
    host.reset();
    return report;
  }

  std::map<std::uint32_t, Deed> on;  // by command; none: it does nothing
  std::unique_ptr<Host> host;
  std::unique_ptr<Session> session;

 private:
  static inline ProbeTest* current_ = nullptr;
};

// An effect that shows its input, or another frame, in the middle of an output that may be larger.
class FrameProbe : public ProbeTest {
 protected:
  FrameProbe() {
    on[HX_CMD_PREPARE_FRAME] = [this](const Call& call) -> HX_Err {
      call.out->width = call.params[0]->u.ld.width + 2 * margin;
      call.out->height = call.params[0]->u.ld.height + 2 * margin;
      call.out->origin_x = call.out->origin_y = margin;
      return HX_ERR_NONE;
    };
    on[HX_CMD_RENDER_FRAME] = [this](const Call& call) -> HX_Err {
      if (offset == 0) return Draw(call, call.params[0]->u.ld, call.output);
      const HX_InData& in = *call.in;
      HX_ParamDef input{};
      HX_Err code = call.cb().checkout_param(call.ref(), 0, in.current_time + offset * in.time_step,
                                             in.time_step, in.time_scale, &input);
      if (code != HX_ERR_NONE) return code;
      code = input.u.ld.data ? Draw(call, input.u.ld, call.output) : HX_Err{HX_ERR_UNKNOWN};
      call.cb().checkin_param(call.ref(), &input);
      return code;
    };
    on[HX_CMD_PLAN_FRAME] = [this](const Call& call) -> HX_Err {
      auto& plan = *static_cast<HX_PlanExtra*>(call.extra);
      const HX_InData& in = *call.in;
      HX_CheckoutResult results[3] = {};
      HX_Err code = HX_ERR_NONE;
      // Twice each: the second order widens the first.
      for (const HX_Rect& wanted : {HX_Rect{1, 1, 2, 2}, HX_Rect{0, 0, 1 << 15, 1 << 15}}) {
        for (int id = -1; id <= 1 && code == HX_ERR_NONE; ++id) {
          const HX_RenderRequest request{wanted, plan.request.bit_depth};
          code =
              plan.checkout_layer(call.ref(), 0, id, &request, in.current_time + id * in.time_step,
                                  in.time_step, in.time_scale, &results[1 + id]);
        }
      }
      const auto& [left, top, right, bottom] = results[1].full_rect;
      plan.full_rect = {left - margin, top - margin, right + margin, bottom + margin};
      plan.result_rect = plan.full_rect;
      plan.may_exceed = margin > 0;
      return code;
    };
    on[HX_CMD_RENDER_PLANNED_FRAME] = [this](const Call& call) -> HX_Err {
      const auto& render = *static_cast<HX_RenderExtra*>(call.extra);
      HX_World *output = nullptr, *input = nullptr;
      render.checkout_output(call.ref(), &output);
      HX_Err code = render.checkout_layer_pixels(call.ref(), offset, &input);
      if (code != HX_ERR_NONE) return code;
      code = Draw(call, *input, output);
      render.checkin_layer_pixels(call.ref(), offset);
      return code;
    };
  }

  // Layer (0, 0) of `from` lies at its origin; so it does in `to`.
  static HX_Err Draw(const Call& call, const HX_World& from, HX_World* to) {
    const std::int32_t x = from.origin_x - to->origin_x, y = from.origin_y - to->origin_y;
    const HX_Rect place = {x, y, x + from.width, y + from.height};
    return call.cb().copy_world(call.ref(), &from, to, nullptr, &place);
  }

  int margin = 0, offset = 0;  // pixels on each side; frames
};

}  // namespace calmframe::host
