#pragma once

#include <cstdint>

#include "effect/suite.h"

namespace kelp::effect {

// For a host's transfer(): over what is there, at full opacity, straight alpha.
inline constexpr HX_TransferMode kOver{HX_TRANSFER_IN_FRONT, 0, 255, 0, 32768};

// A frame buffer of the effect's own, for its scope; holds its suite as long. Throws the host's
// code when it can't be had.
class ScopedWorld {
 public:
  ScopedWorld(const HostContext& context, std::int32_t width, std::int32_t height, bool clear,
              std::uint32_t format)
      : suite_(context), effect_(context.in->effect_ref) {
    ThrowIfFailed(suite_->NewWorld(effect_, width, height, clear, format, &world_));
  }
  ~ScopedWorld() { suite_->DisposeWorld(effect_, &world_); }
  ScopedWorld(const ScopedWorld&) = delete;
  ScopedWorld& operator=(const ScopedWorld&) = delete;

  HX_World* get() { return &world_; }
  HX_World* operator->() { return &world_; }

 private:
  ScopedSuite<HX_WorldSuite2> suite_;
  const HX_EffectRef effect_;
  HX_World world_{};
};

// The pixels of a frame that the plan of this render ordered, for its scope; the context's extra is
// an HX_RenderExtra. Throws the host's code where there are none.
class PlannedLayer {
 public:
  PlannedLayer(const HostContext& context, std::int32_t id)
      : host_(*static_cast<const HX_RenderExtra*>(context.extra)),
        effect_(context.in->effect_ref),
        id_(id) {
    ThrowIfFailed(host_.checkout_layer_pixels(effect_, id, &world_));
  }
  ~PlannedLayer() { host_.checkin_layer_pixels(effect_, id_); }
  PlannedLayer(const PlannedLayer&) = delete;
  PlannedLayer& operator=(const PlannedLayer&) = delete;

  HX_World* get() const { return world_; }
  HX_World* operator->() const { return world_; }

 private:
  const HX_RenderExtra& host_;
  const HX_EffectRef effect_;
  const std::int32_t id_;
  HX_World* world_ = nullptr;
};

}  // namespace kelp::effect
