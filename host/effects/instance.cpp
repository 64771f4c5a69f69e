#include "host/effects/instance.h"

#include <new>
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
    : host_(host), wake_(host.wake()), effect_(std::move(effect)) {}

Instance::~Instance() {
  if (!ref_) return;
  if (Lent* lent = Lent::active()) lent->instances.Remove(ref_);
  MediaServices::DetachEffect(ref_);
}

// From here on nothing needs memory: the plug-in takes everything apart on this way too.
CommandResult Instance::Run(std::uint32_t command, const Place& place, RenderContext& frames,
                            HX_ParamDef** params, HX_World* output, void* extra, HX_OutData& out) {
  const SourceInfo& source = frames.layer().source->info();
  const LayerTime time(frames.layer());
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
  in.downsample_x = frames.downsample_x();
  in.downsample_y = frames.downsample_y();
  frames_ = &frames;
  SetLayerOfCall(frames.shared_layer());
  CommandResult result = host_.Command(command, in, out, params, output, extra);
  SetLayerOfCall(nullptr);
  frames_ = nullptr;
  handle_ = out.instance_handle;
  if (!result.message.empty()) effect_->AddMessage(result.message);
  return result;
}

CommandResult Instance::Call(std::uint32_t command, const Place& place, HX_World* output,
                             void* extra, HX_OutData* out) {
  std::optional<RenderContext> own;
  RenderContext& frames = place.frames ? *place.frames : FullFrames(own);
  std::vector<HX_ParamDef> params;
  std::vector<HX_ParamDef*> pointers;
  try {
    params = frames.frozen_params().empty() ? effect_->params().All() : frames.frozen_params();
    for (HX_ParamDef& param : params) pointers.push_back(&param);
  } catch (const std::bad_alloc&) {
    return {HX_ERR_MEMORY, {}};
  }
  for (HX_ParamDef& param : params) param.change_flag = 0;
  HX_World& input = params[0].u.ld;
  if (place.input) {
    input = *place.input;
  } else {
    input = {};
    input.width = frames.width();
    input.height = frames.height();
    input.format = FormatOfDepth(frames.bit_depth());
  }
  HX_OutData answered{};
  CommandResult result =
      Run(command, place, frames, pointers.data(), output, extra, out ? *out : answered);
  for (std::size_t i = 1; i < params.size(); ++i) {
    if (!params[i].change_flag) continue;
    effect_->params().SetByPlugin(static_cast<std::int32_t>(i), params[i]);
    effect_->InvalidateRenders();
  }
  return result;
}

RenderContext& Instance::FullFrames(std::optional<RenderContext>& own) const {
  return own.emplace(host_.media(), ref_, effect_->layer()->state(), 8, HX_Ratio{1, 1},
                     HX_Ratio{1, 1});
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

void Instance::Destroy(const Place& place) noexcept {
  for (int tries = 0; tries < 2; ++tries) {
    std::optional<RenderContext> frames;
    HX_OutData out{};
    if (Run(HX_CMD_DESTROY_INSTANCE, place, FullFrames(frames), nullptr, nullptr, nullptr, out)
            .ok() ||
        !handle_) {
      break;
    }
  }
  if (handle_) Ledger::Get().Mistake("DestroyInstance: the handle is still there");
}

}  // namespace calmframe::host
