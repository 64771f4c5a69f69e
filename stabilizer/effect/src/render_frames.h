#pragma once

#include <boost/function.hpp>
#include <boost/make_shared.hpp>
#include <boost/shared_ptr.hpp>
#include <cstddef>
#include <cstdint>
#include <optional>
#include <utility>

#include "effect/host_context.h"
#include "effect/param_checkout.h"
#include "effect/suite.h"
#include "effect/world.h"
#include "stabilizer/effect/src/frame_time.h"
#include "stabilizer/render/source_frames.h"
#include "stabilizer/render/world_operations.h"

namespace kelp::effect {

using marrow::render::SourceFrames;
using marrow::render::WorldOperations;
using marrow::render::WorldX;

// Where a render gets its frames. They are the host's, and stay as long as their pointers. Failures
// are the host's codes, thrown.
class RenderFrames {
 public:
  virtual ~RenderFrames() = default;
  // The layer's frame at the render's own time; without data where the media has none.
  virtual boost::shared_ptr<HX_World> Input() = 0;
  // The frame of an absolute index of the analysis.
  virtual boost::shared_ptr<HX_World> Frame(std::int64_t frame) = 0;
};

// Of a direct render: what it asks for when it wants it.
class DirectFrames final : public RenderFrames {
 public:
  // The clock is asked for when it is needed, once.
  DirectFrames(const HostContext& context, boost::function<FrameClock()> clock)
      : context_(context), ask_clock_(std::move(clock)) {}

  boost::shared_ptr<HX_World> Input() override {
    return LayerOf(boost::make_shared<ParamCheckout>(context_, 0));
  }
  boost::shared_ptr<HX_World> Frame(std::int64_t frame) override {
    if (!clock_) clock_ = ask_clock_();
    const HostTime at = clock_->At(frame);
    return LayerOf(boost::make_shared<ParamCheckout>(context_, 0, at.time, at.step, at.scale));
  }

 private:
  static boost::shared_ptr<HX_World> LayerOf(const boost::shared_ptr<ParamCheckout>& checkout) {
    return {checkout, checkout->layer()};
  }

  const HostContext& context_;
  const boost::function<FrameClock()> ask_clock_;
  std::optional<FrameClock> clock_;
};

// Of a planned render: what its plan ordered, by absolute index.
class PlannedFrames final : public RenderFrames {
 public:
  // input_id: under which the plan ordered the frame of the render's own time.
  PlannedFrames(const HostContext& context, std::int32_t input_id)
      : context_(context), input_id_(input_id) {}

  boost::shared_ptr<HX_World> Input() override { return Frame(input_id_); }
  boost::shared_ptr<HX_World> Frame(std::int64_t frame) override {
    const auto layer = boost::make_shared<PlannedLayer>(context_, static_cast<std::int32_t>(frame));
    return {layer, layer->get()};
  }

 private:
  const HostContext& context_;
  const std::int32_t input_id_;
};

// A buffer of the host's as the renderer sees it; none where it has no pixels. Throws
// HX_ERR_UNKNOWN where its pixels can't be of that kind.
template <class Pixel>
WorldX<Pixel> PixelsOf(const HX_World& world) {
  const bool empty = !world.data || world.width < 1 || world.height < 1;
  if (empty) return {0, 0, 0, nullptr};
  if (world.row_bytes < static_cast<std::int64_t>(sizeof(Pixel)) * world.width) {
    throw std::int32_t{HX_ERR_UNKNOWN};
  }
  return {world.width, world.height, world.row_bytes, static_cast<Pixel*>(world.data)};
}

// The frames of a clip that was analysed from an absolute index on. One without pixels is a
// failure.
template <class Pixel>
class ClipFrames final : public SourceFrames<Pixel> {
 public:
  ClipFrames(RenderFrames& frames, std::int64_t first_frame)
      : frames_(frames), first_frame_(first_frame) {}

  boost::shared_ptr<const WorldX<Pixel>> fetch(std::size_t frame) override {
    struct Held {
      boost::shared_ptr<HX_World> world;
      WorldX<Pixel> pixels;
    };
    boost::shared_ptr<HX_World> world =
        frames_.Frame(first_frame_ + static_cast<std::int64_t>(frame));
    WorldX<Pixel> pixels = PixelsOf<Pixel>(*world);
    if (!pixels.data()) throw std::int32_t{HX_ERR_UNKNOWN};
    const auto held = boost::make_shared<Held>(Held{std::move(world), std::move(pixels)});
    return {held, &held->pixels};
  }

 private:
  RenderFrames& frames_;
  const std::int64_t first_frame_;
};

// What the host's own operations do for a render.
template <class Pixel>
class SuiteOperations final : public WorldOperations<Pixel> {
 public:
  explicit SuiteOperations(const HostContext& context) : context_(context) {}

  void TransferBehind(const WorldX<Pixel>& from, int x, int y, WorldX<Pixel>& to) override {
    const HX_World source = world_of(from);
    HX_World target = world_of(to);
    const HX_InData& in = *context_.in;
    ThrowIfFailed(
        in.cb->transfer(in.effect_ref, &source, &marrow::render::kBehind, nullptr, x, y, &target));
  }
  void Blur(const WorldX<Pixel>& from, WorldX<Pixel>& to, float radius) override {
    constexpr std::int32_t kPasses = 1, kMode = 110, kFlag = 1;
    const HX_World source = world_of(from);
    HX_World target = world_of(to);
    const ScopedSuite<HX_BlurSuite1> suite(context_);
    ThrowIfFailed(
        suite->Blur(context_.in->effect_ref, &source, &target, radius, kPasses, kMode, 0, kFlag));
  }

 private:
  const HostContext& context_;
};

}  // namespace kelp::effect
