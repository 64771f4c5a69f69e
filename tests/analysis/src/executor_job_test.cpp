#include "analysis/src/executor_job.h"

#include <gmock/gmock.h>

#include <cmath>
#include <stdexcept>
#include <thread>

#include "analysis/src/analysis.h"
#include "platform/tessel/config.h"
#include "platform/tessel/importer.h"
#include "tests/analysis/src/fake_job.h"

namespace kelp::analysis {
namespace {

using ::testing::Contains;
using ::testing::ElementsAre;
using Call = std::function<void(FakeJob&, const std::string&)>;

constexpr char kLiteral[] = "$$$/stabilizer/error/Test=Frame lost.";

class ExecutorJobTest : public ::testing::Test {
 protected:
  ~ExecutorJobTest() override {
    job_.reset();
    analysis_.reset();
    tessel::threads::Shutdown();
    EXPECT_EQ(FakeJob::living, 0);
  }

  FakeJob& Make(std::int64_t frames, Call on_call = {}) {
    analysis_ = boost::make_shared<Analysis>(SmallSelector(), SmallTracker());
    job_ = boost::make_shared<FakeJob>(ClipInput(frames), analysis_, on_call);
    return *job_;
  }
  // A whole run, in the background.
  FakeJob& Run(std::int64_t frames, Call on_call = {}) {
    FakeJob& job = Make(frames, on_call);
    job.Start(job_);
    WaitFor(job);
    return job;
  }

  boost::shared_ptr<Analysis> analysis_;
  boost::shared_ptr<FakeJob> job_;
};

TEST_F(ExecutorJobTest, TellsItsListenersEachStepAndEndsFinished) {
  std::vector<std::string> heard;
  FakeJob& job = Make(2);
  EXPECT_EQ(job.end_tick(), -1);
  job.AddStatusListener([&heard](Job& teller, JobStatus status) {
    EXPECT_EQ(teller.GetStatus().state, status.state);
    heard.push_back(std::to_string(static_cast<int>(status.state)) + " " +
                    std::to_string(status.time.numerator) + "/" +
                    std::to_string(status.time.denominator));
  });
  job.Start(job_);
  job.Start(job_);  // by a second owner: runs nothing
  WaitFor(job);
  std::vector<std::string> expected = {"1 0/1"};
  for (int i = 0; i < 6; ++i) expected.push_back("1 0/1");  // time and field by three readers
  for (int i = 0; i < 6; ++i) expected.push_back("1 1/25");
  expected.push_back("4 1/25");
  EXPECT_EQ(heard, expected);
  EXPECT_GT(job.end_tick(), 0);
  const std::vector<std::string> calls = job.calls();
  EXPECT_EQ(std::count(calls.begin(), calls.end(), "properties"), 1);
  EXPECT_EQ(std::count(calls.begin(), calls.end(), "release node"), 1);
  EXPECT_EQ(analysis_->all_features().frame_count, 2);
}

// Cancelled by the host's thread or in the middle of any operation: always finished, never failed,
// no fetch begun any more, and every frame held is let go.
TEST_F(ExecutorJobTest, CancelledAtEveryCall) {
  const std::size_t all = Run(3).calls().size();
  ASSERT_EQ(all, 36u);
  for (std::size_t n = 0; n < all - 2; ++n) {
    std::size_t seen = 0;
    std::string cancelled_at;
    std::ptrdiff_t fetched_after = 0;
    FakeJob& job = Run(3, [&](FakeJob& self, const std::string& call) {
      if (seen++ == n) {
        self.Cancel();
        cancelled_at = call;
      } else if (seen > n + 1 && call.rfind("get", 0) == 0) {
        ++fetched_after;
      }
    });
    EXPECT_EQ(job.GetStatus().state, JobState::Finished) << n;
    EXPECT_TRUE(job.WasCancelled());
    EXPECT_EQ(job.GetErrorText(), "");
    // A fetch begins with letting go of the frame before.
    const bool within_fetch = cancelled_at == "release 0" || cancelled_at == "release 1";
    EXPECT_LE(fetched_after, within_fetch ? 1 : 0) << n;
    const std::vector<std::string> calls = job.calls();
    const auto count = [&](const std::string& what) {
      return std::count_if(calls.begin(), calls.end(),
                           [&](const std::string& c) { return c.rfind(what, 0) == 0; });
    };
    EXPECT_EQ(count("get"), count("release ") - count("release node")) << n;
    EXPECT_EQ(count("release node"), 1);
    EXPECT_EQ(calls.back(), "cancel requests");
  }
}

TEST_F(ExecutorJobTest, FailingAtEveryCallForeseenOrNot) {
  const std::size_t all = Run(3).calls().size();
  for (std::size_t n = 0; n < all - 2; ++n) {
    for (const bool foreseen : {true, false}) {
      std::size_t seen = 0;
      FakeJob& job = Run(3, [&](FakeJob& self, const std::string&) {
        if (seen++ != n) return;
        if (foreseen) self.Fail(kLiteral);
        throw std::bad_alloc();
      });
      EXPECT_EQ(job.GetStatus().state, JobState::Failed) << n;
      EXPECT_EQ(job.GetErrorText(), foreseen ? kLiteral : ExecutorJob::kUnknownError) << n;
      EXPECT_THAT(job.calls(), Contains("release node"));
      job.Cancel();  // changes nothing any more
      EXPECT_EQ(job.GetStatus().state, JobState::Failed);
    }
  }
}

TEST_F(ExecutorJobTest, CancelledBeforeItsThreadTakesItUp) {
  FakeJob& job = Make(5);
  job.executor().Pause();
  job.Start(job_);
  CancelJob(job);  // lifts the pause; what was posted still runs
  WaitFor(job);
  EXPECT_EQ(job.GetStatus().state, JobState::Finished);
  EXPECT_THAT(job.calls(), ElementsAre("release node", "cancel requests"));
  // Its queue has ended: a job that nobody can begin says so.
  FakeJob& late = Make(5);
  late.executor().EndQueue();
  late.Start(job_);
  EXPECT_EQ(late.GetStatus().state, JobState::Failed);
}

TEST_F(ExecutorJobTest, RestsWhileTheHostPauses) {
  tessel::threads::CompletionEvent begun, go_on;
  FakeJob& job = Make(4, [&](FakeJob&, const std::string& call) {
    if (call != "get 1") return;
    begun.Signal();
    go_on.Wait();
  });
  job.Start(job_);
  begun.Wait();
  tessel::importer::PauseBackgroundWork(true);
  go_on.Signal();
  // The next fetch waits; all that can be seen is that the job does not end by itself.
  for (int i = 0; i < 50; ++i) {
    ASSERT_EQ(job.GetStatus().state, JobState::Running);
    std::this_thread::sleep_for(std::chrono::milliseconds(1));
  }
  const std::vector<std::string> calls = job.calls();
  EXPECT_EQ(std::count(calls.begin(), calls.end(), "get 1"), 1);
  tessel::importer::PauseBackgroundWork(false);
  WaitFor(job);
  EXPECT_EQ(job.GetStatus().state, JobState::Finished);
}

TEST_F(ExecutorJobTest, DropsItsOwnersOnItsOwnThread) {
  FakeJob& job = Make(3);
  job.Start(job_);
  job_.reset();
  analysis_.reset();
  tessel::threads::Shutdown();  // waits for the run
  EXPECT_EQ(FakeJob::living, 0);
}

}  // namespace
}  // namespace kelp::analysis
