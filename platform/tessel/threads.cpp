#include "platform/tessel/threads.h"

#include <tbb/blocked_range.h>
#include <tbb/global_control.h>
#include <tbb/parallel_for.h>

#include <thread>

namespace tessel::threads {

void ExecuteCPUBoundTaskOnAllProcessors(const boost::function<void(std::size_t)>& task,
                                        std::size_t count) {
  tbb::parallel_for(
      tbb::blocked_range<std::size_t>(0, count, 1),
      [&](const tbb::blocked_range<std::size_t>& range) {
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

// A thread a task. A solve runs for minutes and may wait for a frame or a lock of its host: on the
// pool of the parallel loops it would hold a worker that renders need, and two solves on a
// one-processor machine would queue.
class ThreadPerTask final : public Executor {
 public:
  void Post(boost::function<void()> task) override {
    std::thread([task = std::move(task)] { task(); }).detach();
  }
};

}  // namespace

Executor& GetCPUBoundExecutor() {
  static ThreadPerTask& executor = *new ThreadPerTask;  // outlives detached threads
  return executor;
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
