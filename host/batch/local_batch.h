#pragma once

#include <cstddef>
#include <cstdint>
#include <string>
#include <vector>

#include "host/batch/plan.h"
#include "host/batch/run_task.h"

namespace calmframe::batch {

// How many tasks are run at a time on this machine.
struct LocalSettings {
  int jobs = 1;
  int processors = 1;       // shared among them
  std::int64_t memory = 0;  // tasks at a time are expected to take no more, bytes; 0: no limit
};

// As many as there are processors, and as have room in most of the memory; `jobs` above 0: so many,
// whatever the memory.
LocalSettings SettingsFor(int processors, std::int64_t memory, int jobs);

// Whoever waits for a batch. Called on the thread that waits.
class BatchWatcher {
 public:
  virtual ~BatchWatcher() = default;
  // Some ten times a second. shares: 0 to 1 of each task; working: how many are run just now.
  virtual void Show(const std::vector<double>& shares, std::size_t working) = 0;
  virtual void Ended(std::size_t task, const TaskResult& result) = 0;
  // A line about how it goes.
  virtual void Note(const std::string& /*line*/) {}
  virtual bool Stops() = 0;
};

// Runs all tasks of the plan, those first that are expected to take longest; one that another run
// is busy with is waited for at the end. Returns when each has ended, or once the watcher stops
// them; then those that weren't ended are told of by nothing.
void RunLocally(const Plan& plan, const LocalSettings& settings, BatchWatcher& watcher);

}  // namespace calmframe::batch
