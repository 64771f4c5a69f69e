#pragma once

#include <cstdint>

#include "effect/host_context.h"

namespace kelp::effect {

// A copy of a parameter at a time, for its scope; of index 0, the layer's frame. Throws the host's
// code when there is none. A code of the checkin is dropped: what was read stands.
class ParamCheckout {
 public:
  // At the call's own time.
  ParamCheckout(const HostContext& context, std::int32_t index)
      : ParamCheckout(context, index, context.in->current_time, context.in->time_step,
                      context.in->time_scale) {}
  ParamCheckout(const HostContext& context, std::int32_t index, std::int32_t time,
                std::int32_t time_step, std::uint32_t time_scale)
      : in_(*context.in) {
    ThrowIfFailed(
        in_.cb->checkout_param(in_.effect_ref, index, time, time_step, time_scale, &param_));
  }
  ~ParamCheckout() { in_.cb->checkin_param(in_.effect_ref, &param_); }
  ParamCheckout(const ParamCheckout&) = delete;
  ParamCheckout& operator=(const ParamCheckout&) = delete;

  const HX_ParamDef& operator*() const { return param_; }
  const HX_ParamDef* operator->() const { return &param_; }
  HX_World* layer() { return &param_.u.ld; }

 private:
  const HX_InData& in_;
  HX_ParamDef param_{};
};

}  // namespace kelp::effect
