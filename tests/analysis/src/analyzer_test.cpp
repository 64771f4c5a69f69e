#include "analysis/src/analyzer.h"

#include <gmock/gmock.h>

#include <boost/make_shared.hpp>
#include <new>
#include <utility>

#include "analysis/src/analysis_state.h"
#include "analysis/src/identities.h"
#include "platform/tessel/debug.h"
#include "tests/analysis/src/fake_job.h"
#include "tests/support/host_records.h"

namespace kelp::analysis {
namespace {

using tessel::threads::CompletionEvent;

class AnalyzerTest : public calmframe::host::HostRecords {
 protected:
  AnalyzerTest() { hosted_.Place(0, 3); }
  ~AnalyzerTest() override {
    release_.Signal();
    JobRegistry::Instance().CancelAll(in_.global_data);
    tessel::threads::Shutdown();
    EXPECT_EQ(FakeJob::living, 0);
  }

  JobFactory Factory() {
    return [this](HX_InData*, HX_OutData*, const JobInput& input, const auto& analysis) {
      const auto on_call = [this](FakeJob& job, const std::string& call) {
        if (call != stop_at_) return;
        if (fail_) fail_(job);
        reached_.Signal();
        release_.Wait();
      };
      const auto job = boost::make_shared<FakeJob>(input, analysis, on_call);
      jobs_.push_back(job);
      return job;
    };
  }
  boost::shared_ptr<AnalyzerPrem> Make(std::uint64_t slots = 8) {
    return boost::make_shared<AnalyzerPrem>(&in_, &out_, SmallSelector(slots), SmallTracker(),
                                            Factory());
  }
  boost::shared_ptr<AnalyzerPrem> Started(std::uint64_t slots = 8) {
    const auto analyzer = Make(slots);
    analyzer->Start(&in_, &out_);
    return analyzer;
  }
  void Stop(Analyzer& analyzer) { analyzer.Stop(&in_, &out_); }
  // The job of this number, counted in the order of making, with its run at an end.
  void WaitForJob(std::size_t number) {
    if (const auto job = jobs_.at(number).lock()) WaitFor(*job);
  }

