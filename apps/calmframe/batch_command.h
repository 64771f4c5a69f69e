#pragma once

#include <string>
#include <vector>

#include "apps/calmframe/batch_results.h"
#include "apps/calmframe/command.h"
#include "apps/calmframe/stabilize_command.h"
#include "host/batch/slurm_batch.h"

namespace calmframe {

// `calmframe batch`: what `stabilize` does, of many clips.
class BatchCommand final : public Command {
 public:
  explicit BatchCommand(CLI::App& program);
  bool json() const override { return run_.json; }
  std::vector<std::string> Kept() const override { return {folder_}; }
  void Run() override;

 private:
  // What is given on to each clip's run, as its words, sorted.
  std::vector<std::string> Settings() const;
  // False where nobody waits for what was begun.
  bool RunTasks(const batch::Plan& plan, BatchResults& results) const;
  // The same, with each clip in pieces.
  void RunInPieces(const batch::Plan& plan, BatchResults& results) const;
  // Returns when all have ended or the watcher stops them.
  void RunAll(const batch::Plan& plan, batch::BatchWatcher& watcher) const;
  batch::SlurmSettings Cluster() const;
  // Those of Settings() that a command takes.
  std::vector<std::string> SettingsTakenBy(const std::string& command) const;

  std::vector<std::string> inputs_;
  std::string folder_, name_ = "{stem}-steady{ext}";
  bool recursive_ = false, reports_ = false, detaches_ = false;
  std::string on_ = "here", sbatch_args_;
  int clips_a_job_ = 0;
  bool splits_ = false;
  std::size_t frames_a_piece_ = 0;
  int jobs_ = 0;  // 0: by the machine
  const CLI::App& program_;
  // These are for the runs of the clips.
  host::ShotRequest shots_;
  ControlFlags controls_;
  OutputFlags flags_;
  std::vector<const CLI::Option*> given_on_;
  RunFlags run_;
};

// Not among the commands that help lists: a job of an array on a cluster, which does its part of a
// batch.
class BatchJobCommand final : public Command {
 public:
  explicit BatchJobCommand(CLI::App& program);
  void Run() override;

 private:
  std::string plan_;
};

// Nor is this: writes where a film's shots lie as an object, for whoever works them apart.
class BatchShotsCommand final : public Command {
 public:
  explicit BatchShotsCommand(CLI::App& program);
  bool json() const override { return run_.json; }
  void Run() override;

 private:
  void Find(host::Opening opening, ProgressLine& progress) const;

  std::string input_, output_;
  host::ShotRequest shots_;
  RunFlags run_;
};

// Nor is this: see batch::kGlancesCommand.
class BatchGlancesCommand final : public Command {
 public:
  explicit BatchGlancesCommand(CLI::App& program);
  void Run() override;

 private:
  std::vector<std::string> inputs_;
};

// Nor is this: prints how a clip looks before and after as an object,
// for the page of a batch, whose own process opens no clip for it.
class BatchPicturesCommand final : public Command {
 public:
  explicit BatchPicturesCommand(CLI::App& program);
  void Run() override;

 private:
  std::string before_, after_;
};

}  // namespace calmframe
