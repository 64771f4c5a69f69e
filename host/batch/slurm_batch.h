#pragma once

#include <cstddef>
#include <map>
#include <stdexcept>
#include <string>
#include <utility>
#include <vector>

#include "host/batch/local_batch.h"
#include "host/batch/plan.h"

namespace calmframe::batch {

// The cluster isn't there, or refuses the jobs; one line.
class ClusterFailure : public std::runtime_error {
 public:
  using std::runtime_error::runtime_error;
};

struct SlurmSettings {
  std::vector<std::string> flags;  // further ones of sbatch
  int retries = 2;                 // of a task that was lost or killed
  int clips_a_job = 0;             // 0: as many as make some minute's work
};

// The tasks that are left to do, as groups for a job each: long ones by themselves, short ones
// together, or so many of each, the longest first, and no more groups than an array of jobs may
// have;
// those that are `left_out`, a task each, are in none.
std::vector<std::vector<std::size_t>> GroupsOf(const Plan& plan, int clips_a_job,
                                               const std::vector<bool>& left_out);

// Runs a plan's tasks as arrays of jobs of Slurm, by sbatch, squeue and scancel. All machines see
// the plan's folder, the clips and the program under the same names; how tasks go and end is read
// from the files in the folder.
class SlurmBatch {
 public:
  // The watcher outlives it. Throws ClusterFailure.
  SlurmBatch(const Plan& plan, const SlurmSettings& settings, BatchWatcher& watcher);

  // Hands the tasks that are left to do to the cluster, but for those that jobs of an earlier run
  // have still before them. False where there is nothing to wait for. Throws ClusterFailure.
  bool Submit();

  // Returns when all have ended, each told to the watcher; those that a job left without a result,
  // or whose program was killed, are submitted again, so many times. Once the watcher stops it, the
  // jobs are cancelled. Throws ClusterFailure.
  void Wait();

 private:
  // An array of jobs: which tasks each of its elements has.
  struct Array {
    std::string job;
    std::vector<std::vector<std::size_t>> groups;
  };
  struct Element {
    bool is_there = false, is_running = false;
  };

  // What the cluster has of each array's elements. False where it doesn't answer.
  bool Look();
  void Adopt();
  // The number of the array.
  std::string Submit(std::vector<std::vector<std::size_t>> groups);
  void TakeResult(std::size_t task);
  void Follow();
  void Cancel();

  using Elements = std::map<std::pair<std::string, std::size_t>, Element>;

  const Plan& plan_;
  const SlurmSettings settings_;
  BatchWatcher& watcher_;
  std::vector<Array> arrays_;
  Elements there_;              // as it was looked last
  std::vector<bool> ended_;     // a task each, as all of these
  std::vector<int> submitted_;  // how often
  std::vector<double> shares_;
  std::vector<std::string> killed_;  // why the last try ended, of those that were killed
  std::size_t working_ = 0;
  int unanswered_ = 0;  // times that the cluster told nothing, in a row
};

// A job of an array: does the tasks of this group of a plan that Submit has left in `path`, one
// after the other. Throws std::runtime_error where there is no such plan.
void RunGroup(const std::string& path, std::size_t group, int threads, TaskWatcher& watcher);

}  // namespace calmframe::batch
