#pragma once

#include <boost/function.hpp>
#include <boost/shared_ptr.hpp>
#include <chrono>
#include <condition_variable>
#include <cstddef>
#include <cstdint>
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
// waits for another to end. Lives until the process ends, which waits for no task unless Shutdown
// is called.
Executor& GetCPUBoundExecutor();

// A queue of tasks with a thread of its own: tasks run one at a time, in the order of the times at
// which they fall due, and those of one time in the order of posting. A task that lets an exception
// out ends the program. Every operation may be called from any thread, the executor's own too, and
// none but WaitPoint waits. The order of the operations is part of the interface.
class SingleThreadedExecutor {
 public:
  virtual ~SingleThreadedExecutor() = default;
  // The task falls due `delay_ms` milliseconds from now. False, and the task is dropped, once the
  // queue has ended or the executor was given back.
  virtual bool Post(boost::function<void()> task, std::uint32_t delay_ms) = 0;
  // No new task begins and WaitPoint blocks, until Resume. Not counted.
  virtual void Pause() = 0;
  virtual void Resume() = 0;
  // For a task to call now and then: blocks while the executor is paused.
  virtual void WaitPoint() = 0;
  virtual bool IsOwnThread() const = 0;
  // Lifts a pause for good. Tasks that were posted still run, delayed ones at once; no new ones.
  virtual void EndQueue() = 0;
};

using SingleThreadedExecutorPtr = boost::shared_ptr<SingleThreadedExecutor>;

// An executor on a pooled thread that is nobody else's until it was given back and its tasks, the
// delayed ones at their times, have run.
SingleThreadedExecutorPtr BorrowTemporarySingleThreadedExecutor();
// Waits for nothing, so that an executor's own task may call it. Lifts a pause for good.
void ReturnTemporarySingleThreadedExecutor(const SingleThreadedExecutorPtr& executor);

// Ends the queues of all single-threaded executors, borrowed ones too, and waits until every
// background task has run and been destroyed and the pooled threads have ended. For a host before
// it unloads a plug-in, whose tasks they may be; tasks that wait for the caller must be cancelled
// first. Not to be called from a task. Executors may be asked for again afterwards.
void Shutdown();

// Manual-reset gate for any number of waiters; closed at first. A waiter that Open finds waiting
// gets through, though the gate may be closed again before it runs.
class Gate {
 public:
  void Open();
  void Close();
  void Wait();

 private:
  std::mutex mutex_;
  std::condition_variable opened_;
  bool open_ = false;           // guarded by mutex_
  std::uint64_t openings_ = 0;  // guarded by mutex_
};

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
