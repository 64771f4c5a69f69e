#pragma once

#include <string>
#include <vector>

#include "apps/calmframe/batch_results.h"
#include "apps/calmframe/command.h"
#include "apps/calmframe/stabilize_command.h"

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

  std::vector<std::string> inputs_;
  std::string folder_, name_ = "{stem}-steady{ext}";
  bool recursive_ = false, reports_ = false, detaches_ = false;
  std::string on_ = "here", sbatch_args_;
  int clips_a_job_ = 0;
  int jobs_ = 0;  // 0: by the machine
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
