#pragma once

#include "analysis/src/job.h"
#include "platform/tessel/guid.h"
#include "platform/tessel/threads.h"

namespace kelp::analysis {

class Analysis;

// A job on a thread of its own, borrowed for the job's life, that pauses when the host asks for
// rest. A derived class supplies the frames. Its destructor may run on the job's own thread.
class ExecutorJob : public Job {
 public:
  static constexpr char kUnknownError[] =
      "$$$/stabilizer/error/UnknownError=Unknown process exception.";

  // The analysis is the body, kept alive by the job.
  ExecutorJob(const JobInput& input, const boost::shared_ptr<Analysis>& analysis);
  ~ExecutorJob() override;

  void Start(boost::shared_ptr<Job> shared_self) override;

  tessel::threads::SingleThreadedExecutor& executor() const { return *executor_; }

 protected:
  // On the job's thread, in the order given.

  // Before the body, while the job is Ready; what it throws fails the job.
  virtual void ReadProperties() {}
  // The body ended: the host is not asked for frames any more.
  virtual void ReleaseNode() {}
  // No frame is wanted any more: of a finished job and of one that failed in an unforeseen way.
  virtual void CancelRequests() {}
  // The state is final; also for the derived class's own use, from GetFrame.
  virtual void NotifyHost() {}

  // For GetFrame to begin with: blocks while background work is paused.
  void WaitPoint() { executor_->WaitPoint(); }

 private:
  void Run();

  const boost::shared_ptr<Analysis> analysis_;
  const tessel::threads::SingleThreadedExecutorPtr executor_;
  tessel::utility::Guid pause_id_;
  bool ran_ = false;  // touched on the job's thread alone
};

}  // namespace kelp::analysis
