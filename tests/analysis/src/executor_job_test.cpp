#include "analysis/src/executor_job.h"

#include <gmock/gmock.h>

#include <new>

#include "analysis/src/job_registry.h"
#include "platform/tessel/config.h"
#include "tests/analysis/src/fake_job.h"

namespace kelp::analysis {
namespace {

using ::testing::ElementsAre;

constexpr char kLiteral[] = "$$$/stabilizer/error/Test=Frame lost.";

class ExecutorJobTest : public FakeJobTest {
 protected:
  // A run of three frames with an interruption at its n-th call.
  FakeJob& RunWithAt(std::size_t n, const FakeJob::OnCall& interrupt) {
    return Run(Make(ClipInput(3), [&, seen = std::size_t{0}](auto& self, auto& call) mutable {
      if (seen++ == n) interrupt(self, call);
    }));
  }
  static constexpr std::size_t kCalls = 38;  // of a whole run
};

std::ptrdiff_t Count(const std::vector<std::string>& calls, const std::string& begin) {
  return std::count_if(calls.begin(), calls.end(),
                       [&](const std::string& call) { return call.rfind(begin, 0) == 0; });
}

TEST_F(ExecutorJobTest, TellsItsListenersEachStepAndEndsFinished) {
  std::vector<std::string> heard;
  FakeJob& job = Make(ClipInput(2));
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
  std::vector<std::string> expected(7, "1 0/1");  // begun; time and field by three readers
  expected.resize(13, "1 1/25");
  expected.push_back("4 1/25");
  EXPECT_EQ(heard, expected);
  EXPECT_GT(job.end_tick(), 0);
  EXPECT_EQ(Count(job.calls(), "properties"), 1);
  EXPECT_EQ(Count(job.calls(), "node"), 1);
}

// By the host's thread or in the middle of any operation: always finished, never failed, no fetch
// begun any more, every frame held let go, and the host told.
TEST_F(ExecutorJobTest, CancelledAtEveryCall) {
  ASSERT_EQ(Run(Make(ClipInput(3))).calls().size(), kCalls);
  for (std::size_t n = 0; n < kCalls - 1; ++n) {
    std::string cancelled_at;
    FakeJob& job = RunWithAt(n, [&](FakeJob& self, const std::string& call) {
      self.Cancel();
      cancelled_at = call;
    });
    EXPECT_EQ(job.GetStatus().state, JobState::Finished) << n;
    EXPECT_TRUE(job.WasCancelled());
    EXPECT_EQ(job.GetErrorText(), "");
    const std::vector<std::string> calls = job.calls();
    const std::vector<std::string> later(calls.begin() + n + 1, calls.end());
    // A fetch begins with letting go of the frame before.
    EXPECT_LE(Count(later, "get"), Count({cancelled_at}, "release")) << n;
    EXPECT_EQ(Count(calls, "get"), Count(calls, "release")) << n;
    EXPECT_EQ(Count(calls, "node"), 1);
    EXPECT_EQ(calls[calls.size() - 2], "cancel requests");
    EXPECT_EQ(calls.back(), "notify");
  }
}

TEST_F(ExecutorJobTest, FailingAtEveryCallForeseenOrNot) {
  for (std::size_t n = 1; n < kCalls; ++n) {  // behind the start
    const bool at_end = n >= kCalls - 3;      // of a run that was whole
    FakeJob& foreseen = RunWithAt(n, [](FakeJob& self, auto&) { self.Fail(kLiteral); });
    if (n < kCalls - 1) {
      EXPECT_EQ(foreseen.GetStatus().state, JobState::Failed) << n;
      EXPECT_EQ(foreseen.GetErrorText(), kLiteral) << n;
    }
    EXPECT_EQ(Count(foreseen.calls(), "node"), 1);
    FakeJob& unforeseen = RunWithAt(n, [](auto&, auto&) { throw std::bad_alloc(); });
    EXPECT_EQ(unforeseen.GetStatus().state, at_end ? JobState::Finished : JobState::Failed) << n;
    EXPECT_EQ(unforeseen.GetErrorText(), at_end ? "" : ExecutorJob::kUnknownError) << n;
    const std::vector<std::string> calls = unforeseen.calls();
    EXPECT_EQ(Count(calls, "cancel requests"), 1) << n;
    EXPECT_EQ(Count(calls, "notify"), 1) << n;
    EXPECT_EQ(Count(calls, "node"), 1) << n;
    unforeseen.Cancel();  // changes nothing any more
    EXPECT_FALSE(unforeseen.WasCancelled());
  }
}

TEST_F(ExecutorJobTest, KeepsTheTextOfItsFirstFailure) {
  FakeJob& job = RunWithAt(10, [](FakeJob& self, auto&) {
    EXPECT_THROW(self.Fail(kLiteral), tessel::config::Error);
    self.Fail("$$$/stabilizer/error/Second=And another.");
  });
  EXPECT_EQ(job.GetErrorText(), kLiteral);
}

TEST_F(ExecutorJobTest, CancelledBeforeItsThreadTakesItUp) {
  FakeJob& job = Make(ClipInput(5));
  job.executor().Pause();
  job.Start(job_);
  CancelJob(job);  // lifts the pause; what was posted still runs
  WaitFor(job);
  EXPECT_EQ(job.GetStatus().state, JobState::Finished);
  EXPECT_THAT(job.calls(), ElementsAre("start", "node", "cancel requests", "notify"));
  // Its queue has ended: a job that nobody can begin says so.
  FakeJob& late = Make(ClipInput(5));
  late.executor().EndQueue();
  late.Start(job_);
  EXPECT_EQ(late.GetStatus().state, JobState::Failed);
}

}  // namespace
}  // namespace kelp::analysis
