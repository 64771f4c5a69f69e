#include "stabilizer/effect/src/stabilizer_state.h"

#include <algorithm>
#include <boost/make_shared.hpp>
#include <mutex>
#include <utility>

#include "stabilizer/effect/src/solve_hash.h"
#include "stabilizer/render/cp_warper_warps.h"
#include "stabilizer/render/output_rect.h"

namespace kelp::effect {

using analysis::FrameStatus;
using analysis::effect::DeletedTrackPoints;
using marrow::render::CPWarperWarps;
using marrow::stabilization::SolverParamsRecord;
using marrow::tracking::AllFeatures;
using tessel::utility::Guid;

namespace {
constexpr std::int64_t kNoParametersHash = std::int64_t{1} << 32;
}  // namespace

StabilizerState::StabilizerState(const HX_InData& in, bool keeps_jobs) {
  source_width = in.width;
  source_height = in.height;
  par_num = in.pixel_aspect.num;
  par_den = in.pixel_aspect.den;
  keep_jobs = keeps_jobs;
}

StabilizerState::~StabilizerState() = default;

bool StabilizerState::IsWorkingOnResults() const {
  return solver && solver->GetState() == Solver::running;
}

ClipGeometry StabilizerState::Geometry() const {
  ClipGeometry clip;
  clip.width = static_cast<std::uint32_t>(std::max(source_width, 1));
  clip.height = static_cast<std::uint32_t>(std::max(source_height, 1));
  clip.pixel_aspect_num = par_num;
  clip.pixel_aspect_den = par_den;
  const analysis::RationalTime& step = job_input.StepTime;
  clip.frame_rate = step.numerator > 0 ? static_cast<double>(step.denominator) /
                                             static_cast<double>(step.numerator)
                                       : 0.0;
  return clip;
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
  return warper && phase == SolvePhase::Solved && SolveHash(inputs.parameters) == solve_hash &&
         solve_input_identity == result_identity && deletion_identity == marked_deletions_ &&
         warper->frameCount() == inputs.features.frame_count &&
         static_cast<std::uint32_t>(warper->frameWidth()) == inputs.width &&
         static_cast<std::uint32_t>(warper->frameHeight()) == inputs.height &&
         (warper->driven() || inputs.frameMapRadius <= FrameMapRadius());
}

AllFeatures StabilizerState::Table() const {
  AllFeatures table = all_features;
  table.first_frame = first_frame;
  return table;
}

AllFeatures StabilizerState::TableWithout(const DeletedTrackPoints& deletions) const {
  AllFeatures table = all_features;
  table.features = ApplyDeletedTrackPoints(Table(), deletions.Points()).features;
  return table;
}

bool StabilizerState::WasSolvedWithout(const DeletedTrackPoints& deletions) {
  const Guid identity = deletions.Identity();
  if (identity == deletion_identity) return true;
  if (!deletions_from_project_) return false;
  const DeletedTrackPoints seeds(SeedsOf(Table(), deletions.Points()));
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
  const ClipGeometry clip = Geometry();
  const Guid wanted = deletions ? deletions->Identity() : marked_deletions_;
  const bool same_tracks = wanted == marked_deletions_;
  const Solver::Inputs inputs{
      clip.square_width(), clip.height, same_tracks ? all_features : TableWithout(*deletions),
      frame_map_radius,    parameters,  parameters.crop};
  if ((status == Solver::running || status == Solver::failed) && same_tracks &&
      IsAtWorkOn(inputs)) {
    return false;
  }

  auto next = boost::make_shared<Solver>(inputs.width, inputs.height, inputs.features,
                                         inputs.frameMapRadius, inputs.parameters,
                                         inputs.needsCropper, make_notify());
  solver.reset();
  all_features = inputs.features;
  marked_deletions_ = wanted;
  if (MayReuseWarper(inputs)) next->SetExistingWarper(warper);
  next->Start();
  solver = std::move(next);
  return true;
}

void StabilizerState::TakeSolve() {
  const Solver::Inputs& inputs = solver->inputs();
  if (solver->GetState() == Solver::finished) {
    phase = SolvePhase::Solved;
    warper = solver->GetWarper();
    crop = solver->GetCropper();
  } else {
    // The old warps would pass for ones that fit the hashes of what failed.
    phase = SolvePhase::Failed;
    warper.reset();
    crop.reset();
  }
  solve_hash = SolveHash(inputs.parameters);
  crop_hash = CropHash(inputs.parameters);
  solve_input_identity = result_identity;
  deletion_identity = marked_deletions_;
  deletions_from_project_ = false;
  needs_solve = false;
  subsequent_solve = false;
  solver.reset();
}

std::uint32_t StabilizerState::FrameMapRadius() const {
  return warper && warper->frameMap() ? static_cast<std::uint32_t>(warper->frameMap()->radius())
                                      : 0;
}

double StabilizerState::GetZoom(const ParameterReader& params, Renderer& renderer, bool auto_scale,
                                bool use_additional_scale) const {
  RenderSettings settings = GetRenderSettings(params);
  if (!use_additional_scale) settings.additional_scale = 1.0f;
  if (!auto_scale) return settings.additional_scale;
  return marrow::render::getZoom(CPWarperWarps(warper), crop.get(), settings, renderer);
}

bool StabilizerState::IsOverCropped(const ParameterReader& params) const {
  if (!warper || !crop) return false;
  const RenderSettings settings = GetRenderSettings(params);
  if (!crops(settings.framing)) return false;
  const CPWarperWarps warps(warper);
  Renderer renderer = makeRenderer(warps, 1.0f, 1.0f);
  return isOvercropped(warps, *crop, settings, renderer);
}

void StabilizerState::Publish(bool gpu_allowed) const {
  StabilizerSharedData::Contents contents;
  contents.warper = warper;
  contents.crop = crop;
  contents.job_input = job_input;
  contents.source_identity = source_identity;
  contents.tracker_identity = tracker_identity;
  contents.all_features = boost::make_shared<marrow::tracking::AllFeatures>(all_features);
  contents.feature_count = static_cast<std::uint64_t>(all_features.feature_count);
  contents.first_frame = first_frame;
  contents.source_width = source_width;
  contents.source_height = source_height;
  contents.par_num = par_num;
  contents.par_den = par_den;
  contents.analyzer = analyzer;
  contents.solve_status = phase;
  contents.needs_solve = needs_solve;
  contents.gpu_allowed = gpu_allowed;
  contents.first_solve = first_analysis;
  contents.subsequent_solve = subsequent_solve;
  {
    const std::unique_lock<std::shared_mutex> lock(shared->lock);
    std::swap(shared->contents, contents);
  }
  // What was published before goes here, without the lock.
}

void StabilizerState::TakeOver() {
  if (!shared) return;
  StabilizerSharedData::Contents contents;
  {
    const std::shared_lock<std::shared_mutex> lock(shared->lock);
    contents = shared->contents;
  }
  if (!contents.all_features) return;  // nothing was published yet
  warper = std::move(contents.warper);
  crop = std::move(contents.crop);
  job_input = std::move(contents.job_input);
  source_identity = contents.source_identity;
  tracker_identity = contents.tracker_identity;
  if (keep_jobs || !has_frames()) {
    all_features = *contents.all_features;
    first_frame = contents.first_frame;
  }
  source_width = contents.source_width;
  source_height = contents.source_height;
  par_num = contents.par_num;
  par_den = contents.par_den;
  if (keep_jobs) analyzer = std::move(contents.analyzer);
  phase = contents.solve_status;
  needs_solve = contents.needs_solve;
  first_analysis = contents.first_solve;
  subsequent_solve = contents.subsequent_solve;
}

SavedState StabilizerState::Save() const {
  SavedState saved;
  saved.source_width = source_width;
  saved.source_height = source_height;
  saved.par_num = par_num;
  saved.par_den = par_den;
  saved.all_features = all_features;
  saved.all_features.first_frame = first_frame;
  saved.job_input = job_input;
  saved.tracker_identity = tracker_identity;
  saved.source_identity = source_identity;
  saved.analysis_tick = progress.start_tick;
  saved.detailed = detailed;
  if (analyzer) saved.job = analyzer->record();
  saved.needs_solve = needs_solve;
  saved.phase = phase;
  saved.solve_hash = solve_hash;
  // The table tells of other deletions than the warps are of.
  if (deletion_identity != marked_deletions_) saved.solve_hash = kNoParametersHash;
  saved.crop_hash = crop_hash;
  if (phase == SolvePhase::Solved) {
    saved.warper = warper;
    saved.crop = crop;
  }
  return saved;
}

void StabilizerState::Load(const SavedState& saved, const analysis::JobFactory& make_job) {
  source_width = saved.source_width;
  source_height = saved.source_height;
  par_num = saved.par_num;
  par_den = saved.par_den;
  all_features = saved.all_features;
  first_frame = saved.all_features.first_frame;
  job_input = saved.job_input;
  tracker_identity = saved.tracker_identity;
  source_identity = saved.source_identity;
  progress.start_tick = saved.analysis_tick;
  detailed = saved.detailed;
  if (saved.job) {
    analyzer = boost::make_shared<analysis::AnalyzerPrem>(*saved.job, source_identity, make_job);
    analysis_pending = saved.analysis_pending;  // else frames would wait for nothing
  }
  needs_solve = saved.needs_solve;
  phase = saved.phase;
  solve_hash = saved.solve_hash;
  crop_hash = saved.crop_hash;
  warper = saved.warper;
  crop = saved.crop;
  MakeResultIdentityUnique();
  solve_input_identity = result_identity;
  deletion_identity = marked_deletions_ =
      DeletedTrackPoints(marrow::tracking::DeletedSeeds(Table())).Identity();
  deletions_from_project_ = true;
}

}  // namespace kelp::effect
