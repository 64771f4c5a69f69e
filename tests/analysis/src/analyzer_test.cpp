#include "analysis/src/analyzer.h"

#include <gmock/gmock.h>

#include <cmath>

#include "analysis/src/analysis_state.h"
#include "analysis/src/identities.h"
#include "platform/tessel/debug.h"
#include "tests/analysis/src/fake_host.h"
#include "tests/analysis/src/fake_job.h"

namespace kelp::analysis {
namespace {

using tessel::threads::CompletionEvent;

class AnalyzerTest : public ::testing::Test {
 protected:
  AnalyzerTest() {
    host_.count = 3;
    host_.top = host_.AddPlainClip("0a000000-0000-0000-0000-000000000001");
    other_top_ = host_.AddPlainClip("0a000000-0000-0000-0000-000000000002");
  }
  ~AnalyzerTest() override {
    release_.Signal();
    JobRegistry::Instance().CancelAll();
    jobs_.clear();
    tessel::threads::Shutdown();
    EXPECT_EQ(FakeJob::living, 0);
  }

  JobFactory Factory() {
    return [this](HX_InData*, HX_OutData*, const JobInput& input,
                  const boost::shared_ptr<Analysis>& analysis) {
      const auto job = boost::make_shared<FakeJob>(
          input, analysis, [this](FakeJob& self, const std::string& call) {
            if (call != stop_at_) return;
            if (fail_) self.Fail("$$$/stabilizer/error/Test=Frame lost.");
            reached_.Signal();
            release_.Wait();
          });
      jobs_.push_back(job);
      return job;
    };
  }
  boost::shared_ptr<AnalyzerPrem> Make(std::uint64_t slots = 8) {
    auto selector = SmallSelector();
    selector.max_count = slots;
    return boost::make_shared<AnalyzerPrem>(&host_.in, &host_.out, selector, SmallTracker(),
                                            Factory());
  }
  boost::shared_ptr<AnalyzerPrem> Started(std::uint64_t slots = 8) {
    const auto analyzer = Make(slots);
    analyzer->Start(&host_.in, &host_.out);
    return analyzer;
  }
  void Stop(Analyzer& analyzer) { analyzer.Stop(&host_.in, &host_.out); }
  void Cancel(Analyzer& analyzer) {
    analyzer.Cancel(&host_.in, &host_.out, "");
    Stop(analyzer);
  }
  // The job of this number, counted in the order of making, with its run at an end.
  void WaitForJob(std::size_t number) {
    if (const auto job = jobs_.at(number).lock()) WaitFor(*job);
  }

