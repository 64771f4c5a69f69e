#pragma once

#include <boost/function.hpp>
#include <boost/shared_ptr.hpp>
#include <cstdint>
#include <optional>

#include "analysis/effect/deleted_track_points.h"
#include "analysis/src/analysis_state.h"
#include "analysis/src/validity.h"
#include "effect/parameter_reader.h"
#include "platform/hx/hx_effect.h"
#include "stabilizer/effect/src/render_rules.h"
#include "stabilizer/effect/src/shared_data.h"
#include "stabilizer/effect/src/solve_result.h"
#include "stabilizer/effect/src/solver.h"
#include "stabilizer/effect/src/state_format/saved_state.h"
#include "stabilizer/render/render_geometry.h"

namespace kelp::effect {

// What an instance of the stabilizer keeps: its analysis, the solve made from it, and the solve at
// work. A user interface instance's belongs to that thread; a render's copy, which keeps jobs, to
// the thread that renders. A state that is dropped cancels its Solver.
//
// needs_solve stands from the end of an analysis, or from a difference between what is stored and
// what is asked for, until a Solver has ended and its results were taken.
class StabilizerState final : public analysis::AnalysisState {
 public:
  // The source's size is the host-in's.
  StabilizerState(const HX_InData& in, bool keeps_jobs);
  ~StabilizerState() override;

  // A Solver is at work.
  bool IsWorkingOnResults() const override;

  // No track of the new results is deleted.
  void MakeResultIdentityUnique() override;

  bool has_frames() const { return table().frame_count > 0; }
  // Frames a second of the analysed source; none without a job input.
  double FrameRate() const;

  // That of the Solver, else how the last one ended; none if none has.
  std::optional<Solver::State> SolveStatus() const;
  // What frames show until the solve is done.
  analysis::FrameStatus SolveProgressStatus() const;
  // What the host is told once nothing is under way.
  analysis::FrameStatus SettledStatus() const;

  // Starts a Solver on the stored analysis, unless one is at work on just that or waits for its
  // thread; whether it did. One at work on other inputs is dropped. Where the stored warps fit,
  // only the frame map and the crop are made anew. make_notify gives what the Solver calls at its
  // end; what it throws leaves everything as it was. The tracks of the deletions are left out and
  // marked in the table; without a set, those stay deleted that are.
  bool StartSolve(const marrow::stabilization::SolverParamsRecord& parameters,
                  std::uint32_t frame_map_radius,
                  const std::optional<analysis::effect::DeletedTrackPoints>& deletions,
                  const boost::function<boost::function<void()>()>& make_notify);
  // Takes the results of the Solver, which has finished or failed, and what they were made from;
  // the Solver goes. A failed one leaves no results.
  void TakeSolve();

  // Whether these deletions are what the stored solve was made with. A project tells it by the
  // tracks that it meant, so that any points on just those tracks will do until the next solve.
  bool WasSolvedWithout(const analysis::effect::DeletedTrackPoints& deletions);

  // Frames on either side that the frame map reaches.
  std::uint32_t FrameMapRadius() const;

  // The scale at which the picture is shown, with its output rectangle in the renderer: with
  // auto_scale what the crop window calls for, with use_additional_scale the user's factor too.
  // There must be a warper.
  double GetZoom(const ParameterReader& params, Renderer& renderer, bool auto_scale,
                 bool use_additional_scale) const;
  // The crop window, as shown, is under two fifths of the frame.
  bool IsOverCropped(const ParameterReader& params) const;

  // Both ways between a state and what its renders share: pointers to records, which neither side
  // writes. Publish's gpu_allowed: whether an outside renderer may draw the frames. TakeOver leaves
  // the track table and the analyzer of a user interface instance alone, so that neither a save nor
  // a poll loses them.
  void Publish(bool gpu_allowed) const;
  // Of a state that goes, once it is saved: what renders share of its solve keeps no longer what
  // the warps were made from.
  void ForgetTracks() const;
  void TakeOver();

  // What a project keeps, and back into a fresh state. A Solver at work is left out: what it works
  // on is known to be missing. An analysis that is not done comes back with an analyzer whose jobs
  // are made by make_job; see Analyzer::CanGoOn.
  SavedState Save() const;
  void Load(const SavedState& saved, HX_Handle plugin, const analysis::JobFactory& make_job);

  SolvePhase phase = SolvePhase::None;
  bool needs_solve = false;
  bool subsequent_solve = false;  // the solve is of a changed deletion
  boost::shared_ptr<Solver> solver;
  // Never null, and never written: renders hold it too.
  boost::shared_ptr<const SolveResult> solve_result = boost::make_shared<SolveResult>();
  StabilizerSharedData* shared = nullptr;  // attached to; see StabilizerEffect::AttachSharedData
  // What the host still has to be told, where telling it has failed.
  analysis::FrameStatus unpublished = analysis::FrameStatus::None;
  // Of a render's copy: under which id its plan ordered the frame of its own time, whether it
  // ordered frames for the warp, and whether the media has a frame at that time. The render keeps
  // to it, whatever the host answers meanwhile.
  std::int32_t planned_input = 0;
  bool planned_warp = false;
  bool planned_media = true;
  // The source about which the user was told last that the state is of another.
  SourceShape reported_source;

 private:
  bool IsAtWorkOn(const Solver::Inputs& inputs) const;
  bool MayReuseWarper(const Solver::Inputs& inputs) const;

  // Identity of the deletions that are marked in the table, which are those of the Solver at work;
  // deletion_identity is of the ones that the stored solve was made with.
  tessel::utility::Guid marked_deletions_;
  bool deletions_from_project_ = false;
};

}  // namespace kelp::effect
