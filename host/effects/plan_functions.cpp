#include "host/effects/interface_guard.h"
#include "host/effects/interface_tables.h"
#include "host/effects/layer_time.h"

namespace calmframe::host {
namespace {

// body(frames); an error outside of a render.
template <typename Body>
HX_Err WithFrames(const char* operation, HX_EffectRef effect, Body body) noexcept {
  return WithInstance(operation, effect, [&](Instance& instance) -> HX_Err {
    return instance.frames() ? body(*instance.frames()) : HX_ERR_UNKNOWN;
  });
}

HX_Err CheckoutLayer(HX_EffectRef effect, std::int32_t index, std::int32_t id,
                     const HX_RenderRequest* request, std::int32_t time, std::int32_t,
                     std::uint32_t time_scale, HX_CheckoutResult* result) {
  return WithFrames("plan.checkout_layer", effect, [&](RenderContext& frames) -> HX_Err {
    if (index != 0 || time_scale == 0) return HX_ERR_UNKNOWN;
    const LayerTime layer(frames.layer());
    return frames.Order(id, request->rect, layer.MediaTicks(time, time_scale), result);
  });
}

HX_Err CheckoutLayerPixels(HX_EffectRef effect, std::int32_t id, HX_World** world) {
  return WithFrames("render.checkout_layer_pixels", effect,
                    [&](RenderContext& frames) { return frames.CheckOutOrdered(id, world); });
}

// Not to be failed, as every giving back.
HX_Err CheckinLayerPixels(HX_EffectRef effect, std::int32_t id) {
  const std::shared_ptr<Instance> instance = FindInstance(effect);
  return instance && instance->frames() ? instance->frames()->CheckInOrdered(id) : HX_ERR_UNKNOWN;
}

HX_Err CheckoutOutput(HX_EffectRef effect, HX_World** world) {
  return WithFrames("render.checkout_output", effect, [&](RenderContext& frames) -> HX_Err {
    if (!frames.output()) return HX_ERR_UNKNOWN;
    *world = &frames.output()->world();
    return HX_ERR_NONE;
  });
}

}  // namespace

void SetPlanFunctions(HX_PlanExtra& plan) {
  plan.checkout_layer = CheckoutLayer;
}

void SetRenderFunctions(HX_RenderExtra& render) {
  render.checkout_layer_pixels = CheckoutLayerPixels;
  render.checkin_layer_pixels = CheckinLayerPixels;
  render.checkout_output = CheckoutOutput;
}

}  // namespace calmframe::host
