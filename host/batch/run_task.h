#pragma once

#include <string>

#include "host/batch/plan.h"

namespace calmframe::batch {

struct TaskResult {
  enum class State {
    done,
    unchanged,  // was done before
    failed,
    stopped,  // by the watcher; what was saved of it is taken up again
    busy      // by another run, which holds its lock; nothing was done
  } state = State::failed;
  Record record;  // of all but stopped and busy
};

// Whoever waits for a task. Called on the thread that runs it.
class TaskWatcher {
 public:
  virtual ~TaskWatcher() = default;
  // How far it is, 0 to 1, never less than before, and its stage.
  virtual void Show(double share, const std::string& stage) = 0;
  // Asked some ten times a second. Once true it stays so.
  virtual bool Stops() = 0;
};

// Does one task as far as it is not done: under its lock runs the plan's program on the clip, sees
// whether that is still the same, gives the output its name, and leaves a record. A program that
// fails or crashes is a failed task; nothing is thrown for it. threads: processors that the program
// may use. Thread safe for different tasks; of one task the second is busy.
TaskResult RunTask(const Plan& plan, const Task& task, int threads, TaskWatcher& watcher);

// How far a task that runs somewhere has come, 0 to 1; 0 where none does.
double ShareOf(const Plan& plan, const Task& task);

}  // namespace calmframe::batch
