#include "analysis/src/analysis.h"

#include <gmock/gmock.h>
#include <unistd.h>

#include <cmath>
#include <cstdlib>
#include <cstring>
#include <filesystem>
#include <fstream>

#include "analysis/src/job_frame_source.h"
#include "analysis/src/track_file.h"
#include "platform/tessel/debug.h"
#include "tests/analysis/src/fake_job.h"
#include "tracking/tracking_run.h"

namespace kelp::analysis {
namespace {

using marrow::tracking::AllFeatures;
using ::testing::ElementsAre;
using Cell = marrow::tracking::tracking_feature<float>;

class AnalysisTest : public ::testing::Test {
 protected:
  ~AnalysisTest() override {
    job_.reset();
    tessel::threads::Shutdown();
  }

  const AllFeatures& Run(const JobInput& input, bool flip = false,
                         marrow::tracking::TrackerParams tracker = SmallTracker()) {
    fields_.clear();
    analysis_ = boost::make_shared<Analysis>(SmallSelector(), tracker);
    job_ = boost::make_shared<FakeJob>(input, analysis_);
    job_->flip = flip;
    job_->AddStatusListener([this](Job&, JobStatus status) {
      if (fields_.empty() || fields_.back() != status.field) fields_.push_back(status.field);
    });
    job_->Start(job_);
    WaitFor(*job_);
    EXPECT_EQ(job_->GetStatus().state, JobState::Finished) << job_->GetErrorText();
    return analysis_->all_features();
  }

  boost::shared_ptr<Analysis> analysis_;
  boost::shared_ptr<FakeJob> job_;
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

// The same frames straight to the tracker.
class DrawnSource final : public marrow::tracking::FrameSource {
 public:
  explicit DrawnSource(std::size_t frames) : frames_(frames) {}
  std::size_t width() const override { return kWidth; }
  std::size_t height() const override { return kHeight; }
  std::size_t frame_count() const override { return frames_; }
  void LoadLuma(std::size_t f, std::uint8_t* out) override { LumaFromArgb(Frame(f), out); }
  void LoadMask(std::size_t f, std::uint8_t* out) override { MaskFromArgb(Frame(f), out); }
  void LoadColor(std::size_t f, float* out) override { ColorFromArgb(Frame(f), out); }

