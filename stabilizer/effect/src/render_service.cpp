#include "stabilizer/effect/src/render_service.h"

#include <algorithm>
#include <string>
#include <vector>

#include "analysis/effect/analysis_ui_data.h"
#include "analysis/effect/banner.h"
#include "analysis/effect/effect_parameters.h"
#include "effect/host_text.h"
#include "effect/suite.h"
#include "platform/hx/hx_exports.h"
#include "stabilizer/effect/src/fcd_table.h"
#include "stabilizer/effect/src/parameter_table.h"
#include "stabilizer/render/cp_warper_warps.h"
#include "stabilizer/render/frame_renderer.h"

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

// What is ordered under it is asked for, and not fetched.
constexpr std::int32_t kProbeId = -1;

bool HasPixels(const HX_CheckoutResult& ordered) {
  const HX_Rect& all = ordered.full_rect;
  return all.right > all.left && all.bottom > all.top;
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

Renderer RendererOf(const HX_InData& in, const StabilizerState& state) {
  const auto& warper = state.solve_result->warper;
  const double to_layer =
      std::max(state.source.width, std::int32_t{1}) / static_cast<double>(warper->frameWidth());
  return marrow::render::makeRenderer(CPWarperWarps(warper),
                                      ValueOfRatio(in.downsample_x) * to_layer,
                                      ValueOfRatio(in.downsample_y));
}

OutputRect RenderService::SetUpOutput() {
  const HX_InData& in = *context_.in;
  const OutputRect input = InputRect(in);
  const auto framing = static_cast<Framing>(effect_.GetPopupParam(kFramingIndex));
  const StabilizerState* const state = effect_.GetState();
  if (effect_.IsOneByOne() || !state || !state->solve_result->warper || crops(framing) ||
      !effect_.IsRenderableFrame()) {
    return input;
  }
  return setupOutputRect(framing, RendererOf(in, *state), input.width, input.height);
}

// -- The planned path --

std::int64_t RenderService::PlanMargin(const StabilizerState& state) {
  const EffectParameters params(effect_);
  return std::max<std::int64_t>(MarginInFrames(params, state.FrameRate()),
                                deblurReach(GetRenderSettings(params).deblur));
}

FrameClock RenderService::ClockOf(const StabilizerState& state) {
  return {effect_.GetLayerStart(state), analysis::RowDuration(state.result->job_input)};
}

void RenderService::Plan(HX_PlanExtra& plan) {
  const HX_InData& in = *context_.in;
  plan.solid = plan.may_exceed = 0;
  HX_CheckoutResult input{};
  const auto order_input = [&](std::int32_t id, const HX_RenderRequest& request) {
    ThrowIfFailed(plan.checkout_layer(in.effect_ref, 0, id, &request, in.current_time, in.time_step,
                                      in.time_scale, &input));
  };
  if (effect_.IsOneByOne()) {
    order_input(0, plan.request);
    plan.result_rect = input.result_rect;
    plan.full_rect = input.full_rect;
    return;
  }
  if (!effect_.GetState()) effect_.CreateStateInHandle(in.instance_handle, true);
  effect_.AttachSharedData(true);
  StabilizerState& state = *effect_.GetState();
  state.TakeOver();

  const OutputRect layer = InputRect(in);
  const HX_RenderRequest whole{{0, 0, layer.width, layer.height}, plan.request.bit_depth};
  const CurrentFrame current = effect_.GetCurrentFrame(true);
  state.planned_input = current.valid ? static_cast<std::int32_t>(current.frame) : 0;
  state.planned_warp = current.valid && effect_.IsRenderableFrame();
  if (state.planned_warp) {
    const FrameClock clock = ClockOf(state);
    const std::int64_t margin = PlanMargin(state);
    const marrow::tracking::AllFeatures& table = state.table();
    const std::int64_t first =
        std::max<std::int64_t>({current.frame - margin, table.first_frame, 0});
    const std::int64_t end = std::min<std::int64_t>(
        current.frame + margin + 1, std::int64_t{table.first_frame} + table.frame_count);
    for (std::int64_t frame = first; frame < end; ++frame) {
      const HostTime at = clock.At(frame);
      ThrowIfFailed(plan.checkout_layer(in.effect_ref, 0, static_cast<std::int32_t>(frame), &whole,
                                        at.time, at.step, at.scale, &input));
      if (frame == current.frame) state.planned_media = HasPixels(input);
    }
  } else {
    order_input(state.planned_input, whole);
    state.planned_media = HasPixels(input);
  }
  if (state.planned_warp && current.limited) {
    order_input(kProbeId, whole);
    state.planned_media = HasPixels(input);
  }

  const OutputRect output = SetUpOutput();
  plan.full_rect = {-output.origin_x, -output.origin_y, output.width - output.origin_x,
                    output.height - output.origin_y};
  if (crops(static_cast<Framing>(effect_.GetPopupParam(kFramingIndex)))) {
    plan.result_rect = plan.full_rect;
    plan.may_exceed = 1;
  } else {
    plan.result_rect = Intersection(plan.full_rect, plan.request.rect);
  }
}

void RenderService::RenderPlanned(const HX_RenderExtra& extra) {
  const std::int32_t depth = extra.request.bit_depth;
  if (depth != 8 && depth != 16 && depth != 32) return;
  HX_World* output = nullptr;
  ThrowIfFailed(extra.checkout_output(context_.in->effect_ref, &output));
  const StabilizerState* const state = effect_.GetState();
  if (state && !effect_.IsOneByOne() && !state->planned_media) return ClearWorld(*output, depth);
  PlannedFrames frames(context_, state && !effect_.IsOneByOne() ? state->planned_input : 0);
  Render(frames, *output, depth, state && state->planned_warp);
}

// -- The direct path --

void RenderService::RenderDirect(HX_World& output) {
  const DirectRender render(context_);
  DirectFrames frames(context_, [this] { return ClockOf(*effect_.GetState()); });
  const std::int32_t depth = output.flags & HX_WORLD_DEEP ? 16 : 8;
  const boost::shared_ptr<HX_World> input = frames.Input();
  if (!input->data) return ClearWorld(output, depth);
  Render(frames, output, depth, true);
}

// -- What both draw --

void RenderService::Render(RenderFrames& frames, HX_World& output, std::int32_t depth,
                           bool may_warp) {
  const auto pass_through = [&] { CopyInput(context_, *frames.Input(), output, depth); };
  if (effect_.IsOneByOne()) return pass_through();
  if (effect_.ShowsOverlay()) {
    pass_through();
    return analysis::effect::AnalysisUIData(effect_).Draw({}, {}, output);
  }
  const StatusRecord record = effect_.GetStatusRecord();
  bool stabilized = false;
  if (may_warp && effect_.IsRenderableFrame()) {
    ForDepth(depth,
             [&](auto pixel) { stabilized = RenderStabilized<decltype(pixel)>(frames, output); });
  }
  if (!stabilized) pass_through();
  if (stabilized && record.status == FrameStatus::Ready) return;
  const std::string text = analysis::effect::BannerText(effect_, record);
  if (text.empty()) return;
  LeaveMessage(context_, text.c_str());
  if (!effect_.IsBannerHidden()) analysis::effect::DrawBanner(effect_, record, output);
}

template <class Pixel>
bool RenderService::RenderStabilized(RenderFrames& frames, HX_World& output) {
  const StabilizerState& state = *effect_.GetState();
  const boost::shared_ptr<const SolveResult> solve = state.solve_result;
  const CurrentFrame current = effect_.GetCurrentFrame(true);
  const std::int32_t first_frame = state.table().first_frame;
  const std::int64_t row = current.frame - first_frame;
  if (!solve->warper || !current.valid || row < 0) return false;
  const auto frame = static_cast<std::size_t>(row);
  if (frame >= solve->warper->frameWarpCount()) return false;

  const EffectParameters params(effect_);
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
  const CPWarperWarps warps(solve->warper);
  Renderer renderer = RendererOf(*context_.in, state);
  ClipFrames<Pixel> clip(frames, first_frame);
  SuiteOperations<Pixel> operations(context_);
  renderFrame(warps, solve->crop.get(), settings, renderer, frame, clip, operations, pixels);
  if (!crops(settings.framing)) {
    SendPolygon(frame,
                outlinePolygon(warps, frame, renderer, settings, setup.origin_x, setup.origin_y));
  }
  return true;
}

// The picture stands without its outline.
void RenderService::SendPolygon(std::size_t frame, const std::vector<float>& polygon) try {
  const ScopedSuite<HX_StabilizerHostSuite7> suite(context_);
  ThrowIfFailed(suite->SetFramePolygon(context_.in->effect_ref,
                                       static_cast<std::uint32_t>(polygon.size() / 2),
                                       polygon.data(), static_cast<std::int32_t>(frame)));
} catch (std::int32_t) {
  ClearMessage(context_);
}

}  // namespace kelp::effect
