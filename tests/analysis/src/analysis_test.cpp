#include "analysis/src/analysis.h"

#include <gmock/gmock.h>

#include <cstdlib>

#include "analysis/src/job_frame_source.h"
#include "analysis/src/track_file.h"
#include "platform/tessel/debug.h"
#include "tests/analysis/src/fake_job.h"
#include "tests/support/scratch_folder.h"

namespace kelp::analysis {
namespace {

using marrow::tracking::AllFeatures;
using ::testing::ElementsAre;
using Cell = marrow::tracking::tracking_feature<float>;

class AnalysisTest : public FakeJobTest {
 protected:
  const AllFeatures& TableOf(const JobInput& input, bool flip = false,
                             const marrow::tracking::TrackerParams& tracker = SmallTracker()) {
    fields_.clear();
    FakeJob& job = Make(input, {}, tracker);
    job.flip = flip;
    job.AddStatusListener([this](Job&, JobStatus status) {
      if (fields_.empty() || fields_.back() != status.field) fields_.push_back(status.field);
    });
    EXPECT_EQ(Run(job).GetStatus().state, JobState::Finished) << job.GetErrorText();
    return analysis_->all_features();
  }

  std::vector<std::int32_t> fields_;
};

std::vector<float> Bits(const AllFeatures& table) {
  std::vector<float> values;
  for (const Cell& cell : *table.features) {
    values.push_back(static_cast<float>(cell.status));
    if (cell.status >= 0) values.insert(values.end(), {cell.x, cell.y});
  }
  return values;
}

TEST_F(AnalysisTest, TracksTheJobsFramesWhicheverWayUpTheyCome) {
  const AllFeatures table = TableOf(ClipInput(6, 10));
  EXPECT_EQ(table.first_frame, 10);
  EXPECT_EQ(table.frame_count, 6);
  EXPECT_EQ(table.feature_count, 8);
  // Tracks there are, and they move with the picture.
  const marrow::tracking::TrackCells& cells = *table.features;
  int carried = 0;
  for (int s = 0; s < 8; ++s) {
    bool whole = true;
    for (int f = 1; f < 6; ++f) whole = whole && cells[f * 8 + s].status == 0;
    if (!whole) continue;
    ++carried;
    EXPECT_NEAR(cells[5 * 8 + s].x - cells[s].x, 2.5, 0.3);
  }
  EXPECT_GE(carried, 3);
  EXPECT_EQ(Bits(TableOf(ClipInput(6, 10), /*flip=*/true)), Bits(table));
}

TEST_F(AnalysisTest, EachReaderOrdersOneFrameAhead) {
  TableOf(ClipInput(2));
  EXPECT_THAT(job_->calls(), ElementsAre("start", "properties",             //
                                         "size", "request 0", "request 1",  // mask
                                         "size", "request 0", "request 1",  // luma
                                         "size", "request 0", "request 1",  // colour
                                         "get 0", "request 1", "get 0", "request 1", "get 0",
                                         "request 1", "release 0", "get 1", "release 0", "get 1",
                                         "release 0", "get 1", "release 1", "release 1",
                                         "release 1", "node", "cancel requests", "notify"));
}

TEST_F(AnalysisTest, ClipsOfOneFrameAndOfNone) {
  EXPECT_EQ(TableOf(ClipInput(1)).frame_count, 1);
  for (const std::string& call : job_->calls()) EXPECT_EQ(call.find('1'), std::string::npos);
  for (const std::int64_t frames : {0, -1}) {
    EXPECT_EQ(TableOf(ClipInput(frames)).frame_count, 0);
    EXPECT_THAT(job_->calls(),
                ElementsAre("start", "properties", "node", "cancel requests", "notify"));
    EXPECT_TRUE(analysis_->all_features().features->empty());
  }
}

TEST_F(AnalysisTest, FieldsCountAsFramesAndAlternate) {
  const AllFeatures& table = TableOf(ClipInput(3, 5, 2));
  EXPECT_EQ(table.first_frame, 10);
  EXPECT_EQ(table.frame_count, 6);
  EXPECT_THAT(fields_, ElementsAre(2, 1, 2, 1, 2, 1));
  EXPECT_EQ(Compare(job_->GetStatus().time, {15, 50}), 0);
  // A span that cuts frames: from 10.4 to 12.2 fields.
  JobInput cut = ClipInput(3, 5, 1);
  cut.StartTime = {52, 250};
  cut.Duration = {9, 250};
  const RunFrames run = GetRunFrames(cut);
  EXPECT_EQ(run.first_frame, 10);
  EXPECT_EQ(run.frame_count, 3);
  EXPECT_TRUE(IdenticalTimes(run.duration, {1, 50}));
}

TEST_F(AnalysisTest, DumpsEveryTrackBeforeShortOnesGo) {
  const ScratchFolder folder;
  setenv("TMPDIR", folder.path().c_str(), 1);
  tessel::debug::DebugDatabase::Set("WriteAnalysisServerTrackFile", 1);
  marrow::tracking::TrackerParams tracker = SmallTracker();
  tracker.kill_tracks_shorter_than = 100;
  TableOf(ClipInput(3), false, tracker);
  const auto dumped = [&folder] {
    const std::string bytes = folder.Content("OVAnalysis_unquantized.trk");
    // -11, the rows' first and end, the features of a row
    const std::string head("\xf5\xff\xff\xff\xff\xff\xff\xff\0\0\0\0\3\0\0\0\10\0\0\0", 20);
    EXPECT_EQ(bytes.substr(0, 20), head);
    std::vector<Cell> cells(3 * 8);
    EXPECT_EQ(bytes.size(), 20u + 3 * 8 * 16);
    bytes.copy(reinterpret_cast<char*>(cells.data()), 3 * 8 * 16, 20);
    return cells;
  };
  const Cell first = analysis_->all_features().features->front();
  EXPECT_EQ(dumped()[0].status, 1);  // a seed; removed from the table since
  EXPECT_EQ(dumped()[0].y, first.y);
  EXPECT_EQ(first.status, -4);

  // Of a run from frame 2 only the last row is reached; two are missing.
  TableOf(ClipInput(3, 2));
  const std::vector<Cell> cells = dumped();
  EXPECT_EQ(cells[0].x, (*analysis_->all_features().features)[2 * 8].x);
  for (int cell = 8; cell < 24; ++cell) {
    EXPECT_EQ(cells[cell].x, 0);
    EXPECT_EQ(cells[cell].status, -1);
  }
  tessel::debug::DebugDatabase::Set("WriteAnalysisServerTrackFile", 0);
  unsetenv("TMPDIR");

  const std::vector<Cell> many(1500);
  EXPECT_EQ(WriteTrackFile(folder.In("a.trk"), nullptr, 0, 0, 0, 0), TrackFileResult::Written);
  EXPECT_EQ(folder.Content("a.trk").size(), 20u);
  EXPECT_EQ(WriteTrackFile(folder.In("no/a.trk"), nullptr, 0, 0, 0, 0), TrackFileResult::NotOpened);
  EXPECT_NE(WriteTrackFile("/dev/full", many.data(), 1500, 0, 3, 500), TrackFileResult::Written);
}

}  // namespace
}  // namespace kelp::analysis
