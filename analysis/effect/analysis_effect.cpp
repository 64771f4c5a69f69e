#include "analysis/effect/analysis_effect.h"

#include <algorithm>
#include <cmath>
#include <exception>

#include "analysis/effect/analysis_parameter_rows.h"
#include "analysis/effect/analysis_parameter_rules.h"
#include "analysis/effect/analysis_strings.h"
#include "analysis/effect/deletions_parameter.h"
#include "analysis/effect/effect_parameters.h"
#include "analysis/src/read_job_input.h"
#include "effect/host_requests.h"
#include "effect/host_text.h"
#include "effect/suite.h"

// Parameters, statuses, and the life of an instance; analysis_service.cpp has the analysis itself.
namespace kelp::analysis::effect {

using kelp::effect::ThrowIfFailed;
using tesselui::drawbot::Color;

namespace {

constexpr float kBannerAlpha = 0.8f;
constexpr float kFaintAlpha = 0.2f;
constexpr Color kBlue{0.00784f, 0.25098f, 1.0f, kBannerAlpha};
constexpr Color kDarkBlue{0.00627f, 0.20078f, 0.8f, kBannerAlpha};
constexpr Color kOrange{0.8f, 0.33333f, 0.0f, kBannerAlpha};
constexpr Color kRed{0.77255f, 0.0f, 0.0f, kBannerAlpha};

// Where the counter begins again, before a slider's float loses count of it.
constexpr std::int64_t kCounterEnd = 2000000000;

// Lives until the plug-in is unloaded, like the host's records that point at its texts.
kelp::effect::ParameterTexts& Texts() {
  static kelp::effect::ParameterTexts texts([](std::int32_t) { return nullptr; });
  return texts;
}

}  // namespace

void AnalysisEffect::ParamChanged() {
  if (context().extra == nullptr) return;
  HandleParamChange(*static_cast<const HX_ParamChangedExtra*>(context().extra));
}

void AnalysisEffect::IdleTick() {
  ServiceAnalysis(false);
}

void AnalysisEffect::CustomDataOp() {
  if (context().extra == nullptr) return;
  RunCustomDataOp(context(), *static_cast<HX_CustomDataExtra*>(context().extra));
}

HX_Err AnalysisEffect::AddParam(std::int32_t id) {
  const kelp::effect::ParameterRow* row = AnalysisParameterRow(id);
  if (row == nullptr) return HX_ERR_NONE;
  const HX_ParamDef param = kelp::effect::MakeParamDef(*row, Texts());
  return context().in->cb->add_param(context().in->effect_ref, -1, &param);
}

double AnalysisEffect::GetParamDefault(std::int32_t id) {
  const kelp::effect::ParameterRow* row = AnalysisParameterRow(id);
  return row == nullptr ? 0 : row->default_value;
}

double AnalysisEffect::GetFloatParam(std::int32_t id) {
  return EffectParameters(*this).GetFloatParam(id);
}

std::int32_t AnalysisEffect::GetIntParam(std::int32_t id) {
  return EffectParameters(*this).GetIntParam(id);
}

bool AnalysisEffect::GetBoolParam(std::int32_t id) {
  return EffectParameters(*this).GetBoolParam(id);
}

std::int32_t AnalysisEffect::GetPopupParam(std::int32_t id) {
  return EffectParameters(*this).GetPopupParam(id);
}

bool AnalysisEffect::IsParamAbsent(std::int32_t index) {
  return !kelp::effect::ShowsExperimentalParameters() && IsExperimentalIndex(index);
}

marrow::tracking::SelectorParams AnalysisEffect::GetSelectorParams() {
  return effect::GetSelectorParams(EffectParameters(*this),
                                   static_cast<std::uint32_t>(context().in->width),
                                   static_cast<std::uint32_t>(context().in->height));
}

marrow::tracking::TrackerParams AnalysisEffect::GetTrackerParams() {
  return effect::GetTrackerParams(EffectParameters(*this),
                                  static_cast<std::uint32_t>(context().in->height));
}

FrameStatus AnalysisEffect::GetStatusForFrame(std::int64_t frame) {
  AnalysisState* const state = GetState();
  if (state == nullptr) return FrameStatus::PressAnalyze;
  try {
    const JobInput present = ReadJobInput(context().in, context().out);
    return GetAnalysisStatus(*state, frame, &present);
  } catch (...) {  // of the host's; the banner tells it
    state->error_text = context().out->return_msg;
    kelp::effect::ClearMessage(context());
    return GetAnalysisStatus(*state, frame, nullptr);
  }
}

const char* AnalysisEffect::GetStatusMessage(FrameStatus status) {
  return AnalysisStatusLiteral(static_cast<std::int32_t>(status));
}

bool AnalysisEffect::IsFailureStatus(FrameStatus status) {
  return status == FrameStatus::TrackingFailed || status == FrameStatus::SolveFailed ||
         status == FrameStatus::GeneralFailure;
}

bool AnalysisEffect::ShowsOverlay() {
  return GetBoolParam(kShowTracksParam) && NeedsOverlayOrBanner();
}

bool AnalysisEffect::NeedsOverlayOrBanner() {
  const FrameStatus status = GetStatusForFrame(GetCurrentFrame(true).frame);
  return status == FrameStatus::SubsequentSolveOnDeletion || status == FrameStatus::SolveFailed ||
         status == FrameStatus::GeneralFailure || IsFinishedStatus(status);
}

bool AnalysisEffect::IsRenderableFrame() {
  const CurrentFrame current = GetCurrentFrame(true);
  if (!current.valid) return false;
  const marrow::tracking::AllFeatures& table = GetState()->table();
  const std::int64_t row = current.frame - table.first_frame;
  if (row < 0 || row >= table.frame_count) return false;
  return !ShowsOverlay() && IsFinishedStatus(GetStatusForFrame(current.frame));
}

bool AnalysisEffect::IsFinishedStatus(FrameStatus status) {
  return status == FrameStatus::RangeChanged || status == FrameStatus::Ready;
}

void AnalysisEffect::GetBannerColors(FrameStatus status, Color* first, Color* second) {
  switch (status) {
    case FrameStatus::AnalysisInProgress:
      *first = kBlue;
      *second = kDarkBlue;
      return;
    case FrameStatus::SolveInProgress:
    case FrameStatus::SubsequentSolve:
    case FrameStatus::SubsequentSolveOnDeletion:
      *first = kOrange;
      if (status == FrameStatus::SubsequentSolveOnDeletion) first->alpha = kFaintAlpha;
      *second = {0.8f * first->red, 0.8f * first->green, 0.8f * first->blue, first->alpha};
      return;
    case FrameStatus::TrackingFailed:
    case FrameStatus::SolveFailed:
    case FrameStatus::GeneralFailure:
      *first = *second = kRed;
      return;
    default:
      *first = *second = kBlue;
      return;
  }
}

bool AnalysisEffect::IsBannerHidden() {
  return false;
}

double AnalysisEffect::GetOverlayScale() {
  return 1.0;
}

void AnalysisEffect::SetupInstance() {
  CreateInstanceState(false);
  if (IsOneByOne()) return;
  try {
    StartAnalysis();
  } catch (...) {  // the instance waits for its Analyze button; a message stays for the user
  }
}

void AnalysisEffect::TeardownInstance() {
  DetachSharedData();
  HX_InData& in = *context().in;
  HX_OutData& out = *context().out;
  if (in.instance_handle == nullptr) {
    out.instance_handle = nullptr;
    return;
  }
  // A failure to tell the user does not keep the instance.
  std::exception_ptr failure;
  AnalysisState* const state = GetState();
  if (state != nullptr && !state->keep_jobs) {
    DropSolveJob();
    try {
      if (state->analyzer && state->analyzer->IsActive()) CancelAnalysis(state, nullptr, true);
    } catch (...) {
      failure = std::current_exception();
    }
    // One that has ended goes too: its table would stay in the registry for ever.
    state->EndAnalyzer(&in, &out);
  }
  DestroyInstanceHandle(in.instance_handle);
  in.instance_handle = out.instance_handle = nullptr;
  if (failure) std::rethrow_exception(failure);
}

void AnalysisEffect::DestroyInstanceHandle(HX_Handle handle) {
  DestroyStateInHandle(handle);
  context().in->cb->dispose_handle(handle);
}

void AnalysisEffect::CreateInstanceState(bool render_copy) {
  HX_InData& in = *context().in;
  HX_OutData& out = *context().out;
  if (in.instance_handle != nullptr) {
    DestroyInstanceHandle(in.instance_handle);
    in.instance_handle = out.instance_handle = nullptr;
  }
  in.instance_handle = out.instance_handle = AllocateInstanceHandle(1);
  if (!IsOneByOne()) CreateStateInHandle(in.instance_handle, render_copy);
}

void AnalysisEffect::MarkNeedsSolve() {}

void AnalysisEffect::MarkAnalysisFailed() {}

void AnalysisEffect::PublishStatus(FrameStatus status) {
  if (status == FrameStatus::None) return;
  const double present = GetFloatParam(kAnalysisStatusCounterParam);
  // Not a number counts as 0.
  const std::int64_t value = present > 0 ? std::llround(std::min(present, double{kCounterEnd})) : 0;
  std::int64_t next = (value / 100 + 1) * 100 + static_cast<std::int64_t>(status);
  if (next > kCounterEnd) next = 100 + static_cast<std::int64_t>(status);
  if (static_cast<double>(next) == present) return;
  kelp::effect::SetSliderValue(context(), ParamIdToIndex(kAnalysisStatusCounterParam),
                               static_cast<double>(next));
}

void AnalysisEffect::PublishSharedData() {}

void AnalysisEffect::AttachSharedData(bool) {}

bool AnalysisEffect::DetachSharedData() {
  return false;
}

CurrentFrame AnalysisEffect::GetCurrentFrame(bool clamped) try {
  const AnalysisState* const state = GetState();
  if (state == nullptr || state->table().frame_count <= 0) return {};
  const HX_InData& in = *context().in;
  const std::int64_t start = GetLayerStart(*state);
  std::int32_t time = in.current_time;
  if (clamped) time = std::max(std::min(time, in.total_time), 0);
  const std::int64_t frame =
      FloorSteps({time, in.time_scale}, RowDuration(state->result->job_input)) + start;
  // Whatever was done to the layer since, an analysed frame stands for itself.
  const marrow::tracking::AllFeatures& table = state->table();
  const std::int64_t last =
      table.frame_count + std::max<std::int64_t>({start, table.first_frame, 0}) - 1;
  const std::int64_t shown = std::clamp<std::int64_t>(frame, 0, last);
  return {true, shown, shown != frame || time != in.current_time};
} catch (...) {
  kelp::effect::ClearMessage(context());
  return {};
}

std::int64_t AnalysisEffect::GetLayerStart(const AnalysisState& state) {
  std::int32_t start = 0;
  const kelp::effect::ScopedSuite<HX_UtilitySuite> suite(context(), HX_UTILITY_SUITE_VERSION_3);
  ThrowIfFailed(suite->GetStartFrame(context().in->effect_ref, &start));
  return std::int64_t{start} * (CountsFields(state.result->job_input) ? 2 : 1);
}

StatusRecord AnalysisEffect::GetStatusRecord() {
  StatusRecord record{GetStatusForFrame(GetCurrentFrame(true).frame), {}};
  const AnalysisState* const state = GetState();
  if (record.status == FrameStatus::GeneralFailure && state != nullptr) {
    record.text = state->error_text;
  }
  return record;
}

bool AnalysisEffect::IsOneByOne() const {
  return kelp::effect::ShapeOf(*context().in).one_by_one();
}

}  // namespace kelp::analysis::effect