 private:
  marrow::tracking::ArgbFrame Frame(std::size_t f) {
    pixels_ = DrawFrame(0.5 * static_cast<double>(f));
    return {pixels_.data(), kWidth * 4, kWidth, kHeight};
  }
  const std::size_t frames_;
  std::vector<std::uint8_t> pixels_;
};

TEST_F(AnalysisTest, TracksTheJobsFramesWhicheverWayUpTheyCome) {
  AllFeatures plain;
  DrawnSource source(6);
  TrackFrames(source, SmallSelector(), SmallTracker(), plain);
  const AllFeatures& table = Run(ClipInput(6, 10));
  EXPECT_EQ(table.first_frame, 10);
  EXPECT_EQ(table.frame_count, 6);
  EXPECT_EQ(table.feature_count, 8);
  EXPECT_EQ(Bits(table), Bits(plain));
  // Tracks there are, and they move with the picture.
  const Cell* last = table.features->data() + 5 * 8;
  const Cell* first = table.features->data();
  int carried = 0;
  for (int s = 0; s < 8; ++s) {
    bool whole = true;
    for (int f = 1; f < 6; ++f) whole = whole && first[f * 8 + s].status == 0;
    if (!whole) continue;
    ++carried;
    EXPECT_NEAR(last[s].x - first[s].x, 2.5, 0.3);
  }
  EXPECT_GE(carried, 3);
  EXPECT_EQ(Bits(Run(ClipInput(6, 10), /*flip=*/true)), Bits(plain));
}

TEST_F(AnalysisTest, EachReaderOrdersOneFrameAhead) {
  Run(ClipInput(2));
  EXPECT_THAT(
      job_->calls(),
      ElementsAre("properties",                      //
                  "size", "request 0", "request 1",  // mask
                  "size", "request 0", "request 1",  // luma
                  "size", "request 0", "request 1",  // colour
                  "get 0", "request 1", "get 0", "request 1", "get 0", "request 1", "release 0",
                  "get 1", "release 0", "get 1", "release 0", "get 1", "release 1", "release 1",
                  "release 1", "release node", "cancel requests"));
}

TEST_F(AnalysisTest, ClipsOfOneFrameAndOfNone) {
  EXPECT_EQ(Run(ClipInput(1)).frame_count, 1);
  for (const std::string& call : job_->calls()) EXPECT_EQ(call.find('1'), std::string::npos);
  EXPECT_EQ(Run(ClipInput(0)).frame_count, 0);
  EXPECT_THAT(job_->calls(), ElementsAre("properties", "release node", "cancel requests"));
  JobInput backwards = ClipInput(0);
  backwards.Duration = {-1, 1};
  EXPECT_EQ(Run(backwards).frame_count, 0);
  EXPECT_TRUE(analysis_->all_features().features->empty());
}

TEST_F(AnalysisTest, FieldsCountAsFramesAndAlternate) {
  const AllFeatures& table = Run(ClipInput(3, 5, 2));
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

std::string FileBytes(const std::filesystem::path& path) {
  std::ifstream file(path, std::ios::binary);
  return std::string(std::istreambuf_iterator<char>(file), {});
}

template <class T>
T At(const std::string& bytes, std::size_t offset) {
  T value;
  std::memcpy(&value, bytes.data() + offset, sizeof value);
  return value;
}

TEST_F(AnalysisTest, DumpsEveryTrackBeforeShortOnesGo) {
  const std::filesystem::path folder =
      std::filesystem::temp_directory_path() / ("calmframe_trk_" + std::to_string(getpid()));
  std::filesystem::create_directories(folder);
  setenv("TMPDIR", folder.c_str(), 1);
  tessel::debug::DebugDatabase::Set("WriteAnalysisServerTrackFile", 1);
  marrow::tracking::TrackerParams tracker = SmallTracker();
  tracker.kill_tracks_shorter_than = 100;
  Run(ClipInput(3), false, tracker);
  const auto path = folder / "OVAnalysis_unquantized.trk";
  std::string bytes = FileBytes(path);
  ASSERT_EQ(bytes.size(), 20u + 3 * 8 * 16);
  EXPECT_EQ(bytes.substr(0, 8), "\xf5\xff\xff\xff\xff\xff\xff\xff");
  EXPECT_EQ(At<std::int32_t>(bytes, 8), 0);
  EXPECT_EQ(At<std::int32_t>(bytes, 12), 3);
  EXPECT_EQ(At<std::int32_t>(bytes, 16), 8);
  const Cell& first = analysis_->all_features().features->front();
  EXPECT_EQ(At<std::int32_t>(bytes, 20 + 8), 1);  // a seed; removed from the table since
  EXPECT_EQ(first.status, -4);
  EXPECT_EQ(At<float>(bytes, 20 + 4), first.y);

  // Of a run from frame 2 only the last row is reached; two are missing.
  Run(ClipInput(3, 2));
  bytes = FileBytes(path);
  ASSERT_EQ(bytes.size(), 20u + 3 * 8 * 16);
  EXPECT_EQ(At<float>(bytes, 20), (*analysis_->all_features().features)[2 * 8].x);
  for (int cell = 8; cell < 24; ++cell) {
    EXPECT_EQ(At<float>(bytes, 20 + 16 * cell), 0);
    EXPECT_EQ(At<std::int32_t>(bytes, 20 + 16 * cell + 8), -1);
  }
  tessel::debug::DebugDatabase::Set("WriteAnalysisServerTrackFile", 0);

  const std::vector<Cell> cells(1500);
  const std::string trk = (folder / "a.trk").string();
  EXPECT_EQ(WriteTrackFile(trk, cells.data(), 1500, 0, 3, 500), TrackFileResult::Written);
  EXPECT_EQ(std::filesystem::file_size(trk), 24020u);
  EXPECT_EQ(WriteTrackFile(trk, nullptr, 0, 0, 0, 0), TrackFileResult::Written);
  EXPECT_EQ(std::filesystem::file_size(trk), 20u);
  EXPECT_EQ(WriteTrackFile((folder / "no" / "a.trk").string(), nullptr, 0, 0, 0, 0),
            TrackFileResult::NotOpened);
  EXPECT_NE(WriteTrackFile("/dev/full", cells.data(), 1500, 0, 3, 500), TrackFileResult::Written);
  unsetenv("TMPDIR");
  std::filesystem::remove_all(folder);
}

}  // namespace
}  // namespace kelp::analysis
