#include "analysis/src/analysis.h"

#include <limits>
#include <stdexcept>
#include <utility>

#include "analysis/src/identities.h"
#include "analysis/src/job_frame_source.h"
#include "analysis/src/track_file.h"
#include "tracking/tracking_run.h"

namespace kelp::analysis {

Analysis::Analysis(const marrow::tracking::SelectorParams& selector,
                   const marrow::tracking::TrackerParams& tracker)
    : run_functions_{[this](Job& job) { Run(job); }},
      selector_(selector),
      tracker_(tracker),
      tracker_identity_(GetIdentifierForTracker(selector, tracker)) {}

class Analysis::Watcher final : public marrow::tracking::RunWatcher {
 public:
  Watcher(Analysis& analysis, std::size_t rows) : analysis_(analysis), all_rows_(rows) {}
  bool Wants(std::size_t rows) override {
    return rows < all_rows_ && analysis_.wanted_.exchange(false);
  }
  void Take(const marrow::tracking::RunState& state) override { analysis_.AddPiece(state); }

 private:
  Analysis& analysis_;
  const std::size_t all_rows_;
};

void Analysis::TakeUp(const tessel::utility::Guid& run, const JobInput& input,
                      const std::vector<Bytes>& pieces) {
  run_ = run;
  if (pieces.empty()) return;
  const std::int64_t rows = GetRunFrames(input).frame_count;
  if (rows < 1 || rows > std::numeric_limits<std::int32_t>::max()) return;
  all_features_.feature_count = static_cast<std::int32_t>(selector_.max_count);
  all_features_.frame_count = static_cast<std::int32_t>(rows);
  *all_features_.features =
      marrow::tracking::TrackCells(static_cast<std::size_t>(rows) * selector_.max_count);
  for (const Bytes& piece : pieces) {
    if (!TakeRunPiece(run_, piece, all_features_, taken_up_)) break;
    ++next_piece_;
  }
  kept_rows_ = taken_up_.rows;
}

void Analysis::AddPiece(const marrow::tracking::RunState& state) {
  Piece piece{next_piece_++, PackRunPiece(run_, all_features_, kept_rows_, state)};
  kept_rows_ = state.rows;
  const std::lock_guard lock(mutex_);
  pieces_.push_back(std::move(piece));
}

std::vector<Analysis::Piece> Analysis::TakePieces() {
  const std::lock_guard lock(mutex_);
  return std::exchange(pieces_, {});
}

void Analysis::Run(Job& job) {
  try {
    Track(job);
  } catch (const TerminateException&) {
  }
}

void Analysis::Track(Job& job) {
  constexpr std::int64_t kMax = std::numeric_limits<std::int32_t>::max();
  const RunFrames run = GetRunFrames(job.input());
  if (run.first_frame < 0 || run.first_frame > kMax || run.frame_count > kMax) {
    throw std::length_error("frames out of range");
  }
  if (run.frame_count == 0) return;

  const auto done = static_cast<std::int64_t>(taken_up_.rows);
  JobFrameSource source(job, done);
  all_features_.first_frame = static_cast<std::int32_t>(run.first_frame);
  // Short tracks go after the dump, which shows every track.
  marrow::tracking::TrackerParams keep_all = tracker_;
  keep_all.kill_tracks_shorter_than = 0;
  try {
    Watcher watcher(*this, static_cast<std::size_t>(run.frame_count));
    if (done > 0) {
      GoOnTracking(source, selector_, keep_all, all_features_, taken_up_, &watcher);
    } else {
      TrackFrames(source, selector_, keep_all, all_features_, nullptr, &watcher);
    }
  } catch (const EndOfRun&) {  // the rows before it are whole
  }
  ShortenTable(all_features_, job.end_row(), 0);
  WriteAnalysisServerTrackFile(all_features_);
  RemoveShortTracks(all_features_, tracker_.kill_tracks_shorter_than);
  source.ReleaseFrames();
}

}  // namespace kelp::analysis
