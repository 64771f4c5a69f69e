#include "platform/tessel/threads.h"

#include <tbb/blocked_range.h>
#include <tbb/global_control.h>
#include <tbb/parallel_for.h>

#include <atomic>
#include <condition_variable>
#include <list>
#include <mutex>
#include <new>
#include <thread>
#include <utility>

#include "platform/tessel/shutdown.h"
#include "platform/tessel/threads_internal.h"
#include "platform/tessel/undying.h"

namespace tessel::threads {
namespace {

// The pool itself had no memory, or a thread of it could not be started. It counts what it lacks
// all the same, and whoever waits for its threads to leave waits for ever.
std::atomic<bool> pool_is_broken = false;

}  // namespace

void ExecuteCPUBoundTaskOnAllProcessors(const boost::function<void(std::size_t)>& task,
                                        std::size_t count) {
  // The pool orders the tasks between the caller's code before and after them, but inside a library
  // that the thread sanitizer cannot see; these two say the same where it can.
  std::atomic<bool> begun = false, task_failed = false;
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
  try {
    tbb::parallel_for(
        tbb::blocked_range<std::size_t>(0, count, 1),
        [&](const tbb::blocked_range<std::size_t>& range) {
          (void)begun.load(std::memory_order_acquire);
          const End end{ended};
          try {
            for (std::size_t i = range.begin(); i != range.end(); ++i) task(i);
          } catch (...) {
            task_failed = true;
            throw;
          }
        },
        tbb::simple_partitioner());
  } catch (...) {
    if (!task_failed) pool_is_broken = true;
    throw;
  }
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

ProcessorLimit::~ProcessorLimit() {
  if (pool_is_broken) (void)state_.release();  // its end waits for the pool's threads
}

namespace {

// Threads that may run tasks. All are joined in the end: one that was let go could still be on its
// way out of this library's code when the library is unloaded.
class LiveThreads {
 public:
  void Start(boost::function<void()> body) {
    JoinEnded();
    std::lock_guard<std::mutex> lock(mutex_);
    const auto at = live_.emplace(live_.end());
    try {
      *at = std::thread([this, at, body = std::move(body)]() mutable {
        body();
        body.clear();  // what it holds must be gone before Shutdown returns
        End(at);
      });
    } catch (...) {
      live_.erase(at);
      throw;
    }
  }

  void WaitForNone() {
    {
      std::unique_lock<std::mutex> lock(mutex_);
      none_left_.wait(lock, [this] { return live_.empty(); });
    }
    JoinEnded();
  }

  void JoinEnded() {
    std::list<std::thread> ended;
    {
      std::lock_guard<std::mutex> lock(mutex_);
      ended.swap(ended_);
    }
    for (std::thread& thread : ended) {
      if (thread.joinable()) thread.join();
    }
  }

  // The process ends, and waits for none that is at work.
  void LetGo() {
    {
      std::lock_guard<std::mutex> lock(mutex_);
      for (std::thread& thread : live_) thread.detach();
    }
    JoinEnded();
  }

 private:
  using Threads = std::list<std::thread>;

  void End(Threads::iterator at) {
    std::lock_guard<std::mutex> lock(mutex_);
    ended_.splice(ended_.end(), live_, at);
    if (live_.empty()) none_left_.notify_all();
  }

  std::mutex mutex_;
  std::condition_variable none_left_;
  Threads live_, ended_;  // guarded by mutex_
};

LiveThreads& live_threads() {
  static utility::Undying<LiveThreads> threads;  // outlives its threads
  return *threads;
}

// The pool's threads are told to leave when the last thread that used it ends, and nobody waits for
// them: they could still be on their way out when the library is unloaded, or at the process's end.
// The pool comes back with the next loop. Where another thread is still at a loop this waits for
// nothing.
void EndLoopThreads() {
  if (pool_is_broken) return;
  try {
    tbb::task_scheduler_handle pool{tbb::attach{}};
    tbb::finalize(pool, std::nothrow);
  } catch (const std::bad_alloc&) {
    pool_is_broken = true;
  }
}

// What has ended is joined at the process's end, too, where nobody shut down.
struct JoinAtExit {
  ~JoinAtExit() {
    live_threads().LetGo();
    EndLoopThreads();
  }
};
const JoinAtExit join_at_exit;

// A thread a task. A solve runs for minutes and may wait for a frame or a lock of its host: on the
// pool of the parallel loops it would hold a worker that renders need, and two solves on a
// one-processor machine would queue.
class ThreadPerTask final : public Executor {
 public:
  void Post(boost::function<void()> task) override { live_threads().Start(std::move(task)); }
};

}  // namespace

Executor& GetCPUBoundExecutor() {
  static ThreadPerTask& executor = *new ThreadPerTask;  // outlives its threads
  return executor;
}

void Shutdown() {
  static utility::Undying<std::mutex> one_at_a_time;
  std::lock_guard<std::mutex> lock(*one_at_a_time);
  internal::BeginEndingPooledThreads();
  live_threads().WaitForNone();
  internal::FinishEndingPooledThreads();
  EndLoopThreads();
}

namespace internal {
void StartThread(boost::function<void()> body) {
  live_threads().Start(std::move(body));
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
