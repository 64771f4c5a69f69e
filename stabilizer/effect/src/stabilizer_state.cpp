#include "stabilizer/effect/src/stabilizer_state.h"

#include <algorithm>
#include <boost/make_shared.hpp>
#include <mutex>
#include <utility>

#include "stabilizer/effect/src/solve_hash.h"
#include "stabilizer/render/cp_warper_warps.h"
#include "stabilizer/render/output_rect.h"

namespace kelp::effect {

using analysis::AnalysisResult;
using analysis::FrameStatus;
using analysis::Replace;
using analysis::effect::DeletedTrackPoints;
using marrow::render::CPWarperWarps;
using marrow::stabilization::SolverParamsRecord;
using tessel::utility::Guid;

namespace {
constexpr std::int64_t kNoParametersHash = std::int64_t{1} << 32;
}  // namespace

StabilizerState::StabilizerState(const HX_InData& in, bool keeps_jobs) {
  source = ShapeOf(in);
  keep_jobs = keeps_jobs;
}

StabilizerState::~StabilizerState() = default;

bool StabilizerState::IsWorkingOnResults() const {
  return solver && solver->GetState() == Solver::running;
}

double StabilizerState::FrameRate() const {
  const analysis::RationalTime& step = result->job_input.StepTime;
  return step.numerator > 0
             ? static_cast<double>(step.denominator) / static_cast<double>(step.numerator)
             : 0.0;
}

std::optional<Solver::State> StabilizerState::SolveStatus() const {
  if (solver) return solver->GetState();
  if (phase == SolvePhase::Solved) return Solver::finished;
  if (phase == SolvePhase::Failed) return Solver::failed;
  return std::nullopt;
}

FrameStatus StabilizerState::SolveProgressStatus() const {
  if (subsequent_solve) return FrameStatus::SubsequentSolveOnDeletion;
  return first_analysis ? FrameStatus::SolveInProgress : FrameStatus::SubsequentSolve;
}

FrameStatus StabilizerState::SettledStatus() const {
  if (!has_frames()) return FrameStatus::PressAnalyze;
  if (phase == SolvePhase::Failed) return FrameStatus::SolveFailed;
  return source_changed ? FrameStatus::RangeChanged : FrameStatus::Ready;
}

bool StabilizerState::IsAtWorkOn(const Solver::Inputs& inputs) const {
  if (!solver) return false;
  const Solver::Inputs& present = solver->inputs();
  return present.width == inputs.width && present.height == inputs.height &&
         present.features.feature_count == inputs.features.feature_count &&
         present.features.frame_count == inputs.features.frame_count &&
         present.frameMapRadius == inputs.frameMapRadius &&
         SolveHash(present.parameters) == SolveHash(inputs.parameters) &&
         CropHash(present.parameters) == CropHash(inputs.parameters);
}

// Equality of all that the warps were made from decides, whatever changed meanwhile and changed
// back. A warper that was read from a project can't be given a wider map: it has no tracks.
bool StabilizerState::MayReuseWarper(const Solver::Inputs& inputs) const {
  const auto& warper = solve_result->warper;
  return warper && phase == SolvePhase::Solved &&
         SolveHash(inputs.parameters) == solve_result->solve_hash &&
         solve_input_identity == result_identity && deletion_identity == marked_deletions_ &&
         warper->frameCount() == inputs.features.frame_count &&
         static_cast<std::uint32_t>(warper->frameWidth()) == inputs.width &&
         static_cast<std::uint32_t>(warper->frameHeight()) == inputs.height &&
         (warper->driven() || inputs.frameMapRadius <= FrameMapRadius());
}

bool StabilizerState::WasSolvedWithout(const DeletedTrackPoints& deletions) {
  const Guid identity = deletions.Identity();
  if (identity == deletion_identity) return true;
  if (!deletions_from_project_) return false;
  const DeletedTrackPoints seeds(SeedsOf(table(), deletions.Points()));
  if (seeds.Identity() != deletion_identity) return false;
  deletion_identity = marked_deletions_ = identity;
  return true;
}

void StabilizerState::MakeResultIdentityUnique() {
  AnalysisState::MakeResultIdentityUnique();
  marked_deletions_ = Guid();
}

bool StabilizerState::StartSolve(const SolverParamsRecord& parameters,
                                 std::uint32_t frame_map_radius,
                                 const std::optional<DeletedTrackPoints>& deletions,
                                 const boost::function<boost::function<void()>()>& make_notify) {
  const std::optional<Solver::State> status = SolveStatus();
  if (status == Solver::not_started) return false;
  const Guid wanted = deletions ? deletions->Identity() : marked_deletions_;
  const bool same_tracks = wanted == marked_deletions_;
  const Solver::Inputs inputs{
      source.square_width(),
      source.square_height(),
      same_tracks ? table() : ApplyDeletedTrackPoints(table(), deletions->Points()),
      frame_map_radius,
      parameters,
      parameters.crop};
  if ((status == Solver::running || status == Solver::failed) && same_tracks &&
      IsAtWorkOn(inputs)) {
    return false;
  }

  auto next = boost::make_shared<Solver>(inputs.width, inputs.height, inputs.features,
                                         inputs.frameMapRadius, inputs.parameters,
                                         inputs.needsCropper, make_notify());
  if (!same_tracks) {
    Replace(result, [&inputs](AnalysisResult& marked) { marked.all_features = inputs.features; });
  }
  solver.reset();
  marked_deletions_ = wanted;
  if (MayReuseWarper(inputs)) next->SetExistingWarper(solve_result->warper);
  next->Start();
  solver = std::move(next);
  return true;
}

void StabilizerState::TakeSolve() {
  const Solver::Inputs& inputs = solver->inputs();
  const bool finished = solver->GetState() == Solver::finished;
  const auto next = boost::make_shared<SolveResult>();
  if (finished) {  // the old warps would pass for ones that fit the hashes of what failed
    next->warper = solver->GetWarper();
    next->crop = solver->GetCropper();
  }
  next->solve_hash = SolveHash(inputs.parameters);
  next->crop_hash = CropHash(inputs.parameters);
  solve_result = next;
  solve_input_identity = result_identity;
  deletion_identity = marked_deletions_;
  phase = finished ? SolvePhase::Solved : SolvePhase::Failed;
  deletions_from_project_ = false;
  needs_solve = false;
  subsequent_solve = false;
  solver.reset();
}

std::uint32_t StabilizerState::FrameMapRadius() const {
  const auto& warper = solve_result->warper;
  return warper && warper->frameMap() ? static_cast<std::uint32_t>(warper->frameMap()->radius())
                                      : 0;
}

double StabilizerState::GetZoom(const ParameterReader& params, Renderer& renderer, bool auto_scale,
                                bool use_additional_scale) const {
  RenderSettings settings = GetRenderSettings(params);
  if (!use_additional_scale) settings.additional_scale = 1.0f;
  if (!auto_scale) return settings.additional_scale;
  return marrow::render::getZoom(CPWarperWarps(solve_result->warper), solve_result->crop.get(),
                                 settings, renderer);
}

bool StabilizerState::IsOverCropped(const ParameterReader& params) const {
  if (!solve_result->warper || !solve_result->crop) return false;
  const RenderSettings settings = GetRenderSettings(params);
  if (!crops(settings.framing)) return false;
  const CPWarperWarps warps(solve_result->warper);
  Renderer renderer = makeRenderer(warps, 1.0, 1.0);
  return isOvercropped(warps, *solve_result->crop, settings, renderer);
}

void StabilizerState::Publish(bool gpu_allowed) const {
  StabilizerSharedData::Contents contents{.source = source,
                                          .result = result,
                                          .solve_result = solve_result,
                                          .analyzer = analyzer,
                                          .phase = phase,
                                          .needs_solve = needs_solve,
                                          .first_analysis = first_analysis,
                                          .subsequent_solve = subsequent_solve,
                                          .source_changed = source_changed,
                                          .gpu_allowed = gpu_allowed};
  {
    const std::unique_lock<std::shared_mutex> lock(shared->lock);
    std::swap(shared->contents, contents);
  }
  // What was published before goes here, without the lock.
}

void StabilizerState::ForgetTracks() const {
  if (!shared || !solve_result->warper || !solve_result->warper->driven()) return;
  boost::shared_ptr<const SolveResult> published = solve_result;
  Replace(published, [](SolveResult& next) { next.warper = next.warper->withoutTracks(); });
  const std::unique_lock<std::shared_mutex> lock(shared->lock);
  if (shared->contents.solve_result == solve_result) {
    std::swap(shared->contents.solve_result, published);
  }
}

void StabilizerState::TakeOver() {
  if (!shared) return;
  StabilizerSharedData::Contents contents;
  {
    const std::shared_lock<std::shared_mutex> lock(shared->lock);
    contents = shared->contents;
  }
  if (!contents.result) return;  // nothing was published yet
  if (!keep_jobs && has_frames() && contents.result != result) {
    Replace(contents.result, [this](AnalysisResult& next) { next.all_features = table(); });
  }
  source = contents.source;
  result = contents.result;
  solve_result = contents.solve_result;
  if (keep_jobs) analyzer = contents.analyzer;
  phase = contents.phase;
  needs_solve = contents.needs_solve;
  first_analysis = contents.first_analysis;
  subsequent_solve = contents.subsequent_solve;
  source_changed = contents.source_changed;
}

SavedState StabilizerState::Save() const {
  SavedState saved{.source = source,
                   .result = result,
                   .solve_result = solve_result,
                   .phase = phase,
                   .needs_solve = needs_solve,
                   .analysis_tick = progress.start_tick,
                   .detailed = detailed,
                   .analysis_pending = false,
                   .job = {}};
  if (analyzer) saved.job = analyzer->record();
  // The table may tell of other deletions than the warps are of.
  const bool same_deletions = deletion_identity == marked_deletions_;
  if (!same_deletions || phase != SolvePhase::Solved) {
    Replace(saved.solve_result, [&](SolveResult& next) {
      if (!same_deletions) next.solve_hash = kNoParametersHash;
      if (phase == SolvePhase::Solved) return;
      next.warper.reset();
      next.crop.reset();
    });
  }
  return saved;
}

void StabilizerState::Load(const SavedState& saved, HX_Handle plugin,
                           const analysis::JobFactory& make_job) {
  source = saved.source;
  result = saved.result;
  solve_result = saved.solve_result;
  phase = saved.phase;
  needs_solve = saved.needs_solve;
  progress.start_tick = saved.analysis_tick;
  detailed = saved.detailed;
  if (saved.job) {
    analyzer = boost::make_shared<analysis::AnalyzerPrem>(*saved.job, result->source_identity,
                                                          plugin, make_job);
    analysis_pending = saved.analysis_pending;  // else frames would wait for nothing
  }
  MakeResultIdentityUnique();
  solve_input_identity = result_identity;
  deletion_identity = marked_deletions_ =
      DeletedTrackPoints(marrow::tracking::DeletedSeeds(table())).Identity();
  deletions_from_project_ = true;
}

}  // namespace kelp::effect