  std::vector<boost::weak_ptr<FakeJob>> jobs_;
  std::string stop_at_;                 // the call at which jobs wait
  std::function<void(FakeJob&)> fail_;  // or do this instead
  CompletionEvent reached_, release_;
};

TEST_F(AnalyzerTest, RunsToItsResultsAndLeavesNothing) {
  hosted_.Place(7, 3);
  const auto analyzer = Make();
  EXPECT_FALSE(analyzer->IsActive());
  EXPECT_EQ(analyzer->FirstFrame(), 7);
  EXPECT_EQ(analyzer->EndFrame(), 10);
  stop_at_ = "get 1";
  analyzer->Start(&in_, &out_);
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
  hosted_.Place(0, 4);
  const auto longer = Started();
  hosted_.Place(0, 3);
  layer().InsertEffect(0, {calmframe::host::NewRuntimeId(), "blur", "", {}});
  const auto elsewhere = Started();
  EXPECT_EQ(jobs_.size(), 3u);
  release_.Signal();
  for (std::size_t i = 0; i < 3; ++i) WaitForJob(i);
  EXPECT_EQ(first->GetFeatures()->features, second->GetFeatures()->features);
  EXPECT_NE(first->GetFeatures()->features, elsewhere->GetFeatures()->features);
  EXPECT_EQ(longer->GetFeatures()->frame_count, 4);

  // One that cancels takes the job from the other as well.
  first->Cancel(&in_, &out_, "");
  Stop(*first);
  EXPECT_EQ(second->GetStatus().state, JobState::Failed);
  EXPECT_TRUE(second->ReportFailure(&in_, &out_));
  EXPECT_EQ(TakeMessage(), "");
  EXPECT_TRUE(longer->GetFeatures());
}

TEST_F(AnalyzerTest, AnotherHostsEffectsHaveTheirOwn) {
  stop_at_ = "get 0";
  const auto first = Started();
  const HX_Handle own = std::exchange(in_.global_data, reinterpret_cast<HX_Handle>(this));
  const auto other = Started();
  EXPECT_EQ(jobs_.size(), 2u);
  reached_.Wait();
  JobRegistry::Instance().CancelAll(in_.global_data);
  in_.global_data = own;
  release_.Signal();
  for (std::size_t i = 0; i < 2; ++i) WaitForJob(i);
  EXPECT_TRUE(first->GetFeatures());
  EXPECT_FALSE(other->GetFeatures());
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
}

TEST_F(AnalyzerTest, CancelledJobsHaveNoResultsAndAreNeverJoined) {
  stop_at_ = "get 1";
  const auto first = Started();
  reached_.Wait();
  first->Cancel(&in_, &out_, "text");
  EXPECT_FALSE(first->IsActive());
  const auto second = Started();
  EXPECT_EQ(jobs_.size(), 2u);
  second->Cancel(&in_, &out_, "text");
  release_.Signal();
  tessel::threads::Shutdown();  // both are finished
  EXPECT_EQ(second->GetFeatures(), nullptr);
  const auto third = Started();
  EXPECT_EQ(jobs_.size(), 3u);
  WaitForJob(2);
  Stop(*first);
  Stop(*second);
  EXPECT_TRUE(third->GetFeatures());
}

TEST_F(AnalyzerTest, AFailureIsToldOnceAndRetried) {
  stop_at_ = "get 2";
  fail_ = [](FakeJob& job) { job.Fail("$$$/stabilizer/error/Test=Frame lost."); };
  const auto analyzer = Started();
  WaitForJob(0);
  EXPECT_EQ(analyzer->GetStatus().state, JobState::Failed);
  EXPECT_TRUE(analyzer->ReportFailure(&in_, &out_));
  EXPECT_EQ(TakeMessage(), "Frame lost.");
  EXPECT_EQ(analyzer->GetFeatures(), nullptr);
  analyzer->set_job_stage(JobStage::SeenEnded);
  Stop(*analyzer);  // the entry lingers
  fail_ = {};
  release_.Signal();
  const auto again = Started();
  ASSERT_EQ(jobs_.size(), 2u);
  WaitForJob(1);
  EXPECT_TRUE(again->GetFeatures());
}

TEST_F(AnalyzerTest, AJobThatCannotStartIsNeverJoined) {
  stop_at_ = "start";
  fail_ = [](FakeJob&) { throw std::bad_alloc(); };
  EXPECT_THROW(Started(), std::bad_alloc);
  EXPECT_TRUE(jobs_[0].expired());
}

TEST_F(AnalyzerTest, ANewAnalysisOfTheStateEndsTheOldOne) {
  stop_at_ = "get 1";
  AnalysisState state;
  const auto begin = [&](bool detailed) {
    state.Begin(&in_, &out_, SmallSelector(), SmallTracker(), detailed, Factory());
    EXPECT_EQ(bool{state.detailed}, detailed);
    state.analyzer->Start(&in_, &out_);
  };
  begin(true);
  reached_.Wait();
  state.error_text = "of the old one";
  state.progress.remaining_seconds = 7;
  begin(false);
  ASSERT_EQ(jobs_.size(), 2u);
  EXPECT_TRUE(jobs_[0].lock()->WasCancelled());
  EXPECT_EQ(state.error_text, "");
  EXPECT_EQ(state.progress.remaining_seconds, 0);
  release_.Signal();
  tessel::threads::Shutdown();
  EXPECT_TRUE(jobs_[0].expired());
  EXPECT_TRUE(state.TakeResults());
  EXPECT_EQ(state.result->tracker_identity,
            GetIdentifierForTracker(SmallSelector(), SmallTracker()));
  EXPECT_FALSE(state.result_identity.IsNil());
  state.EndAnalyzer(&in_, &out_);
  EXPECT_TRUE(jobs_[1].expired());
  EXPECT_FALSE(state.TakeResults());
  EXPECT_EQ(state.table().frame_count, 3);
}

// What a save and a reload in the same process do: the analyzer goes without a word to its job.
TEST_F(AnalyzerTest, AReloadedAnalyzerFindsItsJobAgain) {
  stop_at_ = "get 1";
  auto analyzer = Started();
  const AnalyzerRecord record = analyzer->record();
  const auto source = analyzer->GetSourceIdentity();
  analyzer.reset();
  reached_.Wait();
  AnalyzerPrem reloaded(record, source, in_.global_data, Factory());
  EXPECT_TRUE(reloaded.CanGoOn());
  EXPECT_TRUE(reloaded.IsActive());
  AnalyzerRecord changed = record;
  changed.job_stage = JobStage::NotStarted;
  EXPECT_FALSE(AnalyzerPrem(changed, source, in_.global_data, Factory()).IsActive());
  changed = record;
  changed.tracker_guid = {};
  EXPECT_FALSE(AnalyzerPrem(changed, source, in_.global_data, Factory()).CanGoOn());
  release_.Signal();
  WaitForJob(0);
  EXPECT_TRUE(reloaded.CanGoOn());
  EXPECT_EQ(reloaded.GetFeatures()->frame_count, 3);
  Stop(reloaded);
  EXPECT_FALSE(AnalyzerPrem(record, source, in_.global_data, Factory()).CanGoOn());
  changed.job_stage = JobStage::NotStarted;
  EXPECT_TRUE(AnalyzerPrem(changed, {}, in_.global_data, Factory()).CanGoOn());
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
  EXPECT_NE(log.find("\ntracker.tolerance_affine: 0.050000\n"), std::string::npos);
  EXPECT_EQ(std::count(log.begin(), log.end(), '\n'), 25);
}

}  // namespace
}  // namespace kelp::analysis
