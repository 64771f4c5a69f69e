#include "platform/tessel/threads.h"

#include <tbb/blocked_range.h>
#include <tbb/global_control.h>
#include <tbb/parallel_for.h>

#include <atomic>
#include <thread>

#include "platform/tessel/shutdown.h"
#include "platform/tessel/threads_internal.h"

namespace tessel::threads {

void ExecuteCPUBoundTaskOnAllProcessors(const boost::function<void(std::size_t)>& task,
                                        std::size_t count) {
  // The pool orders the tasks between the caller's code before and after them, but inside a library
  // that the thread sanitizer cannot see; these two say the same where it can.
  std::atomic<bool> begun = false;
  std::atomic<std::size_t> ended = 0;
  struct End {
    ~End() { ended.fetch_add(1, std::memory_order_release); }
    std::atomic<std::size_t>& ended;
  };
  struct Join {
    ~Join() { (void)ended.load(std::memory_order_acquire); }
    std::atomic<std::size_t>& ended;
  };
  begun.store(true, std::memory_order_release);
  const Join join{ended};
  tbb::parallel_for(
      tbb::blocked_range<std::size_t>(0, count, 1),
      [&](const tbb::blocked_range<std::size_t>& range) {
        (void)begun.load(std::memory_order_acquire);
        const End end{ended};
        for (std::size_t i = range.begin(); i != range.end(); ++i) task(i);
      },
      tbb::simple_partitioner());
}

struct ProcessorLimit::State {
  explicit State(int processors)
      : control(tbb::global_control::max_allowed_parallelism,
                static_cast<std::size_t>(processors)) {}
  tbb::global_control control;
};

ProcessorLimit::ProcessorLimit(int processors) {
  if (processors > 0) state_ = std::make_unique<State>(processors);
}

ProcessorLimit::~ProcessorLimit() = default;

namespace {

// Threads that may run tasks, for Shutdown to wait for.
class LiveThreads {
 public:
  void Begin() {
    std::lock_guard<std::mutex> lock(mutex_);
    ++count_;
  }
  void End() {
    std::lock_guard<std::mutex> lock(mutex_);
    if (--count_ == 0) none_left_.notify_all();
  }
  void WaitForNone() {
    std::unique_lock<std::mutex> lock(mutex_);
    none_left_.wait(lock, [this] { return count_ == 0; });
  }

 private:
  std::mutex mutex_;
  std::condition_variable none_left_;
  int count_ = 0;  // guarded by mutex_
};

LiveThreads& live_threads() {
  static LiveThreads& threads = *new LiveThreads;  // outlives detached threads
  return threads;
}

// A thread a task. A solve runs for minutes and may wait for a frame or a lock of its host: on the
// pool of the parallel loops it would hold a worker that renders need, and two solves on a
// one-processor machine would queue.
class ThreadPerTask final : public Executor {
 public:
  void Post(boost::function<void()> task) override {
    live_threads().Begin();
    try {
      std::thread([task = std::move(task)]() mutable {
        task();
        task.clear();  // what it holds must be gone before Shutdown returns
        live_threads().End();
      }).detach();
    } catch (...) {
      live_threads().End();
      throw;
    }
  }
};

}  // namespace

Executor& GetCPUBoundExecutor() {
  static ThreadPerTask& executor = *new ThreadPerTask;  // outlives detached threads
  return executor;
}

void Shutdown() {
  static std::mutex& one_at_a_time = *new std::mutex;
  std::lock_guard<std::mutex> lock(one_at_a_time);
  internal::BeginEndingPooledThreads();
  live_threads().WaitForNone();
  internal::FinishEndingPooledThreads();
}

namespace internal {
void BeginThread() {
  live_threads().Begin();
}
void EndThread() {
  live_threads().End();
}
}  // namespace internal

void Gate::Open() {
  std::lock_guard<std::mutex> lock(mutex_);
  open_ = true;
  ++openings_;
  opened_.notify_all();
}

void Gate::Close() {
  std::lock_guard<std::mutex> lock(mutex_);
  open_ = false;
}

void Gate::Wait() {
  std::unique_lock<std::mutex> lock(mutex_);
  const std::uint64_t openings = openings_;
  opened_.wait(lock, [&] { return open_ || openings_ != openings; });
}

void CompletionEvent::Signal() {
  // Notified under the lock: a waiter may destroy the event as soon as it sees it signalled.
  std::lock_guard<std::mutex> lock(mutex_);
  signalled_ = true;
  signalled_changed_.notify_all();
}

void CompletionEvent::Wait() {
  std::unique_lock<std::mutex> lock(mutex_);
  signalled_changed_.wait(lock, [this] { return signalled_; });
}

bool CompletionEvent::WaitFor(std::chrono::milliseconds time) {
  std::unique_lock<std::mutex> lock(mutex_);
  return signalled_changed_.wait_for(lock, time, [this] { return signalled_; });
}

}  // namespace tessel::threads

extern "C" void tessel_shutdown(void) {
  tessel::threads::Shutdown();
}
