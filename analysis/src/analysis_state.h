#pragma once

#include <boost/logic/tribool.hpp>
#include <boost/shared_ptr.hpp>
#include <cstdint>
#include <string>

#include "analysis/src/analysis_result.h"
#include "analysis/src/analyzer.h"
#include "analysis/src/progress.h"
#include "effect/source_shape.h"

namespace kelp::analysis {

// What an effect instance keeps of its analysis: the result, and the analyzer while one is at work.
// The host's main thread only. The order of the virtual operations is part of the interface.
class AnalysisState {
 public:
  AnalysisState() = default;
  AnalysisState(const AnalysisState&) = delete;
  AnalysisState& operator=(const AnalysisState&) = delete;

  // The results have changed: whoever kept something made from them can see it.
  virtual void MakeResultIdentityUnique();
  virtual ~AnalysisState() = default;
  // Whether work beyond the analysis still runs on the results.
  virtual bool IsWorkingOnResults() const { return false; }

  // A new analysis: ends the one at work, if any, and makes an analyzer that has not started. The
  // older result stays. Throws what reading the job input throws.
  void Begin(HX_InData* host_in, HX_OutData* host_out,
             const marrow::tracking::SelectorParams& selector,
             const marrow::tracking::TrackerParams& tracker, bool detailed,
             const JobFactory& make_job);
  // Forgets the analyzer, and with it that one was pending.
  void DropAnalyzer();
  // Cancels and stops the analyzer, if any, and drops it.
  void EndAnalyzer(HX_InData* host_in, HX_OutData* host_out);
  // Takes over the results of the analyzer's job and what they were made from, which is a shorter
  // span of the clip where the job ended early. False, and nothing changes, if there are none.
  bool TakeResults();

  const marrow::tracking::AllFeatures& table() const { return result->all_features; }

  // Never null, and never written: renders hold it too. From the start of an analysis on the two
  // identities are those of what it is made from, though the table is still the older one.
  boost::shared_ptr<const AnalysisResult> result = boost::make_shared<AnalysisResult>();
  kelp::effect::SourceShape source;  // when the result was made
  boost::shared_ptr<Analyzer> analyzer;
  ProgressClock progress;
  std::string error_text;
  tessel::utility::Guid result_identity;
  tessel::utility::Guid solve_input_identity;
  tessel::utility::Guid deletion_identity;  // of the tracks that the user deleted

  bool analysis_pending = false;
  // Another source stands under the effect than the result is of. Found out by the idle step, which
  // may ask the host's graph; renders know it from there.
  bool source_changed = false;
  // From the start of an analysis until what is made from its results is done once.
  bool first_analysis = false;
  // A render's copy of the state of another instance, whose jobs it leaves alone.
  bool keep_jobs = false;
  // The Detailed Analysis control that the analysis was begun with.
  boost::logic::tribool detailed = boost::logic::indeterminate;
  tessel::utility::Guid button_identity;  // of what the two buttons show
};

}  // namespace kelp::analysis
