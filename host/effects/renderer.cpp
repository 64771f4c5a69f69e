#include "host/effects/renderer.h"

#include <algorithm>
#include <cstring>
#include <memory>
#include <new>
#include <optional>
#include <utility>

#include "host/base/operations.h"
#include "host/effects/host.h"
#include "host/effects/interface_tables.h"
#include "host/effects/layer_time.h"
#include "host/pixels/world_operations.h"

namespace calmframe::host {
namespace {

constexpr HX_Err kBadRequest = HX_ERR_UNKNOWN;
// More than any frame; a plug-in that asks for it is at fault, or what a file has told it.
constexpr std::int64_t kLargestSide = 1 << 17;
// As of a clip's frames. What is warped may reach beyond a layer, if not for ever.
constexpr std::int64_t kMostPixels = std::int64_t{1} << 27;
constexpr std::int64_t kMostLayers = 4;

bool Serves(const RenderRequest& request, bool planned) {
  const bool depth =
      request.bit_depth == 8 || request.bit_depth == 16 || (planned && request.bit_depth == 32);
  const HX_Ratio& ratio = request.downsample;
  return depth && ratio.num > 0 && static_cast<std::uint32_t>(ratio.num) <= ratio.den;
}

// Clear, and with the rectangle's top left for its origin; null for an empty one. Throws what
// WorldBuffer throws.
std::shared_ptr<WorldBuffer> OutputFor(Host& host, const HX_Rect& rect, int bit_depth) {
  if (IsEmpty(rect)) return nullptr;
  auto output =
      std::make_shared<WorldBuffer>(rect.right - rect.left, rect.bottom - rect.top,
                                    FormatOfDepth(bit_depth), host.worlds().row_padding());
  output->world().origin_x = rect.left;
  output->world().origin_y = rect.top;
  return output;
}

void CheckPadding(const WorldBuffer& output, Host& host) {
  if (host.worlds().row_padding() > 0 && !output.PaddingIntact()) {
    Ledger::Get().Mistake("output: written behind its rows");
  }
}

// A copy of what lies inside the rectangle; null when that is nothing.
std::shared_ptr<WorldBuffer> PartOf(Host& host, const std::shared_ptr<WorldBuffer>& output,
                                    const HX_Rect& rect, int bit_depth) {
  const HX_Rect whole = output->rect();
  auto part = OutputFor(host, Intersect(whole, rect), bit_depth);
  if (!part) return nullptr;
  const HX_Rect place = {whole.left - part->rect().left, whole.top - part->rect().top,
                         whole.right - part->rect().left, whole.bottom - part->rect().top};
  CopyWorld(output->world(), part->world(), nullptr, &place);
  return part;
}

// The message of a render that doesn't ask for it to be shown. Throws std::bad_alloc.
std::string BannerOf(const HX_OutData& out) {
  if (out.out_flags & HX_OUT_FLAG_SHOW_MESSAGE) return {};
  return {out.return_msg, strnlen(out.return_msg, sizeof out.return_msg)};
}

bool IsAbsurd(const HX_Rect& rect, const RenderContext& frames) {
  const std::int64_t width = std::int64_t{rect.right} - rect.left,
                     height = std::int64_t{rect.bottom} - rect.top;
  if (width > kLargestSide || height > kLargestSide) return true;
  const std::int64_t most = std::max(kMostPixels, kMostLayers * frames.width() * frames.height());
  return !IsEmpty(rect) && width * height > most;
}

}  // namespace

std::shared_ptr<WorldBuffer> RenderedFrame::OnLayer() const {
  const std::uint32_t format = pixels ? pixels->world().format : HX_FORMAT_ARGB8;
  if (pixels && pixels->world().origin_x == 0 && pixels->world().origin_y == 0 &&
      pixels->world().width == layer_width && pixels->world().height == layer_height) {
    return pixels;
  }
  auto frame = std::make_shared<WorldBuffer>(layer_width, layer_height, format);
  if (pixels) {
    const HX_Rect place = pixels->rect();
    CopyWorld(pixels->world(), frame->world(), nullptr, &place);
  }
  return frame;
}

Renderer::Renderer(Host& host, std::shared_ptr<TimelineEffect> effect)
    : host_(host), instance_(Instance::Make(host, std::move(effect))) {
  MakeInstance();
}

void Renderer::MakeInstance() {
  result_ = instance_->Call(HX_CMD_RESTORE_INSTANCE, {});
}

Renderer::~Renderer() {
  instance_->Destroy({});
}

template <class Draw>
RenderedFrame Renderer::Render(const RenderRequest& request, bool planned, const Draw& draw) {
  RenderedFrame rendered;
  rendered.generation = instance_->effect()->generation();
  if (!Serves(request, planned)) {
    rendered.result.code = kBadRequest;
    return rendered;
  }
  if (!instance_->handle()) MakeInstance();
  try {
    draw(rendered);
    if (!rendered.result.ok() && !result_.ok()) rendered.result = result_;
  } catch (const std::bad_alloc&) {
    rendered.pixels.reset();
    rendered.result = {HX_ERR_MEMORY, {}};
  }
  return rendered;
}

RenderedFrame Renderer::Direct(const RenderRequest& request) {
  return Render(request, false, [&](RenderedFrame& rendered) { DrawDirect(request, rendered); });
}

RenderedFrame Renderer::Planned(const RenderRequest& request) {
  return Render(request, true, [&](RenderedFrame& rendered) { DrawPlanned(request, rendered); });
}

void Renderer::DrawDirect(const RenderRequest& request, RenderedFrame& rendered) {
  RenderContext frames(host_.media(), instance_->ref(), instance_->effect()->layer()->state(),
                       request.bit_depth, request.downsample, request.downsample);
  frames.FreezeParams(instance_->effect()->params().All());
  rendered.layer_width = frames.width();
  rendered.layer_height = frames.height();

  const LayerTime time(frames.layer());
  const HX_World* const input = frames.CheckOutInput(
      time.MediaTicks(time.OfFrame(request.frame, request.second_field), time.scale()));
  // By its pixels: a plug-in that checks in what it never checked out takes the record with it.
  const auto check_in = [&frames, data = input ? input->data : nullptr](const HX_World*) {
    frames.CheckInInput(data);
  };
  const std::unique_ptr<const HX_World, decltype(check_in)> holds(input, check_in);
  // Where the media has no frame the layer is clear.
  std::optional<WorldBuffer> clear;
  HX_World world =
      input ? *input
            : clear.emplace(frames.width(), frames.height(), FormatOfDepth(request.bit_depth))
                  .world();
  Instance::Place place{request.frame, request.second_field, &frames, &world};

  HX_OutData setup{};
  setup.width = frames.width();
  setup.height = frames.height();
  rendered.result = instance_->Call(HX_CMD_PREPARE_FRAME, place, nullptr, nullptr, &setup);
  if (rendered.result.ok()) {
    const std::int64_t left = -std::int64_t{setup.origin_x}, top = -std::int64_t{setup.origin_y};
    rendered.full_rect = {static_cast<std::int32_t>(left), static_cast<std::int32_t>(top),
                          static_cast<std::int32_t>(left + setup.width),
                          static_cast<std::int32_t>(top + setup.height)};
    if (IsAbsurd(rendered.full_rect, frames)) {
      rendered.result.code = kBadRequest;
    } else if (auto output = OutputFor(host_, rendered.full_rect, request.bit_depth)) {
      HX_OutData answer{};
      rendered.result =
          instance_->Call(HX_CMD_RENDER_FRAME, place, &output->world(), nullptr, &answer);
      CheckPadding(*output, host_);
      if (rendered.result.ok()) {
        rendered.banner = BannerOf(answer);
        rendered.pixels =
            request.part ? PartOf(host_, output, *request.part, request.bit_depth) : output;
      }
    }
  }
}

void Renderer::DrawPlanned(const RenderRequest& request, RenderedFrame& rendered) {
  RenderContext frames(host_.media(), instance_->ref(), instance_->effect()->layer()->state(),
                       request.bit_depth, request.downsample, request.downsample);
  frames.FreezeParams(instance_->effect()->params().All());
  rendered.layer_width = frames.width();
  rendered.layer_height = frames.height();
  const Instance::Place place{request.frame, request.second_field, &frames, nullptr};

  HX_PlanExtra plan{};
  plan.request.rect = request.part.value_or(HX_Rect{0, 0, frames.width(), frames.height()});
  plan.request.bit_depth = request.bit_depth;
  SetPlanFunctions(plan);
  rendered.result = instance_->Call(HX_CMD_PLAN_FRAME, place, nullptr, &plan);
  if (!rendered.result.ok()) return;
  rendered.full_rect = plan.full_rect;
  const HX_Rect wanted =
      plan.may_exceed ? plan.result_rect : Intersect(plan.result_rect, plan.request.rect);
  if (IsAbsurd(wanted, frames)) {
    rendered.result.code = kBadRequest;
    return;
  }
  frames.SetOutput(OutputFor(host_, wanted, request.bit_depth));
  if (!frames.output()) return;

  HX_RenderExtra render{};
  render.request = plan.request;
  SetRenderFunctions(render);
  HX_OutData answer{};
  rendered.result = instance_->Call(HX_CMD_RENDER_PLANNED_FRAME, place, nullptr, &render, &answer);
  CheckPadding(*frames.output(), host_);
  if (!rendered.result.ok()) return;
  rendered.banner = BannerOf(answer);
  rendered.pixels = frames.output();
}

}  // namespace calmframe::host
