#include "analysis/src/executor_job.h"

#include "analysis/src/analysis.h"
#include "platform/tessel/importer.h"

namespace kelp::analysis {
namespace {

// No exception may leave the job's thread, and none may keep the job from its end.
template <class Step>
void DropExceptions(const Step& step) {
  try {
    step();
  } catch (...) {
  }
}

}  // namespace

ExecutorJob::ExecutorJob(const JobInput& input, const boost::shared_ptr<Analysis>& analysis)
    : Job(input),
      analysis_(analysis),
      executor_(tessel::threads::BorrowTemporarySingleThreadedExecutor()) {
  try {
    for (const RunFunction& function : analysis->run_functions()) AddRunFunction(function);
    // The executor, not the job: a callback may be on its way while the job is destroyed.
    pause_id_ = tessel::importer::RegisterPauseCallback([executor = executor_](bool pause) {
      if (pause) {
        executor->Pause();
      } else {
        executor->Resume();
      }
    });
  } catch (...) {
    tessel::threads::ReturnTemporarySingleThreadedExecutor(executor_);
    throw;
  }
}

ExecutorJob::~ExecutorJob() {
  tessel::importer::UnregisterPauseCallback(pause_id_);
  tessel::threads::ReturnTemporarySingleThreadedExecutor(executor_);
}

void ExecutorJob::Start(boost::shared_ptr<Job> shared_self) {
  const bool posted = executor_->Post([this, shared_self] { Run(); }, 0);
  // The queue has ended: the job was cancelled, or everything is shut down. A job that nobody began
  // must not stay Ready for ever.
  if (!posted && GetStatus().state == JobState::Ready) SetFailed(kUnknownError);
}

void ExecutorJob::Run() {
  if (ran_) return;  // of a job that several analyzers started
  ran_ = true;
  try {
    if (GetStatus().state == JobState::Ready) ReadProperties();
    if (BeginRunning()) CallRunFunctions();
  } catch (...) {
    if (GetStatus().state != JobState::Failed) {
      DropExceptions([this] { CancelRequests(); });
      DropExceptions([this] { SetFailed(kUnknownError); });
      DropExceptions([this] { NotifyHost(); });
    }
  }
  DropExceptions([this] { ReleaseNode(); });
  if (GetStatus().state != JobState::Failed) {
    DropExceptions([this] { CancelRequests(); });
    DropExceptions([this] { Finish(); });
    DropExceptions([this] { NotifyHost(); });
  }
}

}  // namespace kelp::analysis
