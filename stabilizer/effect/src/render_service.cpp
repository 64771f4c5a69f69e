#include <algorithm>
#include <vector>

#include "analysis/effect/analysis_ui_data.h"
#include "analysis/effect/banner.h"
#include "analysis/effect/effect_parameters.h"
#include "analysis/src/read_job_input.h"
#include "effect/suite.h"
#include "platform/hx/hx_exports.h"
#include "stabilizer/effect/src/fcd_table.h"
#include "stabilizer/effect/src/parameter_table.h"
#include "stabilizer/effect/src/stabilizer_effect.h"
#include "stabilizer/render/cp_warper_warps.h"
#include "stabilizer/render/frame_renderer.h"

// StabilizerEffect's renders. Each works on the state of its own thread's instance, which took over
// what the user interface published before the frame was set up.
namespace kelp::effect {

using analysis::FrameStatus;
using analysis::effect::CurrentFrame;
using analysis::effect::EffectParameters;
using analysis::effect::StatusRecord;
using marrow::render::CPWarperWarps;

namespace {

// Side of the layer at the render's scale.
std::int32_t ScaledSide(std::int32_t side, const HX_Ratio& ratio) {
  if (ratio.num <= 0 || ratio.den == 0) return side;
  const std::int64_t scaled =
      (std::int64_t{side} * ratio.num + ratio.den - 1) / std::int64_t{ratio.den};
  return static_cast<std::int32_t>(std::min<std::int64_t>(scaled, 1 << 30));
}

double ValueOfRatio(const HX_Ratio& ratio) {
  return ratio.num > 0 && ratio.den > 0 ? static_cast<double>(ratio.num) / ratio.den : 1.0;
}

OutputRect InputRect(const HX_InData& in) {
  return {ScaledSide(in.width, in.downsample_x), ScaledSide(in.height, in.downsample_y), 0, 0};
}

HX_Rect Intersection(const HX_Rect& a, const HX_Rect& b) {
  const std::int32_t left = std::max(a.left, b.left), top = std::max(a.top, b.top);
  return {left, top, std::max(std::min(a.right, b.right), left),
          std::max(std::min(a.bottom, b.bottom), top)};
}

HX_Rect ExtentInLayer(const HX_World& world) {
  return {world.origin_x, world.origin_y, world.origin_x + world.width,
          world.origin_y + world.height};
}

HX_Rect MovedIntoWorld(const HX_Rect& rect, const HX_World& world) {
  return {rect.left - world.origin_x, rect.top - world.origin_y, rect.right - world.origin_x,
          rect.bottom - world.origin_y};
}

template <class Visit>
void ForDepth(std::int32_t depth, const Visit& visit) {
  switch (depth) {
    case 8:
      return visit(HX_Pixel8());
    case 16:
      return visit(HX_Pixel16());
    case 32:
      return visit(HX_PixelFloat());
    default:
      return;
  }
}

void ClearWorld(HX_World& world, std::int32_t depth) {
  ForDepth(depth, [&](auto pixel) { PixelsOf<decltype(pixel)>(world).clear(); });
}

// What of the input lies in the output, at its place.
void CopyInput(const HostContext& context, const HX_World& input, HX_World& output,
               std::int32_t depth) {
  ClearWorld(output, depth);
  if (!input.data || !output.data) return;
  const HX_Rect common = Intersection(ExtentInLayer(input), ExtentInLayer(output));
  if (common.right <= common.left || common.bottom <= common.top) return;
  const HX_Rect from = MovedIntoWorld(common, input), to = MovedIntoWorld(common, output);
  ThrowIfFailed(context.in->cb->copy_world(context.in->effect_ref, &input, &output, &from, &to));
}

// Tells the host of a direct render's beginning and end.
class DirectRender {
 public:
  explicit DirectRender(const HostContext& context) : in_(*context.in) {
    ThrowIfFailed(in_.cb->utility(in_.effect_ref, HX_UTILITY_BEGIN_RENDER, HXp_G_fcd_table));
  }
  ~DirectRender() { in_.cb->utility(in_.effect_ref, HX_UTILITY_END_RENDER, nullptr); }
  DirectRender(const DirectRender&) = delete;
  DirectRender& operator=(const DirectRender&) = delete;

