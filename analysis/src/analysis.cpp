#include "analysis/src/analysis.h"

#include <limits>
#include <stdexcept>

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

  JobFrameSource source(job);
  all_features_.first_frame = static_cast<std::int32_t>(run.first_frame);
  // Short tracks go after the dump, which shows every track.
  marrow::tracking::TrackerParams keep_all = tracker_;
  keep_all.kill_tracks_shorter_than = 0;
  try {
    TrackFrames(source, selector_, keep_all, all_features_);
  } catch (const EndOfRun&) {  // the rows before it are whole
  }
  ShortenTable(all_features_, job.end_row(), 0);
  WriteAnalysisServerTrackFile(all_features_);
  RemoveShortTracks(all_features_, tracker_.kill_tracks_shorter_than);
  source.ReleaseFrames();
}

}  // namespace kelp::analysis
