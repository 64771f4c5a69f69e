#include "analysis/src/progress.h"

#include <gtest/gtest.h>

#include <cmath>

#include "analysis/src/analysis_state.h"
#include "platform/tessel/utility.h"
#include "tests/analysis/src/fake_host.h"
#include "tests/analysis/src/fake_job.h"

namespace kelp::analysis {
namespace {

using tessel::utility::HighPrecisionTime;

// Says what the analyzer of a real one would at a point of its run.
class StandingAnalyzer final : public Analyzer {
 public:
  StandingAnalyzer(const JobInput& input, std::int64_t row) : Analyzer(AnalyzerRecord(), {}) {
    record_.job_input_parameters = input;
    record_.job_stage = JobStage::SeenRunning;
    status_.time = input.StartTime + RowDuration(input) * row;
  }
  bool IsActive() override { return true; }
  JobStatus GetStatus() override { return status_; }
  void Cancel(HX_InData*, HX_OutData*, const char*) override {}
  std::string GetErrorText() override { return {}; }
  boost::shared_ptr<marrow::tracking::AllFeatures> GetFeatures() override { return {}; }
  bool CanGoOn() override { return true; }

 private:
  JobStatus status_;
};

class ProgressTest : public ::testing::Test {
 protected:
  // The label of a clip of `frames` frames from frame 40 on with this row finished last.
  std::string Text(std::int64_t frames, std::int64_t row, std::int32_t field = 0) {
    state_.analyzer = boost::make_shared<StandingAnalyzer>(ClipInput(frames, 40, field), row);
    return GetProgressText(state_, &host_.in, &host_.out);
  }
  // The same when the analysis and the display's cycle began so many seconds ago.
  std::string TextAfter(double elapsed, double age, std::int64_t frames, std::int64_t row) {
    const std::uint64_t now = HighPrecisionTime::Now();
    state_.progress.start_tick = Before(now, elapsed);
    state_.progress.display_tick = Before(now, age);
    return Text(frames, row);
  }
  static std::uint64_t Before(std::uint64_t now, double seconds) {
    const double a_tick = static_cast<double>(HighPrecisionTime::ToNanoseconds(1000000)) / 1e15;
    return now - static_cast<std::uint64_t>(static_cast<std::int64_t>(seconds / a_tick));
  }

  FakeHost host_;
  AnalysisState state_;
};

TEST_F(ProgressTest, FramesWordForWord) {
  EXPECT_EQ(Text(300, 0), "0% (frame 1 of 300)");
  EXPECT_EQ(Text(300, 150), "50% (frame 151 of 300)");
  EXPECT_EQ(Text(300, 299), "99% (frame 300 of 300)");
  EXPECT_EQ(Text(300, 400), "99% (frame 300 of 300)");
  EXPECT_EQ(Text(1, 0), "0% (frame 1 of 1)");
  EXPECT_EQ(Text(0, 0), "0% (frame 0 of 0)");
  // Two rows a frame.
  EXPECT_EQ(Text(10, 4, 1), "20% (frame 3 of 10)");
  EXPECT_EQ(Text(10, 5, 1), "20% (frame 3 of 10)");
  EXPECT_EQ(Text(10, 6, 1), "30% (frame 4 of 10)");
}

TEST_F(ProgressTest, TimeWordForWord) {
  // 10 of 110 frames done: what is left takes ten times what has passed.
  EXPECT_EQ(TextAfter(12, 7, 110, 10), "Time remaining: 2 minutes");   // 120.1 s or so
  EXPECT_EQ(TextAfter(8.89, 7, 110, 10), "Time remaining: 1 minute");  // 89
  EXPECT_EQ(TextAfter(5.49, 7, 110, 10), "Time remaining: 1 minute");  // 55
  EXPECT_EQ(TextAfter(5.39, 7, 110, 10), "Time remaining: 54 seconds");
  EXPECT_EQ(TextAfter(0.39, 7, 110, 10), "Time remaining: 4 seconds");
  EXPECT_EQ(TextAfter(0.29, 7, 110, 10), "9% (frame 11 of 110)");
}

TEST_F(ProgressTest, TheTimeOnlyCountsDown) {
  EXPECT_EQ(TextAfter(3.995, 7, 110, 10), "Time remaining: 40 seconds");
  EXPECT_EQ(TextAfter(30, 7, 110, 10), "Time remaining: 40 seconds");
  EXPECT_EQ(state_.progress.remaining_seconds, 40);
  EXPECT_EQ(TextAfter(1.995, 7, 110, 10), "Time remaining: 20 seconds");
}

TEST_F(ProgressTest, FramesForSixSecondsThenTimeForThree) {
  const auto second = [start = HighPrecisionTime::Now()](double seconds) {
    return Before(start, -seconds);
  };
  ProgressClock clock{second(0), 0, 0};
  const auto kind = [&](std::int64_t position, double at) {
    return NextProgress(clock, 0, 1000, position, second(at)).kind;
  };
  EXPECT_EQ(kind(3, 100), ProgressKind::Frames);  // three done: too few
  EXPECT_EQ(clock.display_tick, 0u);
  EXPECT_EQ(kind(4, 100), ProgressKind::Frames);  // the cycle begins
  EXPECT_EQ(kind(50, 105.9), ProgressKind::Frames);
  EXPECT_NE(kind(50, 106.1), ProgressKind::Frames);
  EXPECT_NE(kind(50, 108.9), ProgressKind::Frames);
  EXPECT_EQ(kind(50, 109.1), ProgressKind::Frames);
  EXPECT_EQ(clock.display_tick, 0u);
  EXPECT_EQ(kind(50, 109.2), ProgressKind::Frames);  // the next one begins
  EXPECT_NE(kind(50, 115.3), ProgressKind::Frames);
}

TEST_F(ProgressTest, HandsOnWhatTheHostAnswers) {
  host_.failing = {{"ConvertText", 321}};
  EXPECT_THROW(Text(10, 1), std::int32_t);
  host_.missing = {"HX OV Private Effect Suite"};
  EXPECT_THROW(Text(10, 1), std::int32_t);
  EXPECT_STREQ(host_.out.return_msg, "Not able to acquire OVK Suite.");
}

}  // namespace
}  // namespace kelp::analysis
