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

// What the stored result is to one that an analysis would give now.
enum class Validity {
  Current,  // the same
  Stale,    // of another span or of other parameters, of a source that is not known, or no result
  OtherSource,  // of another source than stands under the effect now, whatever else has changed
  Unknown       // the host can't tell
};

// Asks nothing where there is no result, and the host's graph last. Does not throw, and no message
// about what can't be learnt stays in `host_out`. May store a source identity that changed back
// meanwhile.
Validity GetValidity(AnalysisState& state, const PresentInputs& present, HX_OutData* host_out);

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
