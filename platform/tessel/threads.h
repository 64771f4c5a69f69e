#pragma once

#include <boost/function.hpp>
#include <boost/shared_ptr.hpp>
#include <chrono>
#include <condition_variable>
#include <cstddef>
#include <memory>
#include <mutex>

namespace tessel::threads {

// Runs task(0) .. task(count - 1), each once, spread over all processors in no given order, and
// returns when all have run. The first exception a task throws is rethrown here; tasks not yet
// begun are then left out. May be called from several threads at once, and from within a task.
void ExecuteCPUBoundTaskOnAllProcessors(const boost::function<void(std::size_t)>& task,
                                        std::size_t count);

// While it lives, parallel loops use at most `processors` processors; 0 sets no limit. For a
// program to make at its start.
class ProcessorLimit {
 public:
  explicit ProcessorLimit(int processors);
  ~ProcessorLimit();
  ProcessorLimit(const ProcessorLimit&) = delete;
  ProcessorLimit& operator=(const ProcessorLimit&) = delete;

 private:
  struct State;
  std::unique_ptr<State> state_;
};

// Runs posted tasks in the background. A task that lets an exception out ends the program: tasks
// keep their failures.
class Executor {
 public:
  virtual ~Executor() = default;
  virtual void Post(boost::function<void()> task) = 0;
};

// The process's executor for long computations. Tasks may run at the same time as each other; none
// waits for another to end. Lives until the process ends, which waits for no task.
Executor& GetCPUBoundExecutor();

// Manual-reset event: once signalled, every wait returns at once, for good.
class CompletionEvent {
 public:
  void Signal();
  void Wait();
  // Whether it was signalled within the time.
  bool WaitFor(std::chrono::milliseconds time);

 private:
  std::mutex mutex_;
  std::condition_variable signalled_changed_;
  bool signalled_ = false;  // guarded by mutex_
};

}  // namespace tessel::threads
