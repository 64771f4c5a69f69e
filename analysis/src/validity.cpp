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

// Current or OtherSource. A host that has no clip to show now can't tell.
Validity ComparedSource(AnalysisState& state, const PresentInputs& present) {
  const Guid stored = state.result->source_identity;
  const Guid first = present.source_identity();
  if (first == stored) return Validity::Current;
  if (first.IsNil()) return Validity::Unknown;
  if (present.source_identity() != stored) return Validity::OtherSource;
  Replace(state.result, [&first](AnalysisResult& next) { next.source_identity = first; });
  return Validity::Current;
}

Validity Compared(AnalysisState& state, const PresentInputs& present) {
  const boost::shared_ptr<const AnalysisResult> stored = state.result;
  if (stored->all_features.frame_count <= 0) return Validity::Stale;
  const bool same_span =
      IdentifierWithoutPath(stored->job_input) == IdentifierWithoutPath(present.job_input());
  const bool same_tracker =
      stored->tracker_identity.IsNil() || present.tracker_identity() == stored->tracker_identity;
  if (stored->source_identity.IsNil()) return Validity::Stale;
  const Validity source = ComparedSource(state, present);
  if (source != Validity::Current) return source;
  return same_span && same_tracker ? Validity::Current : Validity::Stale;
}

bool SpanLiesWithin(const JobInput& inner, const JobInput& outer) {
  return Compare(inner.StartTime, outer.StartTime) >= 0 &&
         CompareSums(inner.StartTime, inner.Duration, outer.StartTime, outer.Duration) <= 0;
}

}  // namespace

Validity GetValidity(AnalysisState& state, const PresentInputs& present, HX_OutData* host_out) {
  try {
    return Compared(state, present);
  } catch (...) {
    effect::ClearMessage(effect::RecordsOnly(nullptr, host_out));
    return Validity::Unknown;
  }
}

FrameStatus GetAnalysisStatus(const AnalysisState& state, std::int64_t frame,
                              const JobInput* present) {
  if (present == nullptr) return FrameStatus::GeneralFailure;
  if (state.analyzer || state.analysis_pending) return FrameStatus::AnalysisInProgress;
  const marrow::tracking::AllFeatures& table = state.table();
  if (table.frame_count == 0) return FrameStatus::PressAnalyze;
  if (frame < table.first_frame || frame >= std::int64_t{table.first_frame} + table.frame_count) {
    return FrameStatus::OutsideRange;
  }
  const JobInput& stored = state.result->job_input;
  if (!state.source_changed && stored.FieldType != -1 && SpanLiesWithin(*present, stored) &&
      IdenticalTimes(present->StepTime, stored.StepTime) &&
      present->FieldType == stored.FieldType) {
    return FrameStatus::Ready;
  }
  return FrameStatus::RangeChanged;
}

}  // namespace kelp::analysis
