#include "tests/stabilizer/effect/stabilizer_host.h"

#include <gtest/gtest.h>

#include <boost/make_shared.hpp>
#include <cmath>
#include <cstring>

#include "analysis/src/identities.h"
#include "analysis/src/job_registry.h"
#include "analysis/src/read_job_input.h"
#include "effect/entry.h"
#include "platform/tessel/threads.h"
#include "stabilization/warp/frame_map.h"
#include "stabilizer/effect/src/solve_hash.h"
#include "stabilizer/effect/src/stabilizer_strings.h"
#include "tests/effect/fake_pixels.h"

namespace kelp::effect {

using marrow::stabilization::CPWarper;
using marrow::tracking::AllFeatures;

namespace {

StabilizerHost* current = nullptr;

HX_Err FindOpaque(std::uint64_t, void** block) {
  const std::lock_guard<std::mutex> lock(current->opaque_mutex);
  *block = current->opaque;
  if (current->opaque) ++current->opaque_uses;
  return HX_ERR_NONE;
}
HX_Err SetOpaque(std::uint64_t, void* block, void** winner) {
  const std::lock_guard<std::mutex> lock(current->opaque_mutex);
  if (!current->opaque) current->opaque = block;
  *winner = current->opaque;
  ++current->opaque_uses;
  return HX_ERR_NONE;
}
HX_Err ReleaseOpaque(std::uint64_t, std::uint8_t* last) {
  const std::lock_guard<std::mutex> lock(current->opaque_mutex);
  *last = --current->opaque_uses == 0;
  if (*last) current->opaque = nullptr;
  return HX_ERR_NONE;
}
constexpr HX_OpaqueEffectDataSuite1 kOpaque = {FindOpaque, SetOpaque, ReleaseOpaque};

const HX_StabilizerHostSuite7 kStabilizerHost = {
    [](HX_EffectRef, std::uint32_t count, const float* xy, std::int32_t frame) {
      current->polygon.assign(xy, xy + 2 * count);
      current->polygon_frame = frame;
      return HX_Err{HX_ERR_NONE};
    }};

template <class Table>
const Table* LayerSuite(const char* name) {
  for (const auto& suite : analysis::FakeHost::SuiteTables()) {
    if (suite.name == name) return static_cast<const Table*>(suite.table);
  }
  return nullptr;
}

}  // namespace

HX_Err Entry(std::uint32_t command, HX_InData* in, HX_OutData* out, HX_ParamDef* params[],
             HX_World* output, void* extra) {
  return EffectMain<StabilizerEffect>(command, in, out, params, output, extra);
}

TestWorld::TestWorld(int width, int height, std::int32_t depth, int origin_x, int origin_y) {
  world_.format = depth == 32 ? HX_FORMAT_ARGBF : depth == 16 ? HX_FORMAT_ARGB16 : HX_FORMAT_ARGB8;
  world_.flags = depth == 16 ? HX_WORLD_DEEP : 0;
  world_.width = width;
  world_.height = height;
  world_.row_bytes = width * FakePixelBytes(world_.format) + 16;
  world_.origin_x = origin_x;
  world_.origin_y = origin_y;
  bytes_.assign(static_cast<std::size_t>(world_.row_bytes) * height, 0x5a);
  world_.data = bytes_.data();
}

double TestWorld::At(int x, int y, int channel) const {
  const FakePixel p = LoadFakePixel(world_, x, y);
  const double channels[] = {p.a, p.r, p.g, p.b};
  return channels[channel];
}

void TestWorld::Set(int x, int y, double red, double green) {
  StoreFakePixel(world_, x, y, {1, red, green, 0.25});
}

StabilizerHost::StabilizerHost(std::int32_t frames) {
  current = this;
  for (const auto& suite : analysis::FakeHost::SuiteTables()) {
    if (suite.name != HX_PRIVATE_EFFECT_SUITE) host.Offer(suite.name, suite.version, suite.table);
  }
  static HX_UtilitySuite utility = *LayerSuite<HX_UtilitySuite>(HX_UTILITY_SUITE);
  utility.GetEffectReference = [](HX_EffectRef, std::uint64_t* reference) {
    *reference = 7;
    return HX_Err{HX_ERR_NONE};
  };
  host.Offer(HX_UTILITY_SUITE, HX_UTILITY_SUITE_VERSION_4, &utility);
  static HX_AnalysisHostSuite1 analysis_host =
      *LayerSuite<HX_AnalysisHostSuite1>(HX_ANALYSIS_HOST_SUITE);
  analysis_host.ScheduleAnalysis = [](HX_EffectRef) { return HX_Err{HX_ERR_NONE}; };
  analysis_host.GetCompressionPreference = [](std::uint8_t* raw) {
    *raw = current->prefers_raw ? 1 : 0;
    return HX_Err{HX_ERR_NONE};
  };
  analysis_host.MayStart = [](HX_EffectRef, std::uint8_t*) { return HX_Err{HX_ERR_NONE}; };
  host.Offer(HX_ANALYSIS_HOST_SUITE, HX_ANALYSIS_HOST_SUITE_VERSION, &analysis_host);
  host.Offer(HX_OPAQUE_EFFECT_DATA_SUITE, HX_OPAQUE_EFFECT_DATA_SUITE_VERSION, &kOpaque);
  host.Offer(HX_STABILIZER_HOST_SUITE, HX_STABILIZER_HOST_SUITE_VERSION, &kStabilizerHost);

  host.in.width = 640;
  host.in.height = 360;
  host.in.total_time = frames;
  layer.count = frames;
  layer.top = layer.AddPlainClip("11111111-2222-3333-4444-555555555555");
  EXPECT_EQ(Call(HX_CMD_START_PLUGIN), HX_ERR_NONE);
  EXPECT_EQ(Call(HX_CMD_DECLARE_PARAMS), HX_ERR_NONE);
  PointAtParams();
}

void StabilizerHost::PointAtParams() {
  params_.clear();
  for (HX_ParamDef& param : host.params) params_.push_back(&param);
}

StabilizerHost::~StabilizerHost() {
  if (keeps_deletions_) host.replaced_values.push_back(deletions_param().u.arb_d.value);
  for (const HX_Handle value : host.replaced_values) DataOp(HX_DATA_DISPOSE, value);
  Destroy();
  for (const HX_Handle handle : handles_) {
    host.in.instance_handle = handle;
    Destroy();
  }
  EXPECT_EQ(opaque_uses, 0);
  EXPECT_EQ(Call(HX_CMD_STOP_PLUGIN), HX_ERR_NONE);
  tessel::threads::Shutdown();
  EXPECT_EQ(host.Leaks(), "");
  current = nullptr;
}

HX_Err StabilizerHost::Call(std::uint32_t command, HX_World* output, void* extra) {
  return host.Call(Entry, command, params_.empty() ? nullptr : params_.data(), output, extra);
}

void StabilizerHost::TickUntilSolved() {
  do {
    if (state()->solver) state()->solver->Wait();
    ASSERT_EQ(Tick(), HX_ERR_NONE);
  } while (state()->solver || state()->needs_solve);
}

void StabilizerHost::Destroy() {
  EXPECT_EQ(Call(HX_CMD_DESTROY_INSTANCE), HX_ERR_NONE);
  EXPECT_EQ(host.in.instance_handle, nullptr);
}

StabilizerEffect StabilizerHost::Effect() {
  return StabilizerEffect(
      HostContext{HX_CMD_IDLE_TICK, &host.in, &host.out, params_.data(), nullptr, nullptr});
}

StabilizerState& StabilizerHost::Analysed(const AllFeatures& table) {
  EXPECT_EQ(Call(HX_CMD_CREATE_INSTANCE), HX_ERR_NONE);
  StabilizerState& made = *state();
  made.EndAnalyzer(&host.in, &host.out);
  made.all_features = table;
  made.job_input = analysis::ReadJobInput(&host.in, &host.out);
  made.first_frame = layer.start;
  made.source_identity = analysis::GetUpstreamIdentifier(&host.in, &host.out);
  made.MakeResultIdentityUnique();
  made.first_analysis = true;
  Effect().MarkNeedsSolve();
  return made;
}

StabilizerState& StabilizerHost::Solved(boost::shared_ptr<const CPWarper> warper,
                                        boost::shared_ptr<const cropper> crop) {
  host.in.width = warper->frameWidth();
  host.in.height = warper->frameHeight();
  host.in.total_time = layer.count = warper->frameCount();
  AllFeatures table = ShakenTable(warper->frameCount(), 1);
  StabilizerState& made = Analysed(table);
  made.warper = std::move(warper);
  made.crop = std::move(crop);
  made.phase = SolvePhase::Solved;
  made.needs_solve = made.first_analysis = false;
  made.solve_input_identity = made.result_identity;
  Effect().PublishSharedData();
  return made;
}

StabilizerState& StabilizerHost::RenderCopy() {
  handles_.push_back(host.in.instance_handle);
  host.in.instance_handle = nullptr;
  EXPECT_EQ(Call(HX_CMD_RESTORE_INSTANCE), HX_ERR_NONE);
  return *state();
}

HX_CustomDataExtra StabilizerHost::DataOp(std::int32_t op, HX_Handle a, std::vector<char>* flat) {
  HX_CustomDataExtra extra{};
  extra.op = op;
  extra.param_id = 305;
  extra.a = a;
  if (flat) {
    extra.buffer = flat->data();
    extra.size = static_cast<std::uint32_t>(flat->size());
  }
  EXPECT_EQ(Call(HX_CMD_CUSTOM_DATA_OP, nullptr, &extra), HX_ERR_NONE) << op;
  return extra;
}

void StabilizerHost::SetDeletions(const analysis::effect::DeletedTrackPoints& deletions) {
  if (!keeps_deletions_) {
    HX_ParamDef param{};
    param.disk_id = 305;
    param.kind = HX_PARAM_ARBITRARY;
    host.params.push_back(param);
    PointAtParams();
    keeps_deletions_ = true;
  }
  std::vector<char> flat(deletions.FlatSize());
  deletions.Flatten(flat.data());
  HX_Handle& value = deletions_param().u.arb_d.value;
  if (value) DataOp(HX_DATA_DISPOSE, value);
  value = DataOp(HX_DATA_UNFLATTEN, nullptr, &flat).out;
}

analysis::effect::DeletedTrackPoints StabilizerHost::Deletions() {
  const HX_Handle value = deletions_param().u.arb_d.value;
  std::vector<char> flat(DataOp(HX_DATA_FLAT_SIZE, value).size);
  DataOp(HX_DATA_FLATTEN, value, &flat);
  return {flat.data(), flat.size()};
}

void StabilizerHost::Set(std::int32_t index, double value) {
  HX_ParamDef& param = host.params.at(index);
  switch (param.kind) {
    case HX_PARAM_FLOAT_SLIDER:
      param.u.fs.value = value;
      break;
    case HX_PARAM_POPUP:
      param.u.pd.value = static_cast<std::int32_t>(value);
      break;
    default:
      param.u.bd.value = static_cast<std::int32_t>(value);
  }
}

double StabilizerHost::Value(std::int32_t index) const {
  return ValueOf(host.params.at(index));
}

bool StabilizerHost::Enabled(std::int32_t index) const {
  return (host.params.at(index).ui_flags & HX_PARAM_UI_DISABLED) == 0;
}

std::string StabilizerHost::Name(std::int32_t index) const {
  return host.params.at(index).name;
}

int StabilizerHost::Status() const {
  return static_cast<int>(Value(kAnalysisStatusCounterIndex)) % 100;
}

HX_Err StabilizerHost::Plan(const HX_Rect& request, std::int32_t depth) {
  orders.clear();
  plan = {};
  plan.request = {request, depth};
  plan.checkout_layer = [](HX_EffectRef, std::int32_t index, std::int32_t id,
                           const HX_RenderRequest* order, std::int32_t time, std::int32_t,
                           std::uint32_t scale, HX_CheckoutResult* result) {
    EXPECT_EQ(index, 0);
    EXPECT_EQ(current->orders.count(id), 0u) << "ordered twice";
    current->orders[id] = static_cast<double>(time) / scale;
    result->result_rect = result->full_rect = order->rect;
    return HX_Err{HX_ERR_NONE};
  };
  return Call(HX_CMD_PLAN_FRAME, nullptr, &plan);
}

HX_Err StabilizerHost::RenderPlan(TestWorld& output, std::int32_t depth) {
  static HX_World* target;
  target = output.get();
  HX_RenderExtra extra{};
  extra.request = {plan.request.rect, depth};
  extra.checkout_layer_pixels = [](HX_EffectRef, std::int32_t id, HX_World** world) {
    if (current->orders.count(id) == 0 || id == current->refused_layer) {
      return HX_Err{FakeHost::kFault};
    }
    *world = current->pixels;
    ++current->layers_out;
    return HX_Err{HX_ERR_NONE};
  };
  extra.checkin_layer_pixels = [](HX_EffectRef, std::int32_t) {
    --current->layers_out;
    return HX_Err{HX_ERR_NONE};
  };
  extra.checkout_output = [](HX_EffectRef, HX_World** world) {
    *world = target;
    return HX_Err{HX_ERR_NONE};
  };
  return Call(HX_CMD_RENDER_PLANNED_FRAME, nullptr, &extra);
}

}  // namespace kelp::effect
