#include "analysis/src/job.h"

#include <boost/make_shared.hpp>
#include <utility>

#include "platform/tessel/config.h"
#include "platform/tessel/utility.h"

namespace kelp::analysis {

using Lock = std::lock_guard<std::recursive_mutex>;

Job::Job(const JobInput& input)
    : id_(tessel::utility::Guid::MakeUnique()),
      input_(input),
      status_{JobState::Ready, input.StartTime, input.FieldType} {}

Job::~Job() = default;

void Job::AddRunFunction(RunFunction function) {
  const Lock lock(run_list_lock_);
  run_list_.push_back(boost::make_shared<RunFunction>(std::move(function)));
}

void Job::AddStatusListener(StatusListener listener) {
  const Lock lock(listener_lock_);
  listeners_.push_back(boost::make_shared<StatusListener>(std::move(listener)));
}

JobStatus Job::GetStatus() const {
  const Lock lock(status_lock_);
  return status_;
}

std::string Job::GetErrorText() const {
  const Lock lock(status_lock_);
  return error_literal_;
}

bool Job::WasCancelled() const {
  const Lock lock(status_lock_);
  return was_cancelled_;
}

std::int64_t Job::end_tick() const {
  const Lock lock(status_lock_);
  return end_tick_;
}

void Job::Enter(JobState state) {
  status_.state = state;
  if (state >= JobState::Cancelled) {
    end_tick_ = static_cast<std::int64_t>(tessel::utility::HighPrecisionTime::Now());
  }
}

template <class Change>
bool Job::ChangeStatus(const Change& change) {
  JobStatus now;
  {
    const Lock lock(status_lock_);
    if (!change()) return false;
    now = status_;
  }
  std::vector<boost::shared_ptr<StatusListener>> listeners;
  {
    const Lock lock(listener_lock_);
    listeners = listeners_;
  }
  for (const auto& listener : listeners) (*listener)(*this, now);
  return true;
}

void Job::Cancel() {
  ChangeStatus([this] {
    if (status_.state > JobState::Running) return false;
    was_cancelled_ = true;
    Enter(JobState::Cancelled);
    return true;
  });
}

void Job::EndBefore(std::int64_t row) {
  std::int64_t present = end_row_;
  while (row < present && !end_row_.compare_exchange_weak(present, row)) {
  }
}

void Job::SetFailed(const char* literal) {
  ChangeStatus([&] {
    if (status_.state >= JobState::Failed) return false;
    error_literal_ = literal;
    Enter(JobState::Failed);
    return true;
  });
}

void Job::Fail(const char* literal) {
  SetFailed(literal);
  tessel::config::ThrowError(literal);
}

void Job::SetTime(const RationalTime& time) {
  ChangeStatus([&] {
    status_.time = time;
    return true;
  });
}

void Job::SetField(std::int32_t field) {
  ChangeStatus([&] {
    status_.field = field;
    return true;
  });
}

bool Job::BeginRunning() {
  return ChangeStatus([this] {
    if (status_.state != JobState::Ready) return false;
    Enter(JobState::Running);
    return true;
  });
}

void Job::Finish() {
  ChangeStatus([this] {
    if (status_.state >= JobState::Failed) return false;
    Enter(JobState::Finished);
    return true;
  });
}

// The list's lock is not held meanwhile: the functions run for minutes.
void Job::CallRunFunctions() {
  std::vector<boost::shared_ptr<RunFunction>> functions;
  {
    const Lock lock(run_list_lock_);
    functions = run_list_;
  }
  for (const auto& function : functions) (*function)(*this);
}

}  // namespace kelp::analysis
