#pragma once

#include <string>
#include <vector>

#include "apps/calmframe/command.h"
#include "apps/calmframe/stabilize_command.h"

namespace calmframe {

// `calmframe report`: saved work as a page to look at.
class ReportCommand final : public Command {
 public:
  explicit ReportCommand(CLI::App& program);
  bool json() const override { return run_.json; }
  std::vector<std::string> Kept() const override { return {project_}; }
  void Run() override;

 private:
  std::string project_, output_;
  int shot_ = 1;
  bool overwrite_ = false;
  host::WindowSettings window_;
  RunFlags run_;
};

}  // namespace calmframe
