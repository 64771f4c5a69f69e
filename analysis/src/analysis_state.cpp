#include "analysis/src/analysis_state.h"

#include <boost/make_shared.hpp>

#include "analysis/src/job_frame_source.h"
#include "platform/tessel/utility.h"

namespace kelp::analysis {

void AnalysisState::MakeResultIdentityUnique() {
  result_identity = tessel::utility::Guid::MakeUnique();
}

void AnalysisState::Begin(HX_InData* host_in, HX_OutData* host_out,
                          const marrow::tracking::SelectorParams& selector,
                          const marrow::tracking::TrackerParams& tracker, bool with_details,
                          const JobFactory& make_job) {
  EndAnalyzer(host_in, host_out);
  analyzer = boost::make_shared<AnalyzerPrem>(host_in, host_out, selector, tracker, make_job);
  detailed = with_details;
  progress = ProgressClock{tessel::utility::HighPrecisionTime::Now(), 0, 0};
  error_text.clear();
}

void AnalysisState::DropAnalyzer() {
  analyzer.reset();
  analysis_pending = false;
}

void AnalysisState::EndAnalyzer(HX_InData* host_in, HX_OutData* host_out) {
  if (!analyzer) return;
  if (analyzer->IsActive()) analyzer->Cancel(host_in, host_out, "");
  // Of an ended job too: else its table would stay in the registry for ever.
  analyzer->Stop(host_in, host_out);
  DropAnalyzer();
}

bool AnalysisState::TakeResults() {
  const boost::shared_ptr<marrow::tracking::AllFeatures> features =
      analyzer ? analyzer->GetFeatures() : boost::shared_ptr<marrow::tracking::AllFeatures>();
  if (!features) return false;
  Replace(result, [&](AnalysisResult& next) {
    next.all_features = *features;
    next.all_features.first_frame = static_cast<std::int32_t>(analyzer->FirstRunFrame());
    next.job_input = analyzer->record().job_input_parameters;
    const std::int64_t rows = features->frame_count;
    if (rows < GetRunFrames(next.job_input).frame_count) {  // it ended early
      next.job_input.Duration = RowDuration(next.job_input) * rows;
    }
    next.tracker_identity = analyzer->GetTrackerGuid();
  });
  source_changed = false;
  MakeResultIdentityUnique();
  return true;
}

}  // namespace kelp::analysis
