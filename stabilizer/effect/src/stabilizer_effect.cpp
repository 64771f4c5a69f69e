#include "stabilizer/effect/src/stabilizer_effect.h"

#include <boost/make_shared.hpp>
#include <memory>
#include <utility>

#include "analysis/effect/banner_cache.h"
#include "analysis/effect/deletions_parameter.h"
#include "analysis/effect/effect_parameters.h"
#include "analysis/src/job_registry.h"
#include "effect/effect_globals.h"
#include "effect/host_text.h"
#include "effect/parameter_row.h"
#include "stabilizer/effect/src/instance_handle.h"
#include "stabilizer/effect/src/parameter_table.h"
#include "stabilizer/effect/src/stabilizer_strings.h"

// The plug-in's life, its parameters, and the state of an instance. The idle step is in
// solve_service.cpp, the renders in render_service.cpp, what they share in shared_service.cpp.
namespace kelp::effect {

using analysis::FrameStatus;
using analysis::effect::EffectParameters;

namespace {

// What the host's records point at: texts of the open string table, and literals.
ParameterTexts& TextsOf(const HostContext& context) {
  struct Texts {
    std::uint64_t token;
    ParameterTexts texts;
  };
  static std::unique_ptr<Texts> kept;
  const std::uint64_t token = GlobalsLock(context)->string_token;
  if (!kept || kept->token != token) {
    const HX_Callbacks& host = *context.in->cb;
    kept.reset(new Texts{token, ParameterTexts([&host, token](std::int32_t number) {
                           return host.get_string(token, number, 0, 0);
                         })});
  }
  return kept->texts;
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
  analysis::JobRegistry::Instance().CancelAll();
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
  return NewInstanceHandle(context(), size);
}

void StabilizerEffect::CreateStateInHandle(HX_Handle handle, bool keep_jobs) {
  const InstanceHandleLock header(context(), handle);
  if (header->flattened) throw std::int32_t{HX_ERR_HANDLE_LOCK};
  header->state = new StabilizerState(*context().in, keep_jobs);
}

void StabilizerEffect::DestroyStateInHandle(HX_Handle handle) {
  if (!StateOfHandle(context(), handle)) return;
  const InstanceHandleLock header(context(), handle);
  const std::unique_ptr<StabilizerState> state(std::exchange(header->state, nullptr));
}

void StabilizerEffect::CreateInstanceState(bool render_copy) {
  DetachSharedData();
  AnalysisEffect::CreateInstanceState(render_copy);
  AttachSharedData(render_copy);
}

}  // namespace kelp::effect
