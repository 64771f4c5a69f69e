#pragma once

#include <vector>

#include "analysis/src/job.h"
#include "platform/tessel/guid.h"
#include "tracking/selector_params.h"
#include "tracking/track_store.h"
#include "tracking/tracker_params.h"

namespace kelp::analysis {

// The body of a job: tracks features through the job's frames into a table of its own.
class Analysis {
 public:
  Analysis(const marrow::tracking::SelectorParams& selector,
           const marrow::tracking::TrackerParams& tracker);
  Analysis(const Analysis&) = delete;
  Analysis& operator=(const Analysis&) = delete;

  // What a job calls on its thread. They must not outlive this.
  const std::vector<Job::RunFunction>& run_functions() const { return run_functions_; }

  // GetIdentifierForTracker of the records that the run uses.
  const tessel::utility::Guid& tracker_identity() const { return tracker_identity_; }

  // The table: the job's thread writes it while the job runs; nobody else looks before the job has
  // finished.
  const marrow::tracking::AllFeatures& all_features() const { return all_features_; }

 private:
  void Run(Job& job);
  void Track(Job& job);

  const std::vector<Job::RunFunction> run_functions_;
  const marrow::tracking::SelectorParams selector_;
  const marrow::tracking::TrackerParams tracker_;
  const tessel::utility::Guid tracker_identity_;
  marrow::tracking::AllFeatures all_features_;
};

}  // namespace kelp::analysis
