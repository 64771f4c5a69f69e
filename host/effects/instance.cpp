#include "host/effects/instance.h"

#include <optional>
#include <utility>
#include <vector>

#include "host/base/operations.h"
#include "host/effects/host.h"
#include "host/effects/layer_time.h"

namespace calmframe::host {

std::string CommandResult::Line(const std::string& what) const {
  if (!message.empty()) return what + ": " + message;
  return what + ": " + (ok() ? "done" : "the plug-in answered " + std::to_string(code));
}

std::shared_ptr<Instance> Instance::Make(Host& host, std::shared_ptr<TimelineEffect> effect) {
  std::shared_ptr<Instance> instance(new Instance(host, std::move(effect)));
  instance->ref_ = host.instances().Add(instance);
  host.media().AttachEffect(instance->ref_, instance->effect_->layer(),
                            instance->effect_->runtime_id());
  return instance;
}

Instance::Instance(Host& host, std::shared_ptr<TimelineEffect> effect)
    : host_(host), effect_(std::move(effect)) {}

Instance::~Instance() {
  if (!ref_) return;
  host_.instances().Remove(ref_);
  host_.media().DetachEffect(ref_);
}

CommandResult Instance::Call(std::uint32_t command, const Place& place, HX_World* output,
                             void* extra, HX_OutData* out) {
  std::optional<RenderContext> own;
  RenderContext* frames = place.frames;
  if (!frames) {
    frames = &own.emplace(host_.media(), ref_, effect_->layer()->state(), 8, HX_Ratio{1, 1},
                          HX_Ratio{1, 1});
  }
  const SourceInfo& source = frames->layer().source->info();
  const LayerTime time(frames->layer());

  HX_InData in{};
  in.effect_ref = ref_;
  in.instance_handle = handle_;
  in.width = source.width;
  in.height = source.height;
  in.pixel_aspect = source.pixel_aspect;
  in.current_time = time.OfFrame(place.frame, place.second_field);
  in.time_step = time.step();
  in.total_time = time.total();
  in.time_scale = time.scale();
  in.downsample_x = frames->downsample_x();
  in.downsample_y = frames->downsample_y();

  std::vector<HX_ParamDef> params =
      frames->frozen_params().empty() ? effect_->params().All() : frames->frozen_params();
  HX_World& input = params[0].u.ld;
  if (place.input) {
    input = *place.input;
  } else {
    input = {};
    input.width = frames->width();
    input.height = frames->height();
    input.format = FormatOfDepth(frames->bit_depth());
  }
  std::vector<HX_ParamDef*> pointers;
  for (HX_ParamDef& param : params) {
    param.change_flag = 0;
    pointers.push_back(&param);
  }

  HX_OutData answered{};
  if (!out) out = &answered;
  frames_ = frames;
  SetLayerOfCall(frames->shared_layer());
  const CommandResult result = host_.Command(command, in, *out, pointers.data(), output, extra);
  SetLayerOfCall(nullptr);
  frames_ = nullptr;
  handle_ = out->instance_handle;
  for (std::size_t i = 1; i < params.size(); ++i) {
    if (!params[i].change_flag) continue;
    effect_->params().SetByPlugin(static_cast<std::int32_t>(i), params[i]);
    effect_->InvalidateRenders();
  }
  if (!result.message.empty()) effect_->AddMessage(result.message);
  return result;
}

void Instance::SetLayerOfCall(boost::shared_ptr<const LayerState> layer) {
  std::lock_guard lock(mutex_);
  layer_of_call_ = std::move(layer);
}

boost::shared_ptr<const LayerState> Instance::layer() const {
  {
    std::lock_guard lock(mutex_);
    if (layer_of_call_) return layer_of_call_;
  }
  return effect_->layer()->state();
}

std::optional<HX_ParamDef> Instance::Param(std::int32_t index) const {
  if (!frames_ || frames_->frozen_params().empty()) return effect_->params().At(index);
  const std::vector<HX_ParamDef>& params = frames_->frozen_params();
  if (index < 0 || static_cast<std::size_t>(index) >= params.size()) return std::nullopt;
  return params[static_cast<std::size_t>(index)];
}

void Instance::Destroy(const Place& place) {
  for (int tries = 0; tries < 2; ++tries) {
    if (Call(HX_CMD_DESTROY_INSTANCE, place).ok() || !handle_) break;
  }
  if (handle_) Ledger::Get().Mistake("DestroyInstance: the handle is still there");
}

}  // namespace calmframe::host
