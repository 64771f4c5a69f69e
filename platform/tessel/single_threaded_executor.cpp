#include <boost/make_shared.hpp>
#include <chrono>
#include <condition_variable>
#include <map>
#include <mutex>
#include <set>
#include <thread>
#include <utility>
#include <vector>

#include "platform/tessel/threads.h"
#include "platform/tessel/threads_internal.h"
#include "platform/tessel/undying.h"

namespace tessel::threads {
namespace {

using Clock = std::chrono::steady_clock;

class Queue final : public SingleThreadedExecutor {
 public:
  bool Post(boost::function<void()> task, std::uint32_t delay_ms) override {
    std::lock_guard<std::mutex> lock(mutex_);
    if (ended_ || returned_) return false;
    tasks_.emplace(Clock::now() + std::chrono::milliseconds(delay_ms), std::move(task));
    changed_.notify_all();
    return true;
  }

  void Pause() override {
    std::lock_guard<std::mutex> lock(mutex_);
    paused_ = !ended_ && !returned_;
  }

  void Resume() override {
    std::lock_guard<std::mutex> lock(mutex_);
    paused_ = false;
    changed_.notify_all();
  }

  void WaitPoint() override {
    std::unique_lock<std::mutex> lock(mutex_);
    changed_.wait(lock, [this] { return !paused_; });
  }

  bool IsOwnThread() const override {
    std::lock_guard<std::mutex> lock(mutex_);
    return own_thread_ == std::this_thread::get_id();
  }

  void EndQueue() override { Close(&ended_); }
  void Return() { Close(&returned_); }

  // On the thread that serves this queue: runs its tasks until there will be no more.
  void Run() {
    std::unique_lock<std::mutex> lock(mutex_);
    own_thread_ = std::this_thread::get_id();
    while (!tasks_.empty() || !(ended_ || returned_)) {
      if (paused_ || tasks_.empty()) {
        changed_.wait(lock);
      } else if (const Clock::time_point due = tasks_.begin()->first;
                 !ended_ && due > Clock::now()) {
        changed_.wait_until(lock, due);
      } else {
        RunFirst(lock);
      }
    }
    own_thread_ = std::thread::id();
  }

 private:
  void Close(bool* how) {
    std::lock_guard<std::mutex> lock(mutex_);
    *how = true;
    paused_ = false;
    changed_.notify_all();
  }

  // A task's end may destroy the owner of this executor, so it too happens without the lock.
  void RunFirst(std::unique_lock<std::mutex>& lock) {
    boost::function<void()> task = std::move(tasks_.begin()->second);
    tasks_.erase(tasks_.begin());
    lock.unlock();
    task();
    task.clear();
    lock.lock();
  }

  mutable std::mutex mutex_;
  std::condition_variable changed_;
  // All below guarded by mutex_. Equal times keep the order of insertion.
  std::multimap<Clock::time_point, boost::function<void()>> tasks_;
  bool paused_ = false, ended_ = false, returned_ = false;
  std::thread::id own_thread_;
};

// Threads wait here for queues to serve.
class Pool {
 public:
  SingleThreadedExecutorPtr Borrow() {
    const auto queue = boost::make_shared<Queue>();
    std::lock_guard<std::mutex> lock(mutex_);
    if (ending_) queue->EndQueue();
    live_.insert(queue);
    try {
      if (idle_ > static_cast<int>(waiting_.size())) {
        waiting_.push_back(queue);
        work_.notify_one();
      } else {
        internal::StartThread([this, queue = queue]() mutable { Serve(std::move(queue)); });
      }
    } catch (...) {
      live_.erase(queue);
      throw;
    }
    return queue;
  }

  // Until FinishEnding, queues are borrowed ended and no thread stays idle.
  void BeginEnding() {
    std::lock_guard<std::mutex> lock(mutex_);
    ending_ = true;
    work_.notify_all();
    for (const auto& queue : live_) queue->EndQueue();
  }

  void FinishEnding() {
    std::lock_guard<std::mutex> lock(mutex_);
    ending_ = false;
  }

 private:
  static constexpr int kMaxIdle = 4;

  void Serve(boost::shared_ptr<Queue> queue) {
    while (queue) {
      queue->Run();
      std::unique_lock<std::mutex> lock(mutex_);
      live_.erase(queue);
      queue.reset();
      if (idle_ >= kMaxIdle || ending_) return;
      ++idle_;
      work_.wait(lock, [&] { return !waiting_.empty() || ending_; });
      --idle_;
      if (waiting_.empty()) return;
      queue = std::move(waiting_.back());
      waiting_.pop_back();
    }
  }

  std::mutex mutex_;
  std::condition_variable work_;
  // All below guarded by mutex_.
  std::set<boost::shared_ptr<Queue>> live_;        // not yet run out
  std::vector<boost::shared_ptr<Queue>> waiting_;  // each has an idle thread that was woken for it
  int idle_ = 0;
  bool ending_ = false;
};

Pool& pool() {
  static utility::Undying<Pool> pool;  // outlives its threads
  return *pool;
}

}  // namespace

SingleThreadedExecutorPtr BorrowTemporarySingleThreadedExecutor() {
  return pool().Borrow();
}

void ReturnTemporarySingleThreadedExecutor(const SingleThreadedExecutorPtr& executor) {
  if (executor) static_cast<Queue&>(*executor).Return();
}

void internal::BeginEndingPooledThreads() {
  pool().BeginEnding();
}
void internal::FinishEndingPooledThreads() {
  pool().FinishEnding();
}

}  // namespace tessel::threads
