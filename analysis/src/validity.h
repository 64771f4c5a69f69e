#pragma once

#include <boost/function.hpp>
#include <cstdint>

#include "analysis/src/analysis_state.h"

namespace kelp::analysis {

// How to learn what an analysis would be made from now. Each may throw.
struct PresentInputs {
  boost::function<JobInput()> job_input;
  boost::function<tessel::utility::Guid()> tracker_identity;
  boost::function<tessel::utility::Guid()> source_identity;
};

// Whether the stored result is what an analysis would give now. Asks no more than it needs to know,
// the host's graph last. Does not throw: what can't be learnt makes the result stale, and no
// message about it stays in `host_out`. May store a source identity that changed back meanwhile.
bool IsAnalysisCurrent(AnalysisState& state, const PresentInputs& present, HX_OutData* host_out);

// Status of a frame as far as the analysis knows it. The values are shared by the whole effect.
enum class FrameStatus : std::int32_t {
  None = 0,
  PressAnalyze = 1,
  OutsideRange = 2,
  RangeChanged = 3,
  AnalysisInProgress = 4,
  SolveInProgress = 5,
  SubsequentSolve = 6,
  SubsequentSolveOnDeletion = 7,
  Ready = 8,
  TrackingFailed = 9,
  SolveFailed = 10,
  GeneralFailure = 11,
  OverCropped = 12
};

// `frame` is absolute, fields counted as frames; `job_input` what the host says now, null if it
// can't be read.
FrameStatus GetAnalysisStatus(const AnalysisState& state, std::int64_t frame,
                              const JobInput* job_input);

}  // namespace kelp::analysis
