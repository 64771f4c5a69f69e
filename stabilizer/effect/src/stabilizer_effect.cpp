#include "stabilizer/effect/src/stabilizer_effect.h"

#include <boost/make_shared.hpp>
#include <map>
#include <mutex>
#include <utility>

#include "analysis/effect/banner_cache.h"
#include "analysis/effect/deletions_parameter.h"
#include "analysis/effect/effect_parameters.h"
#include "analysis/src/job_registry.h"
#include "effect/effect_globals.h"
#include "effect/handle.h"
#include "effect/host_requests.h"
#include "effect/host_text.h"
#include "effect/parameter_row.h"
#include "stabilizer/effect/src/instance_handle.h"
#include "stabilizer/effect/src/parameter_table.h"
#include "stabilizer/effect/src/render_service.h"
#include "stabilizer/effect/src/shared_service.h"
#include "stabilizer/effect/src/solve_service.h"
#include "stabilizer/effect/src/stabilizer_strings.h"
#include "stabilizer/effect/src/stored_service.h"

namespace kelp::effect {

using analysis::FrameStatus;
using analysis::effect::EffectParameters;

namespace {

// What the hosts' records point at: texts of the open string tables, and literals. By the tables'
// tokens, since a process may have several hosts, each with a thread of its own.
struct OpenTexts {
  std::mutex mutex;
  std::map<std::uint64_t, ParameterTexts> by_token;  // guarded by mutex

