#include "analysis/src/validity.h"

#include "analysis/src/identities.h"
#include "effect/host_text.h"

namespace kelp::analysis {
namespace {

using tessel::utility::Guid;

// A project may move, with its clip, and stays what it is.
Guid IdentifierWithoutPath(JobInput input) {
  input.ProjectPath.clear();
  return GetIdentifierForJobInput(input);
}

bool FitsInputs(AnalysisState& state, const PresentInputs& present) {
  if (state.all_features.frame_count <= 0) return false;
  if (IdentifierWithoutPath(state.job_input) != IdentifierWithoutPath(present.job_input())) {
    return false;
  }
  if (!state.tracker_identity.IsNil() && present.tracker_identity() != state.tracker_identity) {
    return false;
  }
  if (state.source_identity.IsNil()) return false;
  const Guid first = present.source_identity();
  if (first == state.source_identity) return true;
  if (present.source_identity() != state.source_identity) return false;
  state.source_identity = first;
  return true;
}

bool SpanLiesWithin(const JobInput& inner, const JobInput& outer) {
  return Compare(inner.StartTime, outer.StartTime) >= 0 &&
         CompareSums(inner.StartTime, inner.Duration, outer.StartTime, outer.Duration) <= 0;
}

}  // namespace

bool IsAnalysisCurrent(AnalysisState& state, const PresentInputs& present, HX_OutData* host_out) {
  try {
    return FitsInputs(state, present);
  } catch (...) {
    effect::ClearMessage(effect::RecordsOnly(nullptr, host_out));
    return false;
  }
}

FrameStatus GetAnalysisStatus(const AnalysisState& state, std::int64_t frame,
                              const JobInput* present) {
  if (present == nullptr) return FrameStatus::GeneralFailure;
  if (state.analyzer || state.analysis_pending) return FrameStatus::AnalysisInProgress;
  if (state.all_features.frame_count == 0) return FrameStatus::PressAnalyze;
  if (frame < state.first_frame ||
      frame >= std::int64_t{state.first_frame} + state.all_features.frame_count) {
    return FrameStatus::OutsideRange;
  }
  const JobInput& stored = state.job_input;
  if (stored.FieldType != -1 && SpanLiesWithin(*present, stored) &&
      IdenticalTimes(present->StepTime, stored.StepTime) &&
      present->FieldType == stored.FieldType) {
    return FrameStatus::Ready;
  }
  return FrameStatus::RangeChanged;
}

}  // namespace kelp::analysis
