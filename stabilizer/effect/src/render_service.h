#pragma once

#include <cstddef>
#include <cstdint>
#include <vector>

#include "stabilizer/effect/src/render_frames.h"
#include "stabilizer/effect/src/stabilizer_effect.h"
#include "stabilizer/render/output_rect.h"

namespace kelp::effect {

using marrow::render::OutputRect;

// The renderer of a solved state's warps at the host-in's scale.
Renderer RendererOf(const HX_InData& in, const StabilizerState& state);

// A render, on its own thread's instance, which took over what the user interface published before
// the frame was set up. For one call of the effect. Host codes are thrown.
class RenderService {
 public:
  explicit RenderService(StabilizerEffect& effect) : effect_(effect), context_(effect.context()) {}

  // The output of a render of the whole frame: that of the layer unless the frame can be rendered
  // and may reach beyond it.
  OutputRect SetUpOutput();
  // Orders the frames that RenderPlanned draws from, and answers for the output. A state and its
  // block that are not there yet are made first. Where the media has no frame for the layer's, both
  // paths leave the output clear, without a banner.
  void Plan(HX_PlanExtra& plan);
  void RenderPlanned(const HX_RenderExtra& extra);
  void RenderDirect(HX_World& output);

 private:
  // Frames on either side of the current one that a plan orders.
  std::int64_t PlanMargin(const StabilizerState& state);
  FrameClock ClockOf(const StabilizerState& state);
  // Without may_warp, and where the frame can't be rendered, the input is drawn.
  void Render(RenderFrames& frames, HX_World& output, std::int32_t depth, bool may_warp);
  template <class Pixel>
  bool RenderStabilized(RenderFrames& frames, HX_World& output);
  void SendPolygon(std::size_t frame, const std::vector<float>& polygon);

  StabilizerEffect& effect_;
  const HostContext& context_;
};

}  // namespace kelp::effect
