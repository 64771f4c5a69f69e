#pragma once

#include <condition_variable>
#include <deque>
#include <functional>
#include <future>
#include <mutex>
#include <thread>

#include "library/refusal.h"

namespace calmframe::library {

// The thread that owns a session's effect, which belongs to one thread: tasks run on it in their
// order.
class Worker {
 public:
  Worker() : thread_([this] { Run(); }) {}
  ~Worker() { End({}); }
  Worker(const Worker&) = delete;
  Worker& operator=(const Worker&) = delete;

  // The task throws nothing. False once ended.
  bool Post(std::function<void()> task) {
    {
      const std::lock_guard lock(mutex_);
      if (ended_) return false;
      tasks_.push_back(std::move(task));
    }
    changed_.notify_one();
    return true;
  }

  // Runs act() there and gives back what it does; throws what it throws, and Refusal once ended.
  template <class Act>
  auto Do(const Act& act) {
    std::packaged_task<decltype(act())()> task(act);
    auto result = task.get_future();
    if (!Post([&task] { task(); })) throw Refusal(CALMFRAME_ERROR_CANCELLED, "was closed");
    return result.get();
  }

  // Runs what was posted, then `last`, which may be null, and joins. The first call counts. Takes
  // no memory.
  void End(std::function<void()> last) {
    {
      const std::lock_guard lock(mutex_);
      if (ended_) return;
      ended_ = true;
      last_ = std::move(last);
    }
    changed_.notify_one();
    thread_.join();
  }

 private:
  void Run() {
    std::unique_lock lock(mutex_);
    while (true) {
      changed_.wait(lock, [this] { return ended_ || !tasks_.empty(); });
      if (tasks_.empty()) break;
      const std::function<void()> task = std::move(tasks_.front());
      tasks_.pop_front();
      lock.unlock();
      task();
      lock.lock();
    }
    lock.unlock();
    if (last_) last_();
  }

  std::mutex mutex_;
  std::condition_variable changed_;
  std::deque<std::function<void()>> tasks_;  // guarded by mutex_
  bool ended_ = false;                       // guarded by mutex_
  std::function<void()> last_;               // set before the end
  std::thread thread_;
};

}  // namespace calmframe::library
