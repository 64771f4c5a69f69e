#include "host/batch/local_batch.h"

#include <algorithm>
#include <atomic>
#include <chrono>
#include <condition_variable>
#include <deque>
#include <exception>
#include <mutex>
#include <numeric>
#include <thread>
#include <utility>

namespace calmframe::batch {
namespace {

using Clock = std::chrono::steady_clock;

class LocalBatch {
 public:
  LocalBatch(const Plan& plan, const LocalSettings& settings, BatchWatcher& watcher)
      : plan_(plan), settings_(settings), watcher_(watcher), shares_(plan.tasks.size()) {
    std::vector<std::size_t> order(plan.tasks.size());
    std::iota(order.begin(), order.end(), 0);
    std::stable_sort(order.begin(), order.end(), [&](std::size_t a, std::size_t b) {
      return plan.tasks[a].cost > plan.tasks[b].cost;
    });
    for (const std::size_t task : order) waiting_.push_back({task, {}});
  }

  void Run() {
    const auto count =
        std::min<std::size_t>(static_cast<std::size_t>(settings_.jobs), plan_.tasks.size());
    std::vector<std::jthread> workers;  // a worker's end ends its program
    for (std::size_t w = 0; w < count; ++w) workers.emplace_back([this] { WorkOrFail(); });
    try {
      while (Tell()) {
      }
    } catch (...) {
      Stop();
      throw;
    }
    workers.clear();
    if (failure_) std::rethrow_exception(failure_);
  }

 private:
  // Tells what there is to tell. False once all has ended.
  bool Tell() {
    std::unique_lock lock(mutex_);
    changed_.wait_for(lock, std::chrono::milliseconds(100), [this] { return !ended_.empty(); });
    const bool over = (waiting_.empty() && working_ == 0) || failure_;
    std::deque<std::pair<std::size_t, TaskResult>> ended;
    ended.swap(ended_);
    const std::vector<double> shares(shares_.begin(), shares_.end());
    const std::size_t working = working_;
    lock.unlock();
    for (const auto& [task, result] : ended) watcher_.Ended(task, result);
    watcher_.Show(shares, working);
    if (!stops_ && watcher_.Stops()) Stop();
    return !over;
  }

  void Stop() {
    stops_ = true;
    const std::lock_guard lock(mutex_);
    waiting_.clear();
    changed_.notify_all();
  }

  struct Waiting {
    std::size_t task;
    Clock::time_point due;
  };

  class Watcher final : public TaskWatcher {
   public:
    Watcher(LocalBatch& batch, std::size_t task) : batch_(batch), task_(task) {}
    void Show(double share, const std::string&) override { batch_.shares_[task_] = share; }
    bool Stops() override { return batch_.stops_; }

   private:
    LocalBatch& batch_;
    const std::size_t task_;
  };

  // The first one that is due and that there is room for; else the end of those that wait.
  std::deque<Waiting>::iterator Fitting() {
    return std::find_if(waiting_.begin(), waiting_.end(), [this](const Waiting& one) {
      const bool has_room = settings_.memory <= 0 || working_ == 0 ||
                            memory_ + plan_.tasks[one.task].memory <= settings_.memory;
      return has_room && one.due <= Clock::now();
    });
  }

  // What ends a worker ends all: no memory, mostly, for what a task came to.
  void WorkOrFail() {
    try {
      Work();
    } catch (...) {
      stops_ = true;
      const std::lock_guard lock(mutex_);
      if (!failure_) failure_ = std::current_exception();
      waiting_.clear();
      changed_.notify_all();
    }
  }

  void Work() {
    std::unique_lock lock(mutex_);
    while ((!waiting_.empty() || working_ > 0) && !failure_) {
      const auto next = Fitting();
      if (next == waiting_.end()) {
        changed_.wait_for(lock, std::chrono::milliseconds(200));
        continue;
      }
      const std::size_t n = next->task;
      waiting_.erase(next);
      const std::size_t left = waiting_.size() + ++working_;
      memory_ += plan_.tasks[n].memory;
      const int at_a_time =
          static_cast<int>(std::min<std::size_t>(static_cast<std::size_t>(settings_.jobs), left));
      lock.unlock();
      Watcher watcher(*this, n);
      TaskResult result =
          RunTask(plan_, plan_.tasks[n], std::max(settings_.processors / at_a_time, 1), watcher);
      lock.lock();
      --working_;
      memory_ -= plan_.tasks[n].memory;
      if (result.state == TaskResult::State::busy) {
        if (!stops_) waiting_.push_back({n, Clock::now() + std::chrono::seconds(1)});
      } else if (result.state != TaskResult::State::stopped) {
        shares_[n] = 1;
        ended_.emplace_back(n, std::move(result));
      }
      changed_.notify_all();
    }
  }

  const Plan& plan_;
  const LocalSettings settings_;
  BatchWatcher& watcher_;
  std::vector<std::atomic<double>> shares_;
  std::atomic<bool> stops_ = false;
  std::mutex mutex_;
  std::condition_variable changed_;
  // Guarded by mutex_.
  std::deque<Waiting> waiting_;
  std::size_t working_ = 0;
  std::int64_t memory_ = 0;  // that those who work are expected to take
  std::deque<std::pair<std::size_t, TaskResult>> ended_;
  std::exception_ptr failure_;  // of the first worker that one ended
};

}  // namespace

LocalSettings SettingsFor(int processors, std::int64_t memory, int jobs) {
  if (jobs > 0) return {jobs, processors, 0};
  constexpr double kMost = 0.8;  // of what is to be had now, which others want too
  return {processors, processors, static_cast<std::int64_t>(kMost * static_cast<double>(memory))};
}

void RunLocally(const Plan& plan, const LocalSettings& settings, BatchWatcher& watcher) {
  if (plan.tasks.empty()) return;
  LocalBatch(plan, settings, watcher).Run();
}

}  // namespace calmframe::batch
