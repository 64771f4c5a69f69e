// A plug-in that does a little of everything that a host can be asked for, and gives back whatever
// happens. Its "work" goes on in idle ticks: status 4, then 5, then 8.

#include <cstring>
#include <new>

#include "platform/hx/hx.h"
#include "tests/host/effects/probe.h"

namespace {

using namespace probe;

struct PropertyRecord {
  HX_PropertyListHeader header{{1, 0}, {}, {3, 0, 0, 0}};
  HX_PropertyHeader kind{{'X', 'V', 'N', '8'}, {'d', 'n', 'i', 'k'}, {}, {4}};
  char kind_value[4] = {'T', 'K', 'F', 'x'};
  HX_PropertyHeader entry{{'X', 'V', 'N', '8'}, {'4', '6', '6', '8'}, {}, {10}};
  char entry_value[12] = "ProbeMain";
  HX_PropertyHeader match{{'X', 'V', 'N', '8'}, {'A', 'N', 'M', 'x'}, {}, {6}};
  char match_value[8] = {5, 'P', 'r', 'o', 'b', 'e'};
};
static_assert(sizeof(PropertyRecord) == 10 + 3 * 16 + 4 + 12 + 8);

const char* const kTexts[] = {"$$$/Probe/Name=Probe{{*COMMENT*}}a name", "", nullptr};
const HX_StringTable kTable = {3, 7, kTexts};

struct Globals {
  std::uint64_t token;
};

struct State {
  std::uint32_t magic;
  std::uint8_t flattened, attached;
  std::int32_t ticks_left;
};
constexpr std::uint32_t kMagic = 0x1234;

void Check(HX_Err code) {
  if (code) throw std::int32_t{code};
}

struct Call {
  HX_InData* in;
  HX_OutData* out;
  HX_ParamDef** params;
  HX_World* output;
  void* extra;
  const HX_Callbacks& cb() const { return *in->cb; }
};

template <typename Table>
class Suite {
 public:
  Suite(const Call& call, const char* name, std::int32_t version)
      : basic_(*call.in->basic), name_(name), version_(version) {
    const void* table = nullptr;
    if (basic_.acquire(name, version, &table)) throw std::int32_t{HX_ERR_MISSING_SUITE};
    table_ = static_cast<const Table*>(table);
  }
  ~Suite() { basic_.release(name_, version_); }
  Suite(const Suite&) = delete;
  Suite& operator=(const Suite&) = delete;
  const Table* operator->() const { return table_; }

 private:
  const HX_BasicSuite& basic_;
  const char* name_;
  std::int32_t version_;
  const Table* table_;
};

template <typename Block>
class Locked {
 public:
  Locked(const Call& call, HX_Handle handle) : cb_(call.cb()), handle_(handle) {
    block_ = static_cast<Block*>(cb_.lock_handle(handle));
    if (!block_) throw std::int32_t{HX_ERR_HANDLE_LOCK};
  }
  ~Locked() { cb_.unlock_handle(handle_); }
  Locked(const Locked&) = delete;
  Locked& operator=(const Locked&) = delete;
  Block* operator->() const { return block_; }

 private:
  const HX_Callbacks& cb_;
  HX_Handle handle_;
  Block* block_;
};

class Checkout {
 public:
  Checkout(const Call& call, std::int32_t index) : call_(call) {
    const HX_InData& in = *call.in;
    Check(call.cb().checkout_param(in.effect_ref, index, in.current_time, in.time_step,
                                   in.time_scale, &param_));
  }
  ~Checkout() { call_.cb().checkin_param(call_.in->effect_ref, &param_); }
  Checkout(const Checkout&) = delete;
  Checkout& operator=(const Checkout&) = delete;
  HX_ParamDef* operator->() { return &param_; }
  const HX_ParamDef& operator*() const { return param_; }