  static OpenTexts& Get() {
    static OpenTexts texts;
    return texts;
  }
};

ParameterTexts& TextsOf(const HostContext& context) {
  const std::uint64_t token = GlobalsLock(context)->string_token;
  const HX_Callbacks& host = *context.in->cb;
  OpenTexts& texts = OpenTexts::Get();
  const std::lock_guard lock(texts.mutex);
  const auto found = texts.by_token.find(token);
  if (found != texts.by_token.end()) return found->second;
  return texts.by_token
      .try_emplace(token, [&host, token](
                              std::int32_t number) { return host.get_string(token, number, 0, 0); })
      .first->second;
}

void ForgetTexts(const HostContext& context) {
  if (!context.in->global_data) return;
  const std::uint64_t token = GlobalsLock(context)->string_token;
  OpenTexts& texts = OpenTexts::Get();
  const std::lock_guard lock(texts.mutex);
  texts.by_token.erase(token);
}

std::int32_t PopupOf(HX_ParamDef** params, ParamIndex index) {
  return static_cast<std::int32_t>(ValueOf(*params[index]));
}

// With the layer's.
std::int32_t DeclaredParamCount() {
  return ShowsExperimentalParameters() ? kParamCount : kFirstExperimentalIndex;
}

}  // namespace

void StabilizerEffect::ShowAbout() {
  ShowAboutText(context());
}

void StabilizerEffect::StartPlugin() {
  OpenPlugin(context(), StabilizerStringTable());
}

void StabilizerEffect::StopPlugin() {
  analysis::JobRegistry::Instance().CancelAll(context().in->global_data);
  ForgetTexts(context());
  ClosePlugin(context());
}

void StabilizerEffect::DeclareParams() {
  DeclareParamCount(DeclaredParamCount());
}

HX_Err StabilizerEffect::AddParam(std::int32_t index) {
  const ParameterRow* row = ParameterTableRow(index);
  if (!row) return HX_ERR_NONE;
  const HX_ParamDef param = MakeParamDef(*row, TextsOf(context()));
  return context().in->cb->add_param(context().in->effect_ref, -1, &param);
}

double StabilizerEffect::GetParamDefault(std::int32_t id) {
  return kelp::effect::GetParamDefault(id);
}

std::int32_t StabilizerEffect::ParamIdToIndex(std::int32_t id) {
  // A host appends what it keeps of its own.
  if (id == analysis::effect::kDeletedTrackPointsParam) return DeclaredParamCount();
  return kelp::effect::ParamIdToIndex(id);
}

std::int32_t StabilizerEffect::IndexToParamId(std::int32_t index) {
  return kelp::effect::IndexToParamId(index);
}

bool StabilizerEffect::IsExperimentalIndex(std::int32_t index) {
  return kelp::effect::IsExperimentalIndex(index);
}

void StabilizerEffect::ReportOutOfMemory() {
  ReportOutOfMemoryOnFrame(context(), GetCurrentFrame(false).frame);
}

void StabilizerEffect::ReportUnknownException() {
  ReportUnknownExceptionOnFrame(context(), GetCurrentFrame(false).frame);
}

// -- Status --

FrameStatus StabilizerEffect::GetStatusForFrame(std::int64_t frame) {
  const FrameStatus status = AnalysisEffect::GetStatusForFrame(frame);
  const StabilizerState* const state = GetState();
  if (!state || (status >= FrameStatus::AnalysisInProgress && status != FrameStatus::Ready)) {
    return status;
  }
  if (status == FrameStatus::PressAnalyze || status == FrameStatus::OutsideRange) {
    return state->phase == SolvePhase::AnalysisFailed ? FrameStatus::TrackingFailed : status;
  }
  if (state->phase == SolvePhase::Failed) return FrameStatus::SolveFailed;
  if (state->needs_solve) return state->SolveProgressStatus();
  if (state->IsOverCropped(EffectParameters(*this))) return FrameStatus::OverCropped;
  return status;
}

const char* StabilizerEffect::GetStatusMessage(FrameStatus status) {
  const char* own = StabilizerStatusLiteral(static_cast<std::int32_t>(status));
  return own ? own : AnalysisEffect::GetStatusMessage(status);
}

bool StabilizerEffect::IsFinishedStatus(FrameStatus status) {
  return AnalysisEffect::IsFinishedStatus(status) || status == FrameStatus::OverCropped;
}

void StabilizerEffect::GetBannerColors(FrameStatus status, tesselui::drawbot::Color* first,
                                       tesselui::drawbot::Color* second) {
  AnalysisEffect::GetBannerColors(
      status == FrameStatus::OverCropped ? FrameStatus::SolveFailed : status, first, second);
}

bool StabilizerEffect::IsBannerHidden() {
  return GetBoolParam(kHideWarningBannerIndex);
}

boost::shared_ptr<analysis::effect::BannerCache> StabilizerEffect::GetBannerCache() {
  const GlobalsLock globals(context());
  if (!globals->banner_cache) {
    globals->banner_cache = boost::make_shared<analysis::effect::BannerCache>();
  }
  return globals->banner_cache;
}

boost::shared_ptr<std::mutex> StabilizerEffect::GetBannerCacheLock() {
  return GlobalsLock(context())->banner_cache_lock;
}

std::string StabilizerEffect::GetCancelMessage() {
  return GetString(context(), kStringCanceled);
}

// -- The state of an instance --

StabilizerState* StabilizerEffect::GetState() {
  return StateOfHandle(context(), context().in->instance_handle);
}

HX_Handle StabilizerEffect::AllocateInstanceHandle(std::uint64_t size) {
  return NewLiveHandle(context(), size);
}

void StabilizerEffect::CreateStateInHandle(HX_Handle handle, bool keep_jobs) {
  const InstanceHandleLock header(context(), handle);
  header.SetState(std::make_unique<StabilizerState>(*context().in, keep_jobs));
}

void StabilizerEffect::DestroyStateInHandle(HX_Handle handle) {
  if (InspectInstance(context(), handle) != FlattenedInstance::Live) return;
  const std::unique_ptr<StabilizerState> state = InstanceHandleLock(context(), handle).TakeState();
}

void StabilizerEffect::CreateInstanceState(bool render_copy) {
  DetachSharedData();
  AnalysisEffect::CreateInstanceState(render_copy);
  AttachSharedData(render_copy);
}

// A flattened instance takes the place of the live one.
void StabilizerEffect::FlattenInstance() {
  HX_InData& in = *context().in;
  const HX_Handle live = in.instance_handle;
  if (!live || InspectInstance(context(), live) != FlattenedInstance::Live) return;
  OwnedHandle flat(*in.cb, FlattenedHandle(context(), GetState()));
  {
    // Locked before anything changes. An analysis goes on without the state: whoever asks for the
    // same again finds its job.
    const InstanceHandleLock header(context(), live);
    if (const StabilizerState* const state = GetState()) state->ForgetTracks();
    DetachSharedData();
    const std::unique_ptr<StabilizerState> state = header.TakeState();
  }
  in.instance_handle = context().out->instance_handle = flat.release();
  in.cb->dispose_handle(live);
}

void StabilizerEffect::ReloadInstance() {
  HX_InData& in = *context().in;
  const HX_Handle stored = in.instance_handle;
  if (!stored) return CreateInstanceState(true);
  const FlattenedInstance kind = InspectInstance(context(), stored);
  if (kind == FlattenedInstance::Live) return;
  std::unique_ptr<StabilizerState> state = StateOfFlattened(context(), kind);
  if (state) {
    const double counter = GetFloatParam(kAnalysisStatusCounterIndex);
    state->unpublished = UntoldStatus(state.get(), counter);
  }
  OwnedHandle live(*in.cb, AllocateInstanceHandle(kLivePayloadLength));
  try {
    InstanceHandleLock(context(), live.get()).SetState(std::move(state));
  } catch (...) {
    ForgetLiveHandle(live.get());
    throw;
  }
  in.instance_handle = context().out->instance_handle = live.release();
  in.cb->dispose_handle(stored);
  AttachSharedData(false);
  const StabilizerState* const present = GetState();
  if (present && present->unpublished != FrameStatus::None) PublishStatus(present->unpublished);
  ForceRerender(context());
}

// -- The analysis and the solve made of it --

bool StabilizerEffect::ServiceAnalysis(bool from_render) {
  if (const StabilizerState* const own = GetState()) {
    if (own->keep_jobs) return false;
    try {  // a block that could not be had when the instance came
      AttachSharedData(true);
    } catch (std::int32_t) {
      ClearMessage(context());
    }
    // Before the analysis goes on: a host that never heard of it would not wait for it.
    if (own->unpublished != FrameStatus::None) PublishStatus(own->unpublished);
  }
  if (AnalysisEffect::ServiceAnalysis(from_render)) return true;
  StabilizerState* const state = GetState();
  // Whatever ended the work without a word.
  const FrameStatus end = UntoldEnd(state, GetFloatParam(kAnalysisStatusCounterIndex));
  if (end != FrameStatus::None) PublishStatus(end);
  if (!state) {
    PublishSharedData();
    return false;
  }
  const analysis::Validity validity = GetValidity(*state);
  NoteSource(validity);  // what a solve that has ended tells depends on it
  SolveService solve(*this, *state);
  if (state->solver) {
    const Solver::State status = state->solver->GetState();
    if (status == Solver::finished || status == Solver::failed) solve.Finish();
    if (status != Solver::running && status != Solver::failed) {
      PublishSharedData();
      return false;
    }
  }
  solve.CheckParams();
  if (solve.StartIfNeeded()) {
    PublishStatus(state->SolveProgressStatus());
    ForceRerender(context());
    return true;
  }
  if (context().params) {
    UpdateStartStopButtonEnablement(validity != analysis::Validity::Current, false, nullptr);
    if (state->solver) solve.ShowProgress();
  }
  PublishSharedData();
  return true;
}

// A solve that is to come tells it at its end.
void StabilizerEffect::NoteSource(analysis::Validity validity) {
  StabilizerState& state = *GetState();
  const bool changed = validity == analysis::Validity::OtherSource;
  if (validity == analysis::Validity::Unknown || changed == state.source_changed) return;
  state.source_changed = changed;
  if (!state.needs_solve) PublishStatus(state.SettledStatus());
  ForceRerender(context());
}

void StabilizerEffect::RefreshParams() {
  AnalysisEffect::RefreshParams();
  HX_ParamDef** const params = context().params;
  if (!params) return;
  const auto enable = [this](std::int32_t index, bool enabled) {
    UpdateParamUI(context(), index, {enabled, nullptr});
  };
  StabilizerState* const state = GetState();
  const bool no_motion = PopupOf(params, kResultIndex) == static_cast<int>(Result::no_motion);
  const auto framing = static_cast<Framing>(PopupOf(params, kFramingIndex));
  const auto method = static_cast<Method>(PopupOf(params, kMethodIndex));
  const bool auto_scales = framing == Framing::crop_auto_scale;
  enable(kSmoothnessIndex, !no_motion);
  if (state && crops(framing)) SolveService(*this, *state).ShowAutoScale();
  if (state) SolveService(*this, *state).ShowProgress();
  enable(kCropLessSmoothMoreIndex, crops(framing) && !no_motion);
  for (const std::int32_t index :
       {kAutoScaleGroupIndex, kMaximumScaleIndex, kActionSafeMarginIndex}) {
    enable(index, auto_scales);
  }
  enable(kRollingShutterRippleIndex,
         method == Method::perspective || method == Method::subspace_warp);
  for (std::int32_t index = kSynthesisInputRangeIndex; index <= kSynthesisBottomIndex; ++index) {
    enable(index, framing == Framing::synthesize_edges);
  }
  if (state) SolveService(*this, *state).CheckParams();
  ForceRerender(context());
}

void StabilizerEffect::RestartAnalysis() {
  TeardownInstance();
  CreateInstanceState(false);
  StartAnalysis();
  PublishStatus(FrameStatus::AnalysisInProgress);
}

void StabilizerEffect::DropSolveJob() {
  if (StabilizerState* const state = GetState()) state->solver.reset();
}

bool StabilizerEffect::IsBusy() {
  const StabilizerState* const state = GetState();
  return AnalysisEffect::IsBusy() ||
         (state && ((state->has_frames() && state->needs_solve) || state->IsWorkingOnResults()));
}

void StabilizerEffect::MarkNeedsSolve() {
  StabilizerState* const state = GetState();
  if (!state) return;
  state->needs_solve = true;
  state->subsequent_solve = false;
}

void StabilizerEffect::MarkAnalysisFailed() {
  if (StabilizerState* const state = GetState()) state->phase = SolvePhase::AnalysisFailed;
}

void StabilizerEffect::PublishStatus(FrameStatus status) {
  StabilizerState* const state = GetState();
  if (state) state->unpublished = status;
  PublishSharedData();
  AnalysisEffect::PublishStatus(status);
  if (state) state->unpublished = FrameStatus::None;
}

// -- The block shared with renders --

void StabilizerEffect::PublishSharedData() {
  const StabilizerState* const state = GetState();
  if (!state || !state->shared || state->keep_jobs) return;
  const SolveResult& solve = *state->solve_result;
  // The status asks the host, so it comes last and ahead of the lock.
  const auto framing = static_cast<Framing>(GetPopupParam(kFramingIndex));
  const bool gpu_allowed = solve.warper && framing != Framing::synthesize_edges &&
                           (!crops(framing) || solve.crop) &&
                           GetStatusForFrame(state->table().first_frame) == FrameStatus::Ready;
  state->Publish(gpu_allowed);
}

void StabilizerEffect::AttachSharedData(bool skip_publish) {
  StabilizerState* const state = GetState();
  if (!state || state->shared) return;
  AttachBlock(context(), *state);
  if (!skip_publish) PublishSharedData();
}

bool StabilizerEffect::DetachSharedData() {
  StabilizerState* const state = GetState();
  return state && state->shared && DetachBlock(context(), *state);
}

// -- Renders --

void StabilizerEffect::PrepareFrame() {
  if (StabilizerState* const state = GetState()) state->TakeOver();
  const OutputRect output = RenderService(*this).SetUpOutput();
  context().out->width = output.width;
  context().out->height = output.height;
  context().out->origin_x = output.origin_x;
  context().out->origin_y = output.origin_y;
}

void StabilizerEffect::PlanFrame() {
  if (!context().extra) return;
  RenderService(*this).Plan(*static_cast<HX_PlanExtra*>(context().extra));
}

void StabilizerEffect::RenderPlannedFrame() {
  if (!context().extra) return;
  RenderService(*this).RenderPlanned(*static_cast<const HX_RenderExtra*>(context().extra));
}

void StabilizerEffect::RenderFrame() {
  if (!context().output) return;
  RenderService(*this).RenderDirect(*context().output);
}

}  // namespace kelp::effect