 private:
  const HX_InData& in_;
};

}  // namespace

Renderer StabilizerEffect::MakeRenderer(const StabilizerState& state) const {
  const HX_InData& in = *context().in;
  const double pixel_aspect = static_cast<double>(state.solve_result->warper->frameWidth()) /
                              std::max(state.source.width, std::int32_t{1});
  return marrow::render::makeRenderer(
      CPWarperWarps(state.solve_result->warper),
      static_cast<float>(ValueOfRatio(in.downsample_x) / pixel_aspect),
      static_cast<float>(ValueOfRatio(in.downsample_y)));
}

OutputRect StabilizerEffect::SetUpOutput() {
  const OutputRect input = InputRect(*context().in);
  const auto framing = static_cast<Framing>(GetPopupParam(kFramingIndex));
  const StabilizerState* const state = GetState();
  if (IsOneByOne() || !state || !state->solve_result->warper || crops(framing) ||
      !IsRenderableFrame()) {
    return input;
  }
  return setupOutputRect(framing, MakeRenderer(*state), input.width, input.height);
}

void StabilizerEffect::PrepareFrame() {
  if (StabilizerState* const state = GetState()) state->TakeOver();
  const OutputRect output = SetUpOutput();
  context().out->width = output.width;
  context().out->height = output.height;
  context().out->origin_x = output.origin_x;
  context().out->origin_y = output.origin_y;
}

// -- The planned path --

std::int64_t StabilizerEffect::PlanMargin(const StabilizerState& state) {
  const EffectParameters params(*this);
  return std::max<std::int64_t>(MarginInFrames(params, state.FrameRate()),
                                deblurReach(GetRenderSettings(params).deblur));
}

FrameClock StabilizerEffect::ClockOf(const StabilizerState& state) {
  const analysis::JobInput present = analysis::ReadJobInput(context().in, context().out);
  const std::int64_t start = analysis::FloorSteps(present.StartTime, present.StepTime);
  return {analysis::CountsFields(state.result->job_input) ? 2 * start : start,
          analysis::RowDuration(state.result->job_input)};
}

void StabilizerEffect::PlanFrame() {
  if (!context().extra) return;
  auto& plan = *static_cast<HX_PlanExtra*>(context().extra);
  const HX_InData& in = *context().in;
  plan.solid = plan.may_exceed = 0;
  HX_CheckoutResult input{};
  const auto order_input = [&](std::int32_t id, const HX_RenderRequest& request) {
    ThrowIfFailed(plan.checkout_layer(in.effect_ref, 0, id, &request, in.current_time, in.time_step,
                                      in.time_scale, &input));
  };
  if (IsOneByOne()) {
    order_input(0, plan.request);
    plan.result_rect = input.result_rect;
    plan.full_rect = input.full_rect;
    return;
  }
  if (!GetState()) CreateStateInHandle(in.instance_handle, true);
  AttachSharedData(true);
  StabilizerState& state = *GetState();
  state.TakeOver();

  const OutputRect layer = InputRect(in);
  const HX_RenderRequest whole{{0, 0, layer.width, layer.height}, plan.request.bit_depth};
  const CurrentFrame current = GetCurrentFrame(true);
  state.planned_input = current.valid ? static_cast<std::int32_t>(current.frame) : 0;
  state.planned_warp = current.valid && IsRenderableFrame();
  if (state.planned_warp) {
    const FrameClock clock = ClockOf(state);
    const std::int64_t margin = PlanMargin(state);
    const std::int64_t first =
        std::max<std::int64_t>({current.frame - margin, state.table().first_frame, 0});
    const std::int64_t end =
        std::min<std::int64_t>(current.frame + margin + 1,
                               std::int64_t{state.table().first_frame} + state.table().frame_count);
    for (std::int64_t frame = first; frame < end; ++frame) {
      const HostTime at = clock.At(frame);
      ThrowIfFailed(plan.checkout_layer(in.effect_ref, 0, static_cast<std::int32_t>(frame), &whole,
                                        at.time, at.step, at.scale, &input));
    }
  } else {
    order_input(state.planned_input, whole);
  }

  const OutputRect output = SetUpOutput();
  plan.full_rect = {-output.origin_x, -output.origin_y, output.width - output.origin_x,
                    output.height - output.origin_y};
  if (crops(static_cast<Framing>(GetPopupParam(kFramingIndex)))) {
    plan.result_rect = plan.full_rect;
    plan.may_exceed = 1;
  } else {
    plan.result_rect = Intersection(plan.full_rect, plan.request.rect);
  }
}

void StabilizerEffect::RenderPlannedFrame() {
  if (!context().extra) return;
  const auto& extra = *static_cast<const HX_RenderExtra*>(context().extra);
  const std::int32_t depth = extra.request.bit_depth;
  if (depth != 8 && depth != 16 && depth != 32) return;
  HX_World* output = nullptr;
  ThrowIfFailed(extra.checkout_output(context().in->effect_ref, &output));
  const StabilizerState* const state = GetState();
  PlannedFrames frames(context(), state && !IsOneByOne() ? state->planned_input : 0);
  Render(frames, *output, depth, state && state->planned_warp);
}

// -- The direct path --

void StabilizerEffect::RenderFrame() {
  if (!context().output) return;
  const DirectRender render(context());
  DirectFrames frames(context(), [this] { return ClockOf(*GetState()); });
  Render(frames, *context().output, context().output->flags & HX_WORLD_DEEP ? 16 : 8, true);
}

// -- What both draw --

void StabilizerEffect::Render(RenderFrames& frames, HX_World& output, std::int32_t depth,
                              bool may_warp) {
  const auto pass_through = [&] { CopyInput(context(), *frames.Input(), output, depth); };
  if (IsOneByOne()) return pass_through();
  if (ShowsOverlay()) {
    pass_through();
    return analysis::effect::AnalysisUIData(*this).Draw({}, {}, output);
  }
  const StatusRecord record = GetStatusRecord();
  bool stabilized = false;
  if (may_warp && IsRenderableFrame()) {
    ForDepth(depth,
             [&](auto pixel) { stabilized = RenderStabilized<decltype(pixel)>(frames, output); });
  }
  if (!stabilized) pass_through();
  if (stabilized && record.status == FrameStatus::Ready) return;
  if (!IsBannerHidden()) analysis::effect::DrawBanner(*this, record, output);
}

template <class Pixel>
bool StabilizerEffect::RenderStabilized(RenderFrames& frames, HX_World& output) {
  const StabilizerState& state = *GetState();
  const CurrentFrame current = GetCurrentFrame(true);
  const std::int64_t row = current.frame - state.table().first_frame;
  if (!state.solve_result->warper || !current.valid || row < 0) return false;
  const auto frame = static_cast<std::size_t>(row);
  if (frame >= state.solve_result->warper->frameWarpCount()) return false;

  const EffectParameters params(*this);
  RenderSettings settings = GetRenderSettings(params);
  WorldX<Pixel> pixels = PixelsOf<Pixel>(output);
  if (!(settings.additional_scale > 0)) {  // a picture of no size
    pixels.clear();
    return true;
  }
  const OutputRect setup = SetUpOutput();
  settings.shift_x = static_cast<double>(output.origin_x) + setup.origin_x;
  settings.shift_y = static_cast<double>(output.origin_y) + setup.origin_y;
  settings.synthesis_range = MarginInFrames(params, state.FrameRate());
  Renderer renderer = MakeRenderer(state);
  ClipFrames<Pixel> clip(frames, state.table().first_frame);
  HostOperations<Pixel> operations(context());
  renderFrame(CPWarperWarps(state.solve_result->warper), state.solve_result->crop.get(), settings,
              renderer, frame, clip, operations, pixels);
  if (!crops(settings.framing)) SendPolygon(state, frame, renderer, settings, setup);
  return true;
}

void StabilizerEffect::SendPolygon(const StabilizerState& state, std::size_t frame,
                                   const Renderer& renderer, const RenderSettings& settings,
                                   const OutputRect& setup) {
  const std::vector<float> polygon =
      outlinePolygon(CPWarperWarps(state.solve_result->warper), frame, renderer, settings,
                     setup.origin_x, setup.origin_y);
  const ScopedSuite<HX_StabilizerHostSuite7> suite(context());
  ThrowIfFailed(suite->SetFramePolygon(context().in->effect_ref,
                                       static_cast<std::uint32_t>(polygon.size() / 2),
                                       polygon.data(), static_cast<std::int32_t>(frame)));
}

}  // namespace kelp::effect
