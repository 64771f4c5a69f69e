#include <algorithm>
#include <string>
#include <utility>
#include <vector>

#include "analysis/effect/analysis_effect.h"
#include "analysis/effect/analysis_parameter_rows.h"
#include "analysis/effect/analysis_strings.h"
#include "analysis/effect/deletions_parameter.h"
#include "analysis/effect/effect_parameters.h"
#include "analysis/effect/pick_track_file.h"
#include "analysis/host/video_segment_render_suite_job.h"
#include "analysis/src/identities.h"
#include "analysis/src/mix_hash_guid.h"
#include "analysis/src/progress.h"
#include "analysis/src/read_job_input.h"
#include "effect/host_requests.h"
#include "effect/host_text.h"
#include "effect/suite.h"
#include "platform/tessel/config.h"
#include "platform/tessel/utility.h"

// What AnalysisEffect does about its analysis: the buttons, the start, the idle step, the end.
namespace kelp::analysis::effect {

using kelp::effect::ScopedSuite;
using kelp::effect::ThrowIfFailed;
using tessel::utility::HighPrecisionTime;

namespace {

void EndJob(const kelp::effect::HostContext& context, Analyzer& analyzer,
            const std::string& text = {}) {
  analyzer.Cancel(context.in, context.out, text.c_str());
  analyzer.Stop(context.in, context.out);
}

// Tells the job where the host sees the clip's shot end by now; nothing where it sees to no shots.
void TellEnd(const kelp::effect::HostContext& context, Analyzer& analyzer) try {
  const ScopedSuite<HX_AnalysisSpanSuite1> suite(context);
  std::int32_t end = 0;
  ThrowIfFailed(suite->GetEnd(context.in->effect_ref, &end));
  const JobInput& input = analyzer.record().job_input_parameters;
  const std::int64_t rows_a_frame = CountsFields(input) ? 2 : 1;
  analyzer.EndBefore(std::max<std::int64_t>(end - analyzer.FirstFrame(), 1) * rows_a_frame);
} catch (std::int32_t) {
  kelp::effect::ClearMessage(context);
}

// Has the host keep what the job has done, where it does that.
void KeepPieces(const kelp::effect::HostContext& context, Analyzer& analyzer) try {
  const ScopedSuite<HX_AnalysisKeepingSuite1> suite(context);
  for (const Analysis::Piece& piece : analyzer.TakePieces()) {
    ThrowIfFailed(suite->Keep(context.in->effect_ref, static_cast<std::uint32_t>(piece.number),
                              piece.bytes.data(), piece.bytes.size()));
  }
  std::uint8_t wanted = 0;
  ThrowIfFailed(suite->IsWanted(context.in->effect_ref, &wanted));
  if (wanted != 0) analyzer.WantPiece();
} catch (std::int32_t) {
  kelp::effect::ClearMessage(context);
}

void GiveKeptPieces(const kelp::effect::HostContext& context, Analyzer& analyzer) try {
  const ScopedSuite<HX_AnalysisKeepingSuite1> suite(context);
  std::vector<Bytes> pieces;
  while (true) {
    const void* bytes = nullptr;
    std::uint64_t size = 0;
    const auto number = static_cast<std::uint32_t>(pieces.size());
    ThrowIfFailed(suite->Find(context.in->effect_ref, number, &bytes, &size));
    if (bytes == nullptr) break;
    const auto* const first = static_cast<const std::uint8_t*>(bytes);
    pieces.emplace_back(first, first + size);
  }
  analyzer.GiveKept(std::move(pieces));
} catch (std::int32_t) {
  kelp::effect::ClearMessage(context);
}

// Throws HX_ERR_LAYER_REFUSED, with a message, for a layer that shows nothing.
void ExpectFrames(const kelp::effect::HostContext& context) {
  if (ReadJobInput(context.in, context.out).Duration.numerator > 0) return;
  kelp::effect::ShowMessage(context, tessel::config::Localizer::Localize(kEmptyLayer).c_str());
  throw std::int32_t{HX_ERR_LAYER_REFUSED};
}

}  // namespace

void AnalysisEffect::UpdateButton(std::int32_t id, bool enabled, const char* name) {
  const std::int32_t index = ParamIdToIndex(id);
  if (index != kNoIndex) kelp::effect::UpdateParamUI(context(), index, {enabled, name});
}

void AnalysisEffect::UpdateStartStopButtonEnablement(bool analyze_enabled, bool cancel_enabled,
                                                     const char* cancel_label) {
  const std::string label = cancel_label == nullptr ? "" : cancel_label;
  constexpr char kName[] = "AnalysisEffect::UpdateStartStopButtonEnablement";
  MixHashGuid mix(kName);
  mix.Add(kName, sizeof kName - 1);
  mix.Add(label.data(), label.size());
  mix.AddValue(static_cast<std::uint8_t>(cancel_enabled));
  mix.AddValue(static_cast<std::uint8_t>(analyze_enabled));
  AnalysisState* const state = GetState();
  const tessel::utility::Guid identity = mix.Finish();
  if (state != nullptr && state->button_identity == identity) return;
  // What is told in part would pass for what was told before.
  if (state != nullptr) state->button_identity = {};
  UpdateButton(kCancelParam, cancel_enabled, label.c_str());
  UpdateButton(kAnalyzeParam, analyze_enabled, nullptr);
  if (state != nullptr) state->button_identity = identity;
}

Validity AnalysisEffect::GetValidity(AnalysisState& state) {
  const PresentInputs present{
      [this] { return ReadJobInput(context().in, context().out); },
      [this] { return GetIdentifierForTracker(GetSelectorParams(), GetTrackerParams()); },
      [this] { return GetUpstreamIdentifier(context().in, context().out); }};
  return analysis::GetValidity(state, present, context().out);
}

bool AnalysisEffect::IsAnalysisCurrent(AnalysisState* state) {
  return state != nullptr && GetValidity(*state) == Validity::Current;
}

bool AnalysisEffect::IsBusy() {
  const AnalysisState* const state = GetState();
  return state != nullptr && state->analyzer;
}

void AnalysisEffect::DropSolveJob() {}

void AnalysisEffect::HandleParamChange(const HX_ParamChangedExtra& extra) {
  const std::int32_t id = IndexToParamId(extra.param_index);
  // What can't be identified fails before anything changes.
  if (id == kAnalyzeParam) ReadJobInput(context().in, context().out);
  if (IsOneByOne()) return;
  switch (id) {
    case kCancelParam:
      CancelAnalysis(GetState(), context().params, true);
      RefreshParams();
      return;
    case kSaveTrackFileParam:
      SaveTrackFile();
      return;
    case kAnalyzeParam:
    case kDetailedAnalysisParam:
      StartAnalysisFromUI();
      return;
    default:
      RefreshParams();
      return;
  }
}

void AnalysisEffect::StartAnalysisFromUI() {
  bool started = false;
  try {
    // What the user deleted is of the tracks that are to go.
    if (context().command == HX_CMD_PARAM_CHANGED) ClearDeletedTrackPoints(*this);
    UpdateStartStopButtonEnablement(false, true, nullptr);
    const ScopedSuite<HX_AnalysisHostSuite1> suite(context());
    ThrowIfFailed(suite->ScheduleAnalysis(context().in->effect_ref));
    ExpectFrames(context());
    started = true;
    RestartAnalysis();
  } catch (...) {
    try {
      UpdateStartStopButtonEnablement(true, false, nullptr);
    } catch (...) {  // the first failure is the one that counts
    }
    // A state that could not be taken apart has its results still.
    const AnalysisState* const state = started ? GetState() : nullptr;
    if (state != nullptr && state->table().frame_count == 0) MarkAnalysisFailed();
    if ((context().out->out_flags & HX_OUT_FLAG_SHOW_MESSAGE) == 0) throw;
  }
}

void AnalysisEffect::StartAnalysis() {
  AnalysisState* const state = GetState();
  if (state == nullptr) return;
  ExpectFrames(context());
  DropSolveJob();
  const marrow::tracking::SelectorParams selector = GetSelectorParams();
  const marrow::tracking::TrackerParams tracker = GetTrackerParams();
  const bool detailed = GetBoolParam(kDetailedAnalysisParam);
  state->Begin(context().in, context().out, selector, tracker, detailed,
               MakeVideoSegmentRenderSuiteJob);
  kelp::effect::ShowInfoText(context(), nullptr, nullptr);
  PublishSharedData();
  kelp::effect::ForceRerender(context());
}

void AnalysisEffect::CancelAnalysis(AnalysisState* state, HX_ParamDef** params, bool show_text) {
  if (state == nullptr || !state->analyzer) return;
  const std::string text = GetCancelMessage();
  EndJob(context(), *state->analyzer, text);
  state->DropAnalyzer();
  if (params != nullptr) PublishStatus(FrameStatus::PressAnalyze);
  if (show_text) kelp::effect::ShowInfoText(context(), text.c_str(), nullptr);
}

bool AnalysisEffect::ServiceAnalysis(bool from_render) {
  if (context().in->instance_handle == nullptr) return false;
  AnalysisState* const state = GetState();
  if (state == nullptr) return false;
  const bool detailed = GetBoolParam(kDetailedAnalysisParam);
  // Whether the analysis is current is asked of the host only where that decides something.
  if (bool(state->detailed != detailed) && IsAnalysisCurrent(state)) {
    state->analysis_pending = false;
    if (!from_render) {
      state->detailed = detailed;  // a start that is refused is not tried again with each tick
      HandleParamChange({ParamIdToIndex(kAnalyzeParam)});
    }
    return true;
  }
  if (!state->analyzer) return false;
  PollAnalysis(*state);
  return true;
}

void AnalysisEffect::PollAnalysis(AnalysisState& state) {
  const boost::shared_ptr<Analyzer> analyzer = state.analyzer;
  if (analyzer->job_stage() == JobStage::NotStarted) {
    BeginPolledAnalysis(state);
    return;
  }
  TellEnd(context(), *analyzer);
  KeepPieces(context(), *analyzer);
  const JobState job = analyzer->GetStatus().state;
  if (job == JobState::Running && analyzer->job_stage() != JobStage::SeenRunning) {
    analyzer->set_job_stage(JobStage::SeenRunning);
    state.progress.start_tick = HighPrecisionTime::Now();
  }
  if (job <= JobState::Running) {
    RefreshParams();
  } else if (analyzer->job_stage() == JobStage::SeenRunning) {
    RefreshParams();
    analyzer->set_job_stage(JobStage::SeenEnded);
    kelp::effect::ForceRerender(context());
  } else {
    const bool failed_with_text =
        analyzer->ReportFailure(context().in, context().out) && !analyzer->GetErrorText().empty();
    EndPolledAnalysis(state, job == JobState::Finished, failed_with_text);
  }
}

void AnalysisEffect::BeginPolledAnalysis(AnalysisState& state) {
  const ScopedSuite<HX_AnalysisHostSuite1> suite(context());
  std::uint8_t may = 0;
  ThrowIfFailed(suite->MayStart(context().in->effect_ref, &may));
  const boost::logic::tribool detailed = state.detailed;
  const boost::shared_ptr<Analyzer> analyzer = state.analyzer;
  state.DropAnalyzer();
  GiveKeptPieces(context(), *analyzer);
  // One that can't start is gone, so that it is not tried again with each tick.
  try {
    analyzer->Start(context().in, context().out);
  } catch (...) {
    try {  // a host that was told of the analysis would wait for it
      PublishStatus(FrameStatus::PressAnalyze);
    } catch (...) {  // the first failure is the one that counts
    }
    throw;
  }
  AnalysisState* present = nullptr;
  try {
    present = GetState();
    if (present != nullptr) {
      Replace(present->result, [&](AnalysisResult& next) {
        next.tracker_identity = analyzer->GetTrackerGuid();
        next.source_identity = analyzer->GetSourceIdentity();
      });
    }
  } catch (...) {  // nobody would end the job
    EndJob(context(), *analyzer);
    throw;
  }
  if (present == nullptr) {
    EndJob(context(), *analyzer);
    return;
  }
  present->first_analysis = true;
  present->progress = ProgressClock{HighPrecisionTime::Now(), 0, 0};
  present->analyzer = analyzer;
  present->detailed = detailed;
  PublishStatus(FrameStatus::AnalysisInProgress);
  kelp::effect::ForceRerender(context());
}

void AnalysisEffect::EndPolledAnalysis(AnalysisState& state, bool finished, bool failed_with_text) {
  if (finished && state.TakeResults() && state.table().frame_count > 0) {
    MarkNeedsSolve();
    PublishStatus(state.first_analysis ? FrameStatus::SolveInProgress
                                       : FrameStatus::SubsequentSolve);
    kelp::effect::ForceRerender(context());
    kelp::effect::RefreshAllWindows(context());
  } else {
    if (failed_with_text) MarkAnalysisFailed();
    PublishStatus(FrameStatus::PressAnalyze);
    kelp::effect::ForceRerender(context());
  }
  state.analyzer->Stop(context().in, context().out);
  state.DropAnalyzer();
  PublishSharedData();
  kelp::effect::ForceRerender(context());
  RefreshParams();
}

void AnalysisEffect::RefreshParams() {
  if (context().params == nullptr) return;
  AnalysisState* const state = GetState();
  if (state == nullptr || !state->analyzer) {
    UpdateStartStopButtonEnablement(!IsAnalysisCurrent(state), false, nullptr);
    return;
  }
  const JobStage stage = state->analyzer->job_stage();
  if (stage != JobStage::NotStarted) {
    const JobState job = state->analyzer->GetStatus().state;
    if (job == JobState::Running || (job > JobState::Running && stage == JobStage::SeenRunning)) {
      const std::string text = GetProgressText(*state, context().in, context().out);
      UpdateStartStopButtonEnablement(false, true, text.c_str());
    }
    if (job != JobState::Ready) return;
  }
  char text[kelp::effect::kHostTextSize];
  kelp::effect::ConvertToHostText(
      context(), tessel::config::Localizer::LocalizeUTF16(kCancelButtonInitializing), text);
  UpdateStartStopButtonEnablement(false, true, text);
  state->progress.start_tick = HighPrecisionTime::Now();
}

void AnalysisEffect::SaveTrackFile() {
  const AnalysisState* const state = GetState();
  if (state != nullptr && state->table().frame_count > 0) PickFileAndSaveTracks(state);
  UpdateButton(kSaveTrackFileParam, true, "");
}

}  // namespace kelp::analysis::effect
