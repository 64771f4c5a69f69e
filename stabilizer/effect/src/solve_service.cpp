#include "stabilizer/effect/src/solve_service.h"

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
#include "stabilizer/effect/src/render_service.h"
#include "stabilizer/effect/src/solve_hash.h"
#include "stabilizer/effect/src/stabilizer_strings.h"

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

}  // namespace

void SolveService::CheckParams() {
  const auto status = state_.SolveStatus();
  if (state_.analyzer || (status != Solver::finished && status != Solver::failed)) return;
  const SourceShape present = ShapeOf(*context_.in);
  if (!present.SameSize(state_.source)) {
    ReportSizeMismatch();
    // A host that was told of a solve to come would wait for it.
    if (std::exchange(state_.needs_solve, false)) effect_.PublishStatus(state_.SettledStatus());
    return;
  }
  // The tracks are in the source's pixels, whatever their aspect is said to be.
  state_.source = present;

  const EffectParameters params(effect_);
  const SolverParamsRecord record = GetSolverParams(params, state_.source, state_.FrameRate());
  const auto framing = static_cast<Framing>(params.GetPopupParam(kFramingIndex));
  const auto deletions = analysis::effect::ReadDeletedTrackPoints(effect_);
  bool needed = state_.needs_solve && state_.has_frames();
  if (SolveHash(record) != state_.solve_result->solve_hash) {
    needed = true;
  } else if (deletions && !state_.WasSolvedWithout(*deletions)) {
    needed = state_.subsequent_solve = true;
  } else if (!needed && crops(framing)) {
    needed = CropHash(record) != state_.solve_result->crop_hash;
  } else if (!needed && status == Solver::finished) {
    needed = MarginInFrames(params, state_.FrameRate()) > state_.FrameMapRadius();
  }
  if (!needed) return;
  const bool known = state_.needs_solve;
  state_.needs_solve = true;
  effect_.PublishStatus(state_.SolveProgressStatus());
  if (!known) ForceRerender(context_);
}

bool SolveService::StartIfNeeded() {
  if (!state_.needs_solve || !state_.has_frames()) return false;
  const EffectParameters params(effect_);
  const bool started = state_.StartSolve(
      GetSolverParams(params, state_.source, state_.FrameRate()),
      MarginInFrames(params, state_.FrameRate()), analysis::effect::ReadDeletedTrackPoints(effect_),
      [this]() -> boost::function<void()> {
        const auto notifier = boost::make_shared<const SolveNotifier>(context_);
        return [notifier] { (*notifier)(); };
      });
  if (started && !state_.first_analysis) ShowInfoText(context_, nullptr, nullptr);
  return started;
}

void SolveService::Finish() {
  if (state_.solver->GetState() == Solver::failed && state_.solver->OutOfMemory()) {
    effect_.ReportOutOfMemory();
  }
  state_.TakeSolve();
  const FrameStatus status = state_.SettledStatus();
  state_.unpublished = status;  // whoever waits for the results must learn of them, come what may
  const bool first = std::exchange(state_.first_analysis, false);
  effect_.RefreshParams();
  RefreshAllWindows(context_);
  if (first) {
    const std::string time = MinutesAndSeconds(
        HighPrecisionTime::Seconds(state_.progress.start_tick, HighPrecisionTime::Now()));
    ShowInfoText(context_, GetString(context_, kStringFinished), time.c_str());
  }
  effect_.PublishStatus(status);
}

void SolveService::ReportSizeMismatch() {
  const SourceShape present = ShapeOf(*context_.in);
  const bool told = state_.reported_source.SameSize(present);
  if (told || effect_.IsOneByOne() || !state_.has_frames()) return;
  state_.reported_source = present;
  analysis::ReportSizeMismatch(context_.in, context_.out, kEffectName, state_.source, present,
                               analysis::AfterReport::GoOn);
}

void SolveService::ShowProgress() {
  static constexpr const char* kDots[] = {".  ", ".. ", "...", " ..", "  .", "   "};
  std::string name = GetString(context_, kStringStabilization);
  if (state_.IsWorkingOnResults()) name += kDots[state_.solver->GetPollCount() % std::size(kDots)];
  UpdateParamUI(context_, kStabilizationGroupIndex, {std::nullopt, name.c_str()});
}

void SolveService::ShowAutoScale() {
  const SolveResult& solve = *state_.solve_result;
  if (!solve.warper || !solve.crop || solve.crop->rects.empty()) return;
  Renderer scratch = RendererOf(*context_.in, state_);
  const double zoom = state_.GetZoom(EffectParameters(effect_), scratch, true, false);
  const std::string text =
      tessel::utility::ReplaceInString(tessel::config::Localizer::Localize(kAutoScaleReadout),
                                       tessel::utility::NumberToString(zoom * 100, 1));
  char name[kHostTextSize];
  ConvertToHostText(context_, tessel::utility::ToUTF16(text), name);
  UpdateParamUI(context_, kAutoScaleGroupIndex, {std::nullopt, name});
}

}  // namespace kelp::effect
