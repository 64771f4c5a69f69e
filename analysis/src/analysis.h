#pragma once

#include <atomic>
#include <cstddef>
#include <mutex>
#include <vector>

#include "analysis/src/job.h"
#include "analysis/src/run_piece.h"
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

  // Ahead of the job's start: goes on behind those of the pieces that are of this run, one behind
  // the other from the first.
  void TakeUp(const tessel::utility::Guid& run, const JobInput& input,
              const std::vector<Bytes>& pieces);
  // Any thread. Asks for a piece of the rows that are new; it is there some row later.
  void WantPiece() { wanted_ = true; }
  struct Piece {
    std::size_t number;  // from 0; any of a higher one are of no use any more
    Bytes bytes;
  };
  // What was made since the last call.
  std::vector<Piece> TakePieces();

  // The table: the job's thread writes it while the job runs; nobody else looks before the job has
  // finished.
  const marrow::tracking::AllFeatures& all_features() const { return all_features_; }

 private:
  class Watcher;

  void Run(Job& job);
  void Track(Job& job);
  void AddPiece(const marrow::tracking::RunState& state);

  const std::vector<Job::RunFunction> run_functions_;
  const marrow::tracking::SelectorParams selector_;
  const marrow::tracking::TrackerParams tracker_;
  const tessel::utility::Guid tracker_identity_;
  marrow::tracking::AllFeatures all_features_;

  // Constant once the job has started.
  tessel::utility::Guid run_;
  marrow::tracking::RunState taken_up_;
  // The job's thread's.
  std::size_t kept_rows_ = 0;
  std::size_t next_piece_ = 0;
  std::atomic<bool> wanted_{false};
  std::mutex mutex_;
  std::vector<Piece> pieces_;  // guarded by mutex_
};

}  // namespace kelp::analysis