 private:
  const Call& call_;
  HX_ParamDef param_{};
};

void Say(const Call& call, const char* text) {
  call.cb().copy_text(call.out->return_msg, HX_RETURN_MSG_SIZE, text);
  call.out->out_flags |= HX_OUT_FLAG_SHOW_MESSAGE;
}

void SetHandle(const Call& call, HX_Handle handle) {
  call.in->instance_handle = call.out->instance_handle = handle;
}

// -- Plug-in --

void Start(const Call& call) {
  std::uint64_t token = 0;
  try {
    Check(call.cb().open_strings(nullptr, kTable.number, &kTable, &token));
    const HX_Handle handle = call.cb().new_handle(sizeof(Globals));
    if (!handle) throw std::int32_t{HX_ERR_MEMORY};
    try {
      Locked<Globals>(call, handle)->token = token;
    } catch (...) {
      call.cb().dispose_handle(handle);
      throw;
    }
    call.in->global_data = call.out->global_data = handle;
  } catch (...) {
    if (token) call.cb().close_strings(token);
    Say(call, "The probe could not be initialized.");
    throw;
  }
  call.out->version = 0x10000;
}

void Stop(const Call& call) {
  const HX_Handle handle = call.in->global_data;
  if (!handle) return;
  call.cb().close_strings(Locked<Globals>(call, handle)->token);
  call.cb().dispose_handle(handle);
  call.in->global_data = call.out->global_data = nullptr;
}

HX_ParamDef Param(std::int32_t kind, const char* name, std::uint32_t flags) {
  HX_ParamDef param{};
  param.kind = kind;
  std::strncpy(param.name, name, sizeof(param.name) - 1);
  param.flags = flags;
  return param;
}

void Declare(const Call& call) {
  const std::uint64_t token = Locked<Globals>(call, call.in->global_data)->token;
  HX_ParamDef params[kParams] = {};
  params[kStart] = Param(HX_PARAM_BUTTON, "", HX_PARAM_FLAG_SUPERVISED);
  params[kStart].u.button.label = "Start";
  params[kStop] = Param(HX_PARAM_BUTTON, "", HX_PARAM_FLAG_SUPERVISED);
  params[kStop].u.button.label = "Stop";
  params[kStop].ui_flags = HX_PARAM_UI_DISABLED;
  params[kAmount] =
      Param(HX_PARAM_FLOAT_SLIDER, call.cb().get_string(token, 0, 0, 0), HX_PARAM_FLAG_SUPERVISED);
  params[kAmount].u.fs = {5, 0, 10, 0, 1, 5, 0.05f, 0, 0};
  params[kMode] = Param(HX_PARAM_POPUP, "Mode", 0);
  params[kMode].u.pd = {1, 1, 3, "Plain|Grown|Neighbours"};
  params[kSwitch] = Param(HX_PARAM_CHECKBOX, "Switch", 0);
  params[kStatus] = Param(HX_PARAM_FLOAT_SLIDER, "Status", 0);
  params[kStatus].u.fs = {0, 0, 2e9f, 0, 2000, 0, 0.05f, 0, 0};
  params[kStatus].ui_flags = HX_PARAM_UI_HIDDEN;
  for (std::int32_t i = 1; i < kParams; ++i) {
    params[i].disk_id = i == kStatus ? 302 : 100 + i;
    Check(call.cb().add_param(nullptr, -1, &params[i]));
  }
  call.out->num_params = kParams;
}

// -- Instance --

void Attach(const Call& call, const Locked<State>& state) {
  Suite<HX_OpaqueEffectDataSuite1> opaque(call, HX_OPAQUE_EFFECT_DATA_SUITE, 1);
  Suite<HX_UtilitySuite> utility(call, HX_UTILITY_SUITE, 4);
  std::uint64_t reference = 0;
  Check(utility->GetEffectReference(call.in->effect_ref, &reference));
  void* block = nullptr;
  Check(opaque->Find(reference, &block));
  if (!block) {
    auto* own = new std::uint64_t(reference);
    if (const HX_Err code = opaque->Set(reference, own, &block)) {
      delete own;
      throw std::int32_t{code};
    }
    if (block != own) delete own;
  }
  state->attached = 1;
}

void Detach(const Call& call, const Locked<State>& state) {
  if (!state->attached) return;
  Suite<HX_OpaqueEffectDataSuite1> opaque(call, HX_OPAQUE_EFFECT_DATA_SUITE, 1);
  Suite<HX_UtilitySuite> utility(call, HX_UTILITY_SUITE, 4);
  std::uint64_t reference = 0;
  Check(utility->GetEffectReference(call.in->effect_ref, &reference));
  void* block = nullptr;
  Check(opaque->Find(reference, &block));
  std::uint8_t last = 0;
  Check(opaque->Release(reference, &last));  // the one that Find counted
  Check(opaque->Release(reference, &last));
  state->attached = 0;
  if (last) delete static_cast<std::uint64_t*>(block);
}

void Destroy(const Call& call) {
  const HX_Handle handle = call.in->instance_handle;
  if (!handle) return;
  Detach(call, Locked<State>(call, handle));
  call.cb().dispose_handle(handle);
  SetHandle(call, nullptr);
}

HX_Handle NewState(const Call& call, std::int32_t ticks) {
  const HX_Handle handle = call.cb().new_handle(sizeof(State));
  if (!handle) throw std::int32_t{HX_ERR_NO_INSTANCE};
  try {
    const Locked<State> state(call, handle);
    state->magic = kMagic;
    state->ticks_left = ticks;
    Attach(call, state);
  } catch (...) {
    call.cb().dispose_handle(handle);
    throw;
  }
  return handle;
}

void Restore(const Call& call) {
  const HX_Handle old = call.in->instance_handle;
  std::int32_t ticks = 0;
  if (old) {
    const Locked<State> state(call, old);
    if (call.cb().handle_size(old) != sizeof(State) || state->magic != kMagic ||
        !state->flattened) {
      throw std::int32_t{77};
    }
    ticks = state->ticks_left;
  }
  SetHandle(call, NewState(call, ticks));
  if (old) call.cb().dispose_handle(old);
}

void Flatten(const Call& call) {
  const HX_Handle old = call.in->instance_handle;
  if (!old) return;
  const HX_Handle handle = call.cb().new_handle(sizeof(State));
  if (!handle) throw std::int32_t{HX_ERR_MEMORY};
  try {
    const Locked<State> flat(call, handle);
    const Locked<State> state(call, old);
    flat->magic = kMagic;
    flat->flattened = 1;
    flat->ticks_left = state->ticks_left;
    Detach(call, state);
  } catch (...) {
    call.cb().dispose_handle(handle);
    throw;
  }
  call.cb().dispose_handle(old);
  SetHandle(call, handle);
}

// -- Upkeep --

void Publish(const Call& call, std::int32_t status) {
  Suite<HX_ParamUtilsSuite3> utils(call, HX_PARAM_UTILS_SUITE, 3);
  Checkout param(call, kStatus);
  const auto value = static_cast<std::int64_t>(param->u.fs.value);
  param->u.fs.value = static_cast<double>((value / 100 + 1) * 100 + status);
  Check(utils->SetParamValue(call.in->effect_ref, kStatus, &*param));
}

void EnableStop(const Call& call, bool enable, const char* name) {
  Suite<HX_ParamUtilsSuite3> utils(call, HX_PARAM_UTILS_SUITE, 3);
  Checkout param(call, kStop);
  param->ui_flags = enable ? 0 : HX_PARAM_UI_DISABLED;
  std::strncpy(param->name, name, sizeof(param->name) - 1);
  Check(utils->UpdateParamUI(call.in->effect_ref, kStop, &*param));
}

void Changed(const Call& call) {
  switch (static_cast<HX_ParamChangedExtra*>(call.extra)->param_index) {
    case kStart: {
      const HX_Handle handle = NewState(call, kTicks);
      const HX_Handle old = call.in->instance_handle;
      if (old) {
        try {
          Detach(call, Locked<State>(call, old));
        } catch (...) {
          call.in->instance_handle = handle;
          Destroy(call);  // one fault at a time
          SetHandle(call, old);
          throw;
        }
        call.cb().dispose_handle(old);
      }
      SetHandle(call, handle);
      EnableStop(call, true, "working");
      return Publish(call, 4);
    }
    case kStop:
      Locked<State>(call, call.in->instance_handle)->ticks_left = 0;
      EnableStop(call, false, "");
      Publish(call, 1);
      return Say(call, "Stopped");
    case kAmount: {
      Suite<HX_AdvAppSuite1> app(call, HX_ADV_APP_SUITE, 1);
      char text[512];
      call.cb().format(text, "%d%%", static_cast<int>(call.params[kAmount]->u.fs.value * 10));
      return Check(app->InfoText("Amount", text));
    }
    default:
      throw std::int32_t{78};
  }
}

void Tick(const Call& call) {
  const HX_Handle handle = call.in->instance_handle;
  if (!handle) return;
  std::int32_t left = 0;
  {
    const Locked<State> state(call, handle);
    if (state->ticks_left == 0) return;
    left = --state->ticks_left;
  }
  if (left == kTicks / 2) Publish(call, 5);
  if (left == 0) {
    EnableStop(call, false, "");
    Publish(call, 8);
  }
}

void Rerender(const Call& call) {
  Suite<HX_PrivateEffectSuite3> suite(call, HX_PRIVATE_EFFECT_SUITE, 3);
  Check(suite->ForceRerender(call.in->effect_ref));
}

// -- Renders --

std::int32_t Grown(const Call& call) {
  return call.params[kMode]->u.pd.value == kGrown ? kMargin : 0;
}

// Layer (0, 0) of `from` lies at its origin; so it does in `to`.
void Draw(const Call& call, const HX_World& from, HX_World* to) {
  const std::int32_t x = from.origin_x - to->origin_x, y = from.origin_y - to->origin_y;
  const HX_Rect place = {x, y, x + from.width, y + from.height};
  Check(call.cb().copy_world(call.in->effect_ref, &from, to, nullptr, &place));
}

void Prepare(const Call& call) {
  const std::int32_t margin = Grown(call);
  call.out->width = call.params[0]->u.ld.width + 2 * margin;
  call.out->height = call.params[0]->u.ld.height + 2 * margin;
  call.out->origin_x = call.out->origin_y = margin;
}

void RenderDirect(const Call& call) {
  static const std::uint32_t rows[3] = {};
  Check(call.cb().utility(call.in->effect_ref, HX_UTILITY_BEGIN_RENDER, rows));
  try {
    Draw(call, call.params[0]->u.ld, call.output);
  } catch (...) {
    call.cb().utility(call.in->effect_ref, HX_UTILITY_END_RENDER, nullptr);
    throw;
  }
  call.cb().utility(call.in->effect_ref, HX_UTILITY_END_RENDER, nullptr);
}

std::int32_t FrameOf(const Call& call) {
  return call.in->current_time / call.in->time_step;
}

void Plan(const Call& call) {
  auto& plan = *static_cast<HX_PlanExtra*>(call.extra);
  const std::int32_t margin = Grown(call), frame = FrameOf(call);
  HX_CheckoutResult result{};
  const std::int32_t reach = call.params[kMode]->u.pd.value == kNeighbours ? 1 : 0;
  HX_RenderRequest whole = plan.request;
  whole.rect = {0, 0, 1 << 15, 1 << 15};
  for (std::int32_t f = frame - reach; f <= frame + reach; ++f) {
    HX_CheckoutResult one{};
    Check(plan.checkout_layer(call.in->effect_ref, 0, f, &whole, f * call.in->time_step,
                              call.in->time_step, call.in->time_scale, &one));
    if (f == frame) result = one;
  }
  HX_Rect full = result.full_rect;
  full = {full.left - margin, full.top - margin, full.right + margin, full.bottom + margin};
  plan.full_rect = plan.result_rect = full;
  plan.may_exceed = margin > 0 ? 1 : 0;
}

void Mean(const HX_World& a, const HX_World& b, HX_World* to) {
  for (std::int32_t y = 0; y < to->height; ++y) {
    const auto row = [&](const HX_World& world) {
      return static_cast<std::uint8_t*>(world.data) +
             (y + to->origin_y - world.origin_y) * world.row_bytes +
             (to->origin_x - world.origin_x) * 4;
    };
    auto* out = static_cast<std::uint8_t*>(to->data) + y * to->row_bytes;
    for (std::int32_t i = 0; i < to->width * 4; ++i) {
      out[i] = static_cast<std::uint8_t>((row(a)[i] + row(b)[i]) / 2);
    }
  }
}

class Pixels {
 public:
  Pixels(const Call& call, std::int32_t id)
      : call_(call), render_(*static_cast<HX_RenderExtra*>(call.extra)), id_(id) {
    Check(render_.checkout_layer_pixels(call.in->effect_ref, id, &world_));
  }
  ~Pixels() { render_.checkin_layer_pixels(call_.in->effect_ref, id_); }
  Pixels(const Pixels&) = delete;
  Pixels& operator=(const Pixels&) = delete;
  const HX_World& operator*() const { return *world_; }