  FakeHost host_;
  int other_top_ = 0;
  std::vector<boost::weak_ptr<FakeJob>> jobs_;
  std::string stop_at_;  // the call at which jobs wait
  bool fail_ = false;    // or fail
  CompletionEvent reached_, release_;
};

TEST_F(AnalyzerTest, RunsToItsResultsAndLeavesNothing) {
  host_.start = 7;
  const auto analyzer = Make();
  EXPECT_FALSE(analyzer->IsActive());
  EXPECT_EQ(analyzer->GetStatus().state, JobState::Failed);
  EXPECT_FALSE(analyzer->ReportFailure(&host_.in, &host_.out) && host_.out.out_flags != 0);
  EXPECT_EQ(analyzer->FirstFrame(), 7);
  EXPECT_EQ(analyzer->EndFrame(), 10);
  stop_at_ = "get 1";
  analyzer->Start(&host_.in, &host_.out);
  EXPECT_EQ(analyzer->job_stage(), JobStage::Started);
  reached_.Wait();
  EXPECT_TRUE(analyzer->IsActive());
  EXPECT_EQ(analyzer->GetStatus().state, JobState::Running);
  EXPECT_EQ(analyzer->GetFeatures(), nullptr);  // the table is still being written
  release_.Signal();
  WaitForJob(0);
  EXPECT_FALSE(analyzer->IsActive());
  const auto features = analyzer->GetFeatures();
  ASSERT_TRUE(features);
  EXPECT_EQ(features->frame_count, 3);
  EXPECT_EQ(features->first_frame, 7);
  Stop(*analyzer);
  EXPECT_EQ(analyzer->job_stage(), JobStage::NotStarted);
  EXPECT_EQ(analyzer->GetFeatures(), nullptr);
  EXPECT_TRUE(jobs_[0].expired());
  EXPECT_EQ(features->features->size(), 3u * 8);  // the table outlives its job
}

TEST_F(AnalyzerTest, EqualInputSharesOneJobWhateverItsParameters) {
  stop_at_ = "get 0";
  const auto first = Started(8), second = Started(6);
  EXPECT_EQ(jobs_.size(), 1u);
  EXPECT_EQ(second->GetTrackerGuid(), first->GetTrackerGuid());
  EXPECT_EQ(second->GetTrackerGuid(), GetIdentifierForTracker(SmallSelector(), SmallTracker()));

  // Other timing and another source are other jobs.
  host_.count = 4;
  const auto longer = Started();
  host_.count = 3;
  host_.top = other_top_;
  const auto elsewhere = Started();
  EXPECT_EQ(jobs_.size(), 3u);
  release_.Signal();
  for (std::size_t i = 0; i < 3; ++i) WaitForJob(i);
  EXPECT_EQ(first->GetFeatures()->features, second->GetFeatures()->features);
  EXPECT_NE(first->GetFeatures()->features, elsewhere->GetFeatures()->features);
  EXPECT_EQ(longer->GetFeatures()->frame_count, 4);

  // One that cancels takes the job from the other as well.
  Cancel(*first);
  EXPECT_EQ(second->GetStatus().state, JobState::Failed);
  EXPECT_TRUE(second->ReportFailure(&host_.in, &host_.out));
  EXPECT_STREQ(host_.out.return_msg, "");
  Cancel(*second);
  EXPECT_TRUE(longer->GetFeatures());
}

TEST_F(AnalyzerTest, AFinishedJobWaitsForLateJoinersThatWantTheSame) {
  const auto first = Started();
  WaitForJob(0);
  first->set_job_stage(JobStage::SeenEnded);
  const auto features = first->GetFeatures();
  Stop(*first);
  const auto joiner = Started();
  ASSERT_EQ(jobs_.size(), 1u);
  EXPECT_EQ(joiner->GetFeatures()->features, features->features);
  // Other parameters want another table, and it takes the entry's place.
  const auto other = Started(6);
  ASSERT_EQ(jobs_.size(), 2u);
  WaitForJob(1);
  EXPECT_EQ(other->GetFeatures()->feature_count, 6);
  EXPECT_EQ(joiner->GetFeatures(), nullptr);
  Stop(*joiner);
  EXPECT_TRUE(other->GetFeatures());  // neither this nor the delayed removal is of its job
  tessel::threads::Shutdown();        // runs the delayed removal
  EXPECT_TRUE(jobs_[0].expired());
  EXPECT_TRUE(other->GetFeatures());
  Stop(*other);
}

TEST_F(AnalyzerTest, CancelledJobsHaveNoResultsAndAreNeverJoined) {
  stop_at_ = "get 1";
  const auto first = Started();
  reached_.Wait();
  first->Cancel(&host_.in, &host_.out, "text");
  EXPECT_FALSE(first->IsActive());
  const auto second = Started();
  EXPECT_EQ(jobs_.size(), 2u);
  release_.Signal();
  tessel::threads::Shutdown();
  EXPECT_EQ(first->GetFeatures(), nullptr);
  EXPECT_TRUE(second->GetFeatures());
  Stop(*first);
  EXPECT_TRUE(second->GetFeatures());
}

TEST_F(AnalyzerTest, AFailureIsToldOnceAndRetried) {
  stop_at_ = "get 2";
  fail_ = true;
  const auto analyzer = Started();
  WaitForJob(0);
  EXPECT_EQ(analyzer->GetStatus().state, JobState::Failed);
  EXPECT_TRUE(analyzer->ReportFailure(&host_.in, &host_.out));
  EXPECT_STREQ(host_.out.return_msg, "Frame lost.");
  EXPECT_EQ(host_.out.out_flags, 0x100u);
  EXPECT_EQ(analyzer->GetFeatures(), nullptr);
  analyzer->set_job_stage(JobStage::SeenEnded);
  Stop(*analyzer);  // the entry lingers
  fail_ = false;
  release_.Signal();
  const auto again = Started();
  ASSERT_EQ(jobs_.size(), 2u);
  WaitForJob(1);
  EXPECT_TRUE(again->GetFeatures());
}

TEST_F(AnalyzerTest, StoppedWhileRunningItsJobEndsAlone) {
  stop_at_ = "get 1";
  AnalysisState state;
  state.Begin(&host_.in, &host_.out, SmallSelector(), SmallTracker(), true, Factory());
  EXPECT_TRUE(bool(state.detailed == true));
  state.analyzer->Start(&host_.in, &host_.out);
  reached_.Wait();
  // A new one ends the old one first.
  state.Begin(&host_.in, &host_.out, SmallSelector(), SmallTracker(), false, Factory());
  state.analyzer->Start(&host_.in, &host_.out);
  EXPECT_EQ(jobs_.size(), 2u);
  release_.Signal();
  tessel::threads::Shutdown();
  EXPECT_TRUE(jobs_[0].expired());
  EXPECT_TRUE(state.TakeResults());
  EXPECT_EQ(state.all_features.frame_count, 3);
  EXPECT_EQ(GetIdentifierForJobInput(state.job_input), state.analyzer->record().job_guid);
  EXPECT_FALSE(state.result_identity.IsNil());
  state.EndAnalyzer(&host_.in, &host_.out);
  EXPECT_TRUE(jobs_[1].expired());
  EXPECT_FALSE(state.TakeResults());
  EXPECT_EQ(state.all_features.frame_count, 3);
}

// What a save and a reload in the same process do: the analyzer goes without a word to its job.
TEST_F(AnalyzerTest, AReloadedAnalyzerFindsItsJobAgain) {
  stop_at_ = "get 1";
  auto analyzer = Started();
  const AnalyzerRecord record = analyzer->record();
  const auto source = analyzer->GetSourceIdentity();
  analyzer.reset();
  reached_.Wait();
  AnalyzerPrem reloaded(record, source, Factory());
  EXPECT_TRUE(reloaded.CanGoOn());
  EXPECT_TRUE(reloaded.IsActive());
  release_.Signal();
  WaitForJob(0);
  EXPECT_TRUE(reloaded.CanGoOn());
  EXPECT_EQ(reloaded.GetFeatures()->frame_count, 3);
  AnalyzerPrem of_other_parameters(record, source, Factory());
  Stop(reloaded);
  EXPECT_FALSE(of_other_parameters.CanGoOn());
  AnalyzerRecord fresh = record;
  fresh.job_stage = JobStage::NotStarted;
  EXPECT_TRUE(AnalyzerPrem(fresh, {}, Factory()).CanGoOn());
}

TEST_F(AnalyzerTest, LogsItsParametersAsNumbers) {
  std::string log;
  tessel::debug::SetSink([&log](const std::string& text) { log += text; });
  tessel::debug::DebugDatabase::Set("ShowExperimentalEffectParameters", 1);
  const auto analyzer = Started();
  tessel::debug::DebugDatabase::Set("ShowExperimentalEffectParameters", 0);
  WaitForJob(0);
  tessel::debug::SetSink({});
  EXPECT_EQ(log.find("selector.max_count: 8.000000\nselector.spacing: 4.000000\n"), 0u);
  EXPECT_NE(log.find("\nselector.presmoothing: 1.000000\n"), std::string::npos);
  EXPECT_NE(log.find("\ntracker.tolerance_affine: 0.050000\n"), std::string::npos);
  EXPECT_EQ(std::count(log.begin(), log.end(), '\n'), 25);
}

}  // namespace
}  // namespace kelp::analysis
