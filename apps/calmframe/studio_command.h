#pragma once

#include <string>
#include <vector>

#include "apps/calmframe/command.h"

namespace calmframe {

// `calmframe studio [CLIP...]`. Added to the program's parser; runs when that has chosen it.
class StudioCommand final : public Command {
 public:
  explicit StudioCommand(CLI::App& program);
  void Run() override;

 private:
  std::vector<std::string> clips_, roots_;
  std::string session_, listen_, name_, password_file_;
  int port_ = 0;
  bool no_browser_ = false;
};

// What the studio starts for each clip, `calmframe studio-worker SOCKET`; in no list.
class StudioWorkerCommand final : public Command {
 public:
  explicit StudioWorkerCommand(CLI::App& program);
  void Run() override;

 private:
  int socket_ = -1;
  std::vector<std::string> folders_;  // that it may read and write
};

// What it starts where a clip to try is asked for, `calmframe studio-sample OUT`; in no list.
class StudioSampleCommand final : public Command {
 public:
  explicit StudioSampleCommand(CLI::App& program);
  bool json() const override { return true; }
  void Run() override;

 private:
  std::string output_;
};

}  // namespace calmframe