 private:
  const Call& call_;
  HX_RenderExtra& render_;
  std::int32_t id_;
  HX_World* world_ = nullptr;
};

void RenderPlanned(const Call& call) {
  HX_World* output = nullptr;
  Check(static_cast<HX_RenderExtra*>(call.extra)->checkout_output(call.in->effect_ref, &output));
  const std::int32_t frame = FrameOf(call);
  if (call.params[kMode]->u.pd.value == kNeighbours) {
    const Pixels before(call, frame - 1), behind(call, frame + 1);
    Mean(*before, *behind, output);
  } else {
    Draw(call, *Pixels(call, frame), output);
  }
  Suite<HX_StabilizerHostSuite7> stabilizer(call, HX_STABILIZER_HOST_SUITE, 7);
  const float outline[4] = {0, 0, static_cast<float>(output->width),
                            static_cast<float>(output->height)};
  Check(stabilizer->SetFramePolygon(call.in->effect_ref, 2, outline, frame));
}

void Run(std::uint32_t command, const Call& call) {
  switch (command) {
    case HX_CMD_ABOUT:
      return call.cb().copy_text(call.out->return_msg, HX_RETURN_MSG_SIZE, "A probe.");
    case HX_CMD_START_PLUGIN:
      return Start(call);
    case HX_CMD_STOP_PLUGIN:
      return Stop(call);
    case HX_CMD_DECLARE_PARAMS:
      return Declare(call);
    case HX_CMD_CREATE_INSTANCE:
      return SetHandle(call, NewState(call, 0));
    case HX_CMD_RESTORE_INSTANCE:
      return Restore(call);
    case HX_CMD_FLATTEN_INSTANCE:
      return Flatten(call);
    case HX_CMD_DESTROY_INSTANCE:
      return Destroy(call);
    case HX_CMD_PREPARE_FRAME:
      return Prepare(call);
    case HX_CMD_RENDER_FRAME:
      return RenderDirect(call);
    case HX_CMD_PARAM_CHANGED:
      return Changed(call);
    case HX_CMD_REFRESH_PARAMS:
      return Rerender(call);
    case HX_CMD_PLAN_FRAME:
      return Plan(call);
    case HX_CMD_RENDER_PLANNED_FRAME:
      return RenderPlanned(call);
    case HX_CMD_IDLE_TICK:
      return Tick(call);
    default:
      return;
  }
}

}  // namespace

extern "C" {
__attribute__((used, visibility("default"),
               section(HX_PROPERTY_SECTION))) extern const PropertyRecord HXPL_16000 = {};

__attribute__((visibility("default"))) HX_Err ProbeMain(std::uint32_t command, HX_InData* in,
                                                        HX_OutData* out, HX_ParamDef* params[],
                                                        HX_World* output, void* extra) {
  try {
    Run(command, Call{in, out, params, output, extra});
    return HX_ERR_NONE;
  } catch (const std::int32_t code) {
    return code;
  } catch (const std::bad_alloc&) {
    return HX_ERR_MEMORY;
  }
}
}
