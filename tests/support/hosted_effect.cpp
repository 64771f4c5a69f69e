#include "tests/support/hosted_effect.h"

#include <boost/make_shared.hpp>
#include <chrono>
#include <cstring>
#include <set>

#include "host/pixels/world_operations.h"
#include "stabilizer/effect/src/instance_handle.h"
#include "stabilizer/effect/src/stabilizer_effect.h"
#include "stabilizer/effect/src/state_format/state_reader.h"
#include "stabilizer/effect/src/state_format/state_writer.h"
#include "tests/support/linked_plugin.h"

namespace calmframe::host {
namespace {

using kelp::effect::InstanceHandleHeader;
using kelp::effect::SavedState;
using kelp::effect::StabilizerEffect;
using namespace std::chrono_literals;

constexpr std::int32_t kDeletionsDiskId = 305;

// Of the one hosted effect; constant while renders are under way.
bool keeps_deletions = false;
const std::function<void(StabilizerEffect&)>* probe = nullptr;  // on the session's thread

HX_Err Entry(std::uint32_t command, HX_InData* in, HX_OutData* out, HX_ParamDef* params[],
             HX_World* output, void* extra) {
  if (command == HX_CMD_IDLE_TICK && probe) {
    StabilizerEffect effect(kelp::effect::HostContext{command, in, out, params, output, extra});
    (*probe)(effect);
    return HX_ERR_NONE;
  }
  const HX_Err code = EffectMainExtra(command, in, out, params, output, extra);
  if (command == HX_CMD_DECLARE_PARAMS && code == HX_ERR_NONE && keeps_deletions) {
    HX_ParamDef param{};
    param.disk_id = kDeletionsDiskId;
    param.kind = HX_PARAM_ARBITRARY;
    ++out->num_params;
    return in->cb->add_param(in->effect_ref, -1, &param);
  }
  return code;
}

}  // namespace

HostedEffect::HostedEffect(const HostedSettings& settings) {
  keeps_deletions = settings.keeps_deletions;
  HostSettings host;
  host.media.cache_bytes = std::size_t{16} << 20;
  host.saves_as = settings.saves_as;
  host_ = std::make_unique<Host>(LinkedPlugin(Entry), host);
  host_->handles().MoveOnUnlock(true);
  host_->worlds().SetRowPadding(16);
  session_ = std::make_unique<Session>(*host_);
}

HostedEffect::HostedEffect(const SourcePtr& source, const HostedSettings& settings)
    : HostedEffect(settings) {
  layer_ = boost::make_shared<Layer>(source);
}

HostedEffect::HostedEffect(const ShakyClip& clip, const HostedSettings& settings)
    : HostedEffect(settings) {
  ShakyClip held = clip;
  held.on_draw = [this, draw = clip.on_draw](std::int64_t frame) {
    if (draw) draw(frame);
    std::shared_ptr<Hold> hold;
    {
      const std::lock_guard lock(hold_mutex_);
      if (frame == held_frame_) hold = hold_;
    }
    if (hold) hold->Pass();
  };
  layer_ = boost::make_shared<Layer>(MakeShakyClip(held));
}

HostedEffect::~HostedEffect() {
  Operations::Get().FailNone();
  Release();
  Session::PauseBackgroundWork(false);
  renderer_.reset();
  DisposeOfDeletions();
  session_.reset();
  EXPECT_TRUE(host_->Stop().ok());
  EXPECT_EQ(host_->LeakReport(), "");
}

Effect& HostedEffect::Apply() {
  renderer_.reset();
  effect_ = &session_->Apply(layer_);
  return *effect_;
}

int HostedEffect::Settle() {
  EXPECT_EQ(session_->TickUntilSettled(5min), Session::Wait::settled);
  return Status();
}

Effect& HostedEffect::Open(const SavedEffect& saved) {
  if (effect_) Remove();
  effect_ = &session_->Load(layer_, saved);
  return *effect_;
}

void HostedEffect::Remove() {
  renderer_.reset();
  session_->Remove(*std::exchange(effect_, nullptr));
}

void HostedEffect::Place(std::int32_t start_frame, std::int32_t length) {
  layer_->Change([=](LayerState& state) {
    state.start_frame = start_frame;
    state.length = length;
  });
}

RenderedFrame HostedEffect::Render(const RenderRequest& request, Path path) {
  if (!renderer_) renderer_ = effect_->MakeRenderer();
  return path == Path::direct ? renderer_->Direct(request) : renderer_->Planned(request);
}

std::vector<std::string> HostedEffect::OperationsOf(const std::function<void()>& act) {
  Operations::Get().Record(true);
  act();
  Operations::Get().Record(false);
  return Operations::Get().recorded();
}

std::vector<double> HostedEffect::Warp(std::int32_t frame) {
  const HX_VarVector* const warp =
      host_->library().exports().get_var_vector(effect_->opaque_data(), frame);
  if (!warp) return {};
  return {warp->values, warp->values + 2 * std::ptrdiff_t{warp->columns} * warp->rows};
}

void HostedEffect::HoldAtFrame(std::int64_t frame) {
  const std::lock_guard lock(hold_mutex_);
  hold_ = std::make_shared<Hold>();
  held_frame_ = frame;
}

void HostedEffect::HoldSolve(const std::string& line) {
  const std::lock_guard lock(hold_mutex_);
  hold_ = std::make_shared<Hold>();
  stages_.HoldAt(line, hold_.get());
}

void HostedEffect::TickUntilHeld() {
  while (!hold_->Reached(2ms)) session_->Tick();
}

void HostedEffect::Release() {
  const std::lock_guard lock(hold_mutex_);
  held_frame_ = kNoFrame;
  if (!hold_) return;
  stages_.HoldAt("", nullptr);
  hold_->Release();
}

// -- Deleted track points --

HX_CustomDataExtra HostedEffect::DataExtra(std::int32_t op, HX_Handle a, HX_Handle b,
                                           std::vector<std::uint64_t>* keys) {
  HX_CustomDataExtra extra{op, kDeletionsDiskId, a, b, nullptr, 0, nullptr, 0.5, 99};
  if (keys) {
    extra.buffer = keys->data();
    extra.size = static_cast<std::uint32_t>(keys->size() * sizeof(std::uint64_t));
  }
  return extra;
}

CommandResult HostedEffect::DataOp(HX_CustomDataExtra& extra) {
  HX_InData in{};
  HX_OutData out{};
  return host_->Command(HX_CMD_CUSTOM_DATA_OP, in, out, nullptr, nullptr, &extra);
}

HX_CustomDataExtra HostedEffect::DataOp(std::int32_t op, HX_Handle a, HX_Handle b,
                                        std::vector<std::uint64_t>* keys) {
  HX_CustomDataExtra extra = DataExtra(op, a, b, keys);
  EXPECT_TRUE(DataOp(extra).ok()) << op;
  return extra;
}

std::vector<std::uint64_t> HostedEffect::DeletionsIn(HX_Handle value) {
  std::vector<std::uint64_t> keys(DataOp(HX_DATA_FLAT_SIZE, value).size / sizeof(std::uint64_t));
  DataOp(HX_DATA_FLATTEN, value, nullptr, &keys);
  return keys;
}

void HostedEffect::SetDeletions(const std::vector<std::uint64_t>& keys) {
  deletions_.push_back(MakeDeletions(keys));
  HX_ParamDef param = *effect_->Param(deletions_index());
  param.u.arb_d.value = deletions_.back();
  EXPECT_TRUE(effect_->shared()->params().SetByPlugin(deletions_index(), param));
}

// The effect may have put another value in the place of the last one.
void HostedEffect::DisposeOfDeletions() {
  if (!keeps_deletions) return;
  std::set<HX_Handle> values(deletions_.begin(), deletions_.end());
  for (const auto& effect : session_->effects()) {
    values.insert(effect->Param(deletions_index())->u.arb_d.value);
  }
  values.erase(nullptr);
  for (const HX_Handle value : values) DataOp(HX_DATA_DISPOSE, value);
}

// -- Past the host --

CommandResult HostedEffect::Inside(const std::function<void(StabilizerEffect& effect)>& look) {
  probe = &look;
  const CommandResult result = effect_->Tick();
  probe = nullptr;
  return result;
}

SavedEffect HostedEffect::Altered(const SavedEffect& saved,
                                  const std::function<void(SavedState& state)>& change) {
  SavedEffect altered = saved;
  InstanceHandleHeader header{};
  std::memcpy(&header, saved.instance.data(), sizeof header);
  const SourceInfo& source = layer_->state()->source->info();
  SavedState state = kelp::effect::ReadState(
      saved.instance.data() + sizeof header, header.payload_length, header.version, header.raw,
      {source.width, source.height, source.pixel_aspect.num, source.pixel_aspect.den});
  change(state);
  tessel::filesupport::OStringByteStream bytes;
  kelp::effect::WriteState(bytes, state);
  const std::string payload = bytes.Take();
  header.raw = 1;
  header.payload_length = payload.size();
  altered.instance.assign(kelp::effect::kInstanceHandleOverhead + payload.size(), 0);
  std::memcpy(altered.instance.data(), &header, sizeof header);
  std::memcpy(altered.instance.data() + sizeof header, payload.data(), payload.size());
  return altered;
}

double ChannelAt(const WorldBuffer& pixels, int x, int y, int channel) {
  const HX_World& world = pixels.world();
  const int column = 4 * (x - world.origin_x) + channel, row = y - world.origin_y;
  switch (FormatOf(world)) {
    case HX_FORMAT_ARGB8:
      return pixels.row<std::uint8_t>(row)[column] / 255.0;
    case HX_FORMAT_ARGB16:
      return pixels.row<std::uint16_t>(row)[column] / 32768.0;
    default:
      return pixels.row<float>(row)[column];
  }
}

}  // namespace calmframe::host
