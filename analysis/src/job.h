#pragma once

#include <atomic>
#include <boost/function.hpp>
#include <boost/shared_ptr.hpp>
#include <cstdint>
#include <exception>
#include <limits>
#include <mutex>
#include <string>
#include <vector>

#include "analysis/src/job_input.h"

namespace kelp::analysis {

// Ends a run whose job is no longer wanted; thrown by a frame fetch, swallowed by the run.
class TerminateException : public std::exception {};

// Ends a run whose job was told to end before the row that is fetched.
class EndOfRun : public std::exception {};

// From Ready to Running on the job's thread as its body begins; to Cancelled from either, by
// whoever cancels; to Failed from any of these, where something fails; to Finished on the job's
// thread, once the body has ended normally or after a cancel. Failed and Finished never change.
enum class JobState : std::int32_t { Ready, Running, Cancelled, Failed, Finished };

struct JobStatus {
  JobState state = JobState::Ready;
  RationalTime time;       // media time of the last frame finished
  std::int32_t field = 0;  // field of that frame
};

// A unit of background work over the frames of a clip. Any thread may ask and cancel; the frame
// operations are for the run functions, which run on the job's thread. The order of the virtual
// operations is part of the interface.
class Job {
 public:
  using RunFunction = boost::function<void(Job&)>;
  using StatusListener = boost::function<void(Job&, JobStatus)>;

  explicit Job(const JobInput& input);
  virtual ~Job();
  Job(const Job&) = delete;
  Job& operator=(const Job&) = delete;

  // Runs the job in the background, once: a later call runs nothing.
  virtual void Start(boost::shared_ptr<Job> shared_self) = 0;

  // Makes sure that a frame is at hand or on its way; true if it is. Every request and every
  // GetFrame may be answered by one ReleaseFrame.
  virtual bool RequestFrame(const RationalTime& time, std::int32_t field) = 0;
  // Blocks until the frame is there. `pixels` is the first row in memory, `flipped` tells that this
  // is the bottom one; valid until ReleaseFrame.
  virtual void GetFrame(const RationalTime& time, std::int32_t field, std::int32_t* row_bytes,
                        bool* flipped, std::uint32_t* pixel_format,
                        const std::uint8_t** pixels) = 0;
  virtual void ReleaseFrame(const RationalTime& time, std::int32_t field) = 0;
  virtual void GetFrameSize(std::int32_t* width, std::int32_t* height) = 0;

  const tessel::utility::Guid& id() const { return id_; }
  const JobInput& input() const { return input_; }

  void AddRunFunction(RunFunction function);
  void AddStatusListener(StatusListener listener);

  JobStatus GetStatus() const;
  // The localisation literal of the failure, or empty.
  std::string GetErrorText() const;
  // True for good once Cancel took effect: such a job has no results, even when Finished.
  bool WasCancelled() const;
  // HighPrecisionTime when the state last became Cancelled or higher; -1 before.
  std::int64_t end_tick() const;

  // The body stops at its next fetch. Without effect once the job has failed or finished.
  void Cancel();
  // The body ends before this row of its run, as if there were no more; rows that it has done
  // already are dropped. A later call can only lower it.
  void EndBefore(std::int64_t row);
  // That row; the greatest number where none was told.
  std::int64_t end_row() const { return end_row_; }
  // The job fails with this localisation literal, the first one if there are several; throws.
  [[noreturn]] void Fail(const char* literal);

  // For the run.
  void SetTime(const RationalTime& time);
  void SetField(std::int32_t field);

 protected:
  bool BeginRunning();  // false unless the job was Ready
  void SetFailed(const char* literal);
  void Finish();
  void CallRunFunctions();

 private:
  // Changes the status, if `change` says that it may, and tells the listeners, without a lock.
  template <class Change>
  bool ChangeStatus(const Change& change);
  void Enter(JobState state);

  const tessel::utility::Guid id_;
  const JobInput input_;
  std::atomic<std::int64_t> end_row_ = std::numeric_limits<std::int64_t>::max();
  mutable std::recursive_mutex status_lock_;
  JobStatus status_;                // guarded by status_lock_
  const char* error_literal_ = "";  // guarded by status_lock_; needs no memory
  bool was_cancelled_ = false;      // guarded by status_lock_
  std::int64_t end_tick_ = -1;      // guarded by status_lock_
  std::recursive_mutex run_list_lock_;
  std::vector<boost::shared_ptr<RunFunction>> run_list_;  // guarded by run_list_lock_
  std::recursive_mutex listener_lock_;
  std::vector<boost::shared_ptr<StatusListener>> listeners_;  // guarded by listener_lock_
};

}  // namespace kelp::analysis
