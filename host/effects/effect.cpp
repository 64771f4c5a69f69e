#include "host/effects/effect.h"

#include <new>
#include <utility>

#include "host/effects/host.h"

namespace calmframe::host {
namespace {

// The parameter in which a host keeps the tracks that its user deleted.
constexpr std::int16_t kDeletionsDiskId = 305;

}  // namespace

Effect::Effect(Host& host, boost::shared_ptr<Layer> layer)
    : host_(host),
      shared_(std::make_shared<TimelineEffect>(std::move(layer), host.declarations())),
      instance_(Instance::Make(host, shared_)) {}

// What is thrown from here on meets the destructor.
Effect::Effect(Host& host, boost::shared_ptr<Layer> layer, std::size_t position)
    : Effect(host, std::move(layer)) {
  PutOnLayer(position);
  creation_ = Command(HX_CMD_CREATE_INSTANCE);
  Refresh();
  standing_ = MakeRenderer();
}

Effect::Effect(Host& host, boost::shared_ptr<Layer> layer, std::size_t position,
               const SavedEffect& saved)
    : Effect(host, std::move(layer)) {
  shared_->params().SetValues(saved.values);
  PutOnLayer(position);
  if (saved.match_name != host.library().properties().match_name) {
    creation_ = {HX_ERR_UNKNOWN, "Saved by another effect: " + saved.match_name};
  } else if (saved.instance.empty()) {
    creation_ = Command(HX_CMD_CREATE_INSTANCE);
  } else {
    flattened_ = host.handles().NewFrom(saved.instance);
    instance_->SetHandle(flattened_);
    creation_ = Restore();
  }
  Refresh();
  standing_ = MakeRenderer();
}

Effect::~Effect() {
  const LoopWake::Call on_loop;
  instance_->Destroy({playhead_});
  DisposeOfDeletions();
  standing_.reset();
  shared_->layer()->RemoveEffect(shared_->runtime_id());
}

const void* Effect::opaque_data() const {
  return host_.opaque_data().Peek(shared_->reference());
}

void Effect::PutOnLayer(std::size_t position) {
  EffectOperator effect;
  effect.runtime_id = shared_->runtime_id();
  effect.match_name = host_.library().properties().match_name;
  effect.parameters = shared_->params().SettingsText();
  shared_->layer()->InsertEffect(position, effect);
}

CommandResult Effect::Command(std::uint32_t command, void* extra) {
  if (flattened_) {
    if (CommandResult restored = Restore(); !restored.ok()) return restored;
  }
  const LoopWake::Call on_loop;
  return instance_->Call(command, {playhead_}, nullptr, extra);
}

CommandResult Effect::Restore() {
  const LoopWake::Call on_loop;
  CommandResult result = instance_->Call(HX_CMD_RESTORE_INSTANCE, {playhead_});
  // A plug-in that failed may have left the handle as it was; then it is tried again.
  if (result.ok() || instance_->handle() != flattened_) flattened_ = nullptr;
  return result;
}

CommandResult Effect::SetParam(std::int32_t index, double value) {
  const std::optional<HX_ParamDef> before = Param(index);
  if (!shared_->params().SetByUser(index, value)) return {HX_ERR_UNKNOWN, "No such control"};
  try {
    shared_->layer()->SetParameters(shared_->runtime_id(), shared_->params().SettingsText());
  } catch (const std::bad_alloc&) {
    shared_->params().SetByPlugin(index, *before);
    return {HX_ERR_MEMORY, {}};
  }
  shared_->InvalidateRenders();
  return TellChange(index);
}

CommandResult Effect::Press(std::int32_t index) {
  const std::optional<HX_ParamDef> param = Param(index);
  if (!param || param->kind != HX_PARAM_BUTTON) return {HX_ERR_UNKNOWN, "No such button"};
  if (param->ui_flags & HX_PARAM_UI_DISABLED) {
    return {HX_ERR_UNKNOWN, "The button is disabled"};
  }
  return TellChange(index);
}

CommandResult Effect::TellChange(std::int32_t index) {
  CommandResult result;
  if (Param(index)->flags & HX_PARAM_FLAG_SUPERVISED) {
    HX_ParamChangedExtra extra{index};
    result = Command(HX_CMD_PARAM_CHANGED, &extra);
  }
  const CommandResult refreshed = Refresh();
  return result.ok() ? refreshed : result;
}

CommandResult Effect::DeletionsOp(HX_CustomDataExtra& extra) {
  extra.param_id = kDeletionsDiskId;
  HX_InData in{};
  HX_OutData out{};
  const LoopWake::Call on_loop;
  return host_.Command(HX_CMD_CUSTOM_DATA_OP, in, out, nullptr, nullptr, &extra);
}

void Effect::DisposeOfDeletions() {
  if (!deletions_) return;
  const std::optional<HX_ParamDef> param = Param(IndexOf(kDeletionsDiskId));
  HX_CustomDataExtra extra{};
  extra.op = HX_DATA_DISPOSE;
  extra.a = std::exchange(deletions_, nullptr);
  const bool replaced = param && param->u.arb_d.value != extra.a;
  DeletionsOp(extra);
  if (!replaced) return;
  extra.a = param->u.arb_d.value;
  DeletionsOp(extra);
}

CommandResult Effect::DeleteTracks(const std::vector<TrackPoint>& points) try {
  std::vector<std::uint64_t> keys;
  keys.reserve(points.size());
  for (const TrackPoint& point : points) {
    keys.push_back(std::uint64_t{static_cast<std::uint32_t>(point.frame)} << 32 |
                   static_cast<std::uint32_t>(point.slot));
  }
  HX_CustomDataExtra extra{};
  extra.op = HX_DATA_UNFLATTEN;
  extra.buffer = keys.data();
  extra.size = static_cast<std::uint32_t>(keys.size() * sizeof(std::uint64_t));
  CommandResult result = DeletionsOp(extra);
  if (!result.ok()) return result;
  if (!extra.out) return {HX_ERR_UNKNOWN, "The effect has no tracks to delete"};
  DisposeOfDeletions();
  deletions_ = extra.out;
  HX_ParamDef param{};
  param.disk_id = kDeletionsDiskId;
  param.kind = HX_PARAM_ARBITRARY;
  param.u.arb_d = {kDeletionsDiskId, nullptr, deletions_};
  if (!shared_->params().SetByPlugin(IndexOf(kDeletionsDiskId), param)) {
    shared_->params().Append(param);
  }
  return result;
} catch (const std::bad_alloc&) {
  return {HX_ERR_MEMORY, {}};
}

CommandResult Effect::Tick() {
  return Command(HX_CMD_IDLE_TICK);
}

CommandResult Effect::Refresh() {
  return Command(HX_CMD_REFRESH_PARAMS);
}

CommandResult Effect::Save(SavedEffect* saved) {
  CommandResult result = Command(HX_CMD_FLATTEN_INSTANCE);
  if (!result.ok()) return result;
  flattened_ = instance_->handle();
  SavedEffect now;
  try {
    now.match_name = host_.library().properties().match_name;
    now.values = shared_->params().Values();
    if (flattened_ && saved) now.instance = host_.handles().BytesOf(flattened_);
  } catch (const std::bad_alloc&) {
    if (flattened_) Restore();
    return {HX_ERR_MEMORY, {}};
  }
  if (flattened_) result = Restore();
  if (saved) *saved = std::move(now);
  return result;
}

}  // namespace calmframe::host
