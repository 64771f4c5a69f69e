#include <boost/make_shared.hpp>
#include <cstdio>
#include <iterator>
#include <string>
#include <utility>

#include "analysis/effect/deletions_parameter.h"
#include "analysis/effect/effect_parameters.h"
#include "analysis/src/state_errors.h"
#include "effect/host_requests.h"
#include "effect/host_text.h"
#include "effect/parameter_row.h"
#include "effect/suite.h"
#include "platform/tessel/config.h"
#include "platform/tessel/utility.h"
#include "stabilizer/effect/src/parameter_rules.h"
#include "stabilizer/effect/src/parameter_table.h"
#include "stabilizer/effect/src/solve_hash.h"
#include "stabilizer/effect/src/stabilizer_effect.h"
#include "stabilizer/effect/src/stabilizer_strings.h"

// What StabilizerEffect does about its solve: the idle step and the controls.
namespace kelp::effect {

using analysis::FrameStatus;
using analysis::effect::EffectParameters;
using marrow::stabilization::SolverParamsRecord;
using tessel::utility::HighPrecisionTime;

namespace {

// What a Solver calls at its end, on its own thread: brings the host back to the effect.
class SolveNotifier {
 public:
  explicit SolveNotifier(const HostContext& context)
      : suite_(context), effect_(context.in->effect_ref) {}
  void operator()() const { suite_->ForceRerender(effect_); }

 private:
  const ScopedSuite<HX_PrivateEffectSuite3> suite_;
  const HX_EffectRef effect_;
};

std::string MinutesAndSeconds(double seconds) {
  const auto whole = static_cast<long long>(seconds);
  char text[32];
  std::snprintf(text, sizeof text, "%lld:%02lld", whole / 60, whole % 60);
  return text;
}

std::int32_t PopupOf(HX_ParamDef** params, ParamIndex index) {
  return static_cast<std::int32_t>(ValueOf(*params[index]));
}

}  // namespace

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
  if (!state) {
    PublishSharedData();
    return false;
  }
  if (state->solver) {
    const Solver::State status = state->solver->GetState();
    if (status == Solver::finished || status == Solver::failed) FinishSolve(*state);
    if (status != Solver::running && status != Solver::failed) {
      PublishSharedData();
      return false;
    }
  }
  CheckSolveParams(*state);
  if (StartSolveIfNeeded(*state)) {
    PublishStatus(state->SolveProgressStatus());
    ForceRerender(context());
    return true;
  }
  if (context().params) {
    UpdateStartStopButtonEnablement(!IsAnalysisCurrent(state), false, nullptr);
    if (state->solver) ShowSolveProgress(*state);
  }
  PublishSharedData();
  return true;
}

void StabilizerEffect::CheckSolveParams(StabilizerState& state) {
  const auto status = state.SolveStatus();
  if (state.analyzer || (status != Solver::finished && status != Solver::failed)) return;
  const SourceShape present = ShapeOf(*context().in);
  if (!present.SameSize(state.source)) {
    ReportSizeMismatch(state);
    state.needs_solve = false;
    return;
  }
  // The tracks are in the source's pixels, whatever their aspect is said to be.
  state.source = present;

  const EffectParameters params(*this);
  const SolverParamsRecord record = GetSolverParams(params, state.source, state.FrameRate());
  const auto framing = static_cast<Framing>(params.GetPopupParam(kFramingIndex));
  const auto deletions = analysis::effect::ReadDeletedTrackPoints(*this);
  bool needed = state.needs_solve && state.has_frames();
  if (SolveHash(record) != state.solve_result->solve_hash) {
    needed = true;
  } else if (deletions && !state.WasSolvedWithout(*deletions)) {
    needed = state.subsequent_solve = true;
  } else if (!needed && crops(framing)) {
    needed = CropHash(record) != state.solve_result->crop_hash;
  } else if (!needed && status == Solver::finished) {
    needed = MarginInFrames(params, state.FrameRate()) > state.FrameMapRadius();
  }
  if (!needed) return;
  const bool known = state.needs_solve;
  state.needs_solve = true;
  PublishStatus(state.SolveProgressStatus());
  if (!known) ForceRerender(context());
}

bool StabilizerEffect::StartSolveIfNeeded(StabilizerState& state) {
  if (!state.needs_solve || !state.has_frames()) return false;
  const EffectParameters params(*this);
  const bool started = state.StartSolve(
      GetSolverParams(params, state.source, state.FrameRate()),
      MarginInFrames(params, state.FrameRate()), analysis::effect::ReadDeletedTrackPoints(*this),
      [this]() -> boost::function<void()> {
        const auto notifier = boost::make_shared<const SolveNotifier>(context());
        return [notifier] { (*notifier)(); };
      });
  if (started && !state.first_analysis) ShowInfoText(context(), nullptr, nullptr);
  return started;
}

void StabilizerEffect::FinishSolve(StabilizerState& state) {
  if (state.solver->GetState() == Solver::failed && state.solver->OutOfMemory()) {
    ReportOutOfMemory();
  }
  state.TakeSolve();
  const FrameStatus status =
      state.phase == SolvePhase::Solved ? FrameStatus::Ready : FrameStatus::SolveFailed;
  state.unpublished = status;  // whoever waits for the results must learn of them, come what may
  const bool first = std::exchange(state.first_analysis, false);
  RefreshParams();
  RefreshAllWindows(context());
  if (first) {
    const std::string time = MinutesAndSeconds(
        HighPrecisionTime::Seconds(state.progress.start_tick, HighPrecisionTime::Now()));
    ShowInfoText(context(), GetString(context(), kStringFinished), time.c_str());
  }
  PublishStatus(status);
}

void StabilizerEffect::ReportSizeMismatch(StabilizerState& state) {
  const SourceShape present = ShapeOf(*context().in);
  const bool told = state.reported_source.SameSize(present);
  if (told || IsOneByOne() || !state.has_frames()) return;
  state.reported_source = present;
  analysis::ReportSizeMismatch(context().in, context().out, kEffectName, state.source, present,
                               analysis::AfterReport::GoOn);
}

// -- The controls --

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
  if (state && crops(framing)) ShowAutoScale(*state);
  if (state && !state->analyzer) ShowSolveProgress(*state);
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
  if (state) CheckSolveParams(*state);
  ForceRerender(context());
}

void StabilizerEffect::ShowSolveProgress(const StabilizerState& state) {
  static constexpr const char* kDots[] = {".  ", ".. ", "...", " ..", "  .", "   "};
  std::string name = GetString(context(), kStringStabilization);
  if (state.solver) name += kDots[state.solver->GetPollCount() % std::size(kDots)];
  UpdateParamUI(context(), kStabilizationGroupIndex, {std::nullopt, name.c_str()});
}

void StabilizerEffect::ShowAutoScale(const StabilizerState& state) {
  const SolveResult& solve = *state.solve_result;
  if (!solve.warper || !solve.crop || solve.crop->rects.empty()) return;
  Renderer scratch = MakeRenderer(state);
  const double zoom = state.GetZoom(EffectParameters(*this), scratch, true, false);
  const std::string text =
      tessel::utility::ReplaceInString(tessel::config::Localizer::Localize(kAutoScaleReadout),
                                       tessel::utility::NumberToString(zoom * 100, 1));
  char name[kHostTextSize];
  ConvertToHostText(context(), tessel::utility::ToUTF16(text), name);
  UpdateParamUI(context(), kAutoScaleGroupIndex, {std::nullopt, name});
}

// -- What the analysis tells and asks --

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

}  // namespace kelp::effect
