#include "analysis/src/progress.h"

#include <gtest/gtest.h>

#include <boost/make_shared.hpp>

#include "analysis/src/analysis_state.h"
#include "platform/tessel/utility.h"
#include "tests/analysis/src/fake_job.h"
#include "tests/support/host_records.h"

namespace kelp::analysis {
namespace {

using tessel::utility::HighPrecisionTime;

// Says what the analyzer of a real one would when this row is finished.
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

class ProgressTest : public calmframe::host::HostRecords {
 protected:
  std::string Text(std::int64_t frames, std::int64_t row, std::int32_t field = 0) {
    state_.analyzer = boost::make_shared<StandingAnalyzer>(ClipInput(frames, 40, field), row);
    return GetProgressText(state_, &in_, &out_);
  }
  static std::uint64_t Before(std::uint64_t now, double seconds) {
    const double a_tick = static_cast<double>(HighPrecisionTime::ToNanoseconds(1000000)) / 1e15;
    return now - static_cast<std::uint64_t>(static_cast<std::int64_t>(seconds / a_tick));
  }

  AnalysisState state_;
};

TEST_F(ProgressTest, FramesWordForWord) {
  const struct {
    std::int64_t frames, row;
    std::int32_t field;
    const char* text;
  } labels[] = {{300, 0, 0, "0% (frame 1 of 300)"},      {300, 150, 0, "50% (frame 151 of 300)"},
                {300, 299, 0, "99% (frame 300 of 300)"}, {300, 400, 0, "99% (frame 300 of 300)"},
                {300, -50, 0, "0% (frame 1 of 300)"},    {1, 0, 0, "0% (frame 1 of 1)"},
                {0, 0, 0, "0% (frame 0 of 0)"},          {10, 4, 1, "20% (frame 3 of 10)"},
                {10, 5, 1, "20% (frame 3 of 10)"},       {10, 6, 1, "30% (frame 4 of 10)"}};
  for (const auto& [frames, row, field, text] : labels) EXPECT_EQ(Text(frames, row, field), text);
  state_.analyzer->set_job_stage(JobStage::NotStarted);
  EXPECT_EQ(GetProgressText(state_, &in_, &out_), "0% (frame 1 of 10)");
}

// 10 of 110 frames done: what is left takes ten times what has passed, and only counts down.
TEST_F(ProgressTest, TimeWordForWord) {
  const std::pair<double, const char*> labels[] = {
      {12, "Time remaining: 2 minutes"},                                         // 120.1 s
      {30, "Time remaining: 2 minutes"},    {8.85, "Time remaining: 1 minute"},  // 89
      {5.45, "Time remaining: 1 minute"},                                        // 55
      {5.35, "Time remaining: 54 seconds"}, {3.95, "Time remaining: 40 seconds"},
      {30, "Time remaining: 40 seconds"},   {0.35, "Time remaining: 4 seconds"},
      {0.25, "9% (frame 11 of 110)"}};
  for (const auto& [elapsed, text] : labels) {
    const std::uint64_t now = HighPrecisionTime::Now();
    state_.progress.start_tick = Before(now, elapsed);
    state_.progress.display_tick = Before(now, 7);
    EXPECT_EQ(Text(110, 10), text) << elapsed;
  }
}

TEST_F(ProgressTest, FramesForSixSecondsThenTimeForThree) {
  const std::uint64_t start = HighPrecisionTime::Now();
  ProgressClock clock{start, 0, 0};
  const struct {
    std::int64_t position;
    double at;
    bool shows_frames, cycle_runs;
  } looks[] = {{3, 100, true, false},  // three done: too few
               {4, 100, true, true},     {50, 105.9, true, true},  {50, 106.1, false, true},
               {50, 108.9, false, true}, {50, 109.1, true, false}, {50, 109.2, true, true},
               {50, 115.3, false, true}};
  for (const auto& [position, at, shows_frames, cycle_runs] : looks) {
    const ProgressMessage message = NextProgress(clock, 0, 1000, position, Before(start, -at));
    EXPECT_EQ(message.kind == ProgressKind::Frames, shows_frames) << at;
    EXPECT_EQ(clock.display_tick != 0, cycle_runs) << at;
  }
}

}  // namespace
}  // namespace kelp::analysis
