#pragma once

#include <CLI/CLI.hpp>
#include <string>

#include "apps/calmframe/stabilize_command.h"

namespace calmframe {

// `calmframe report`: saved work as a page to look at.
class ReportCommand {
 public:
  explicit ReportCommand(CLI::App& program);
  bool chosen() const { return command_->parsed(); }
  bool json() const { return run_.json; }
  void Run();

 private:
  CLI::App* const command_;
  std::string project_, output_;
  bool overwrite_ = false;
  RunFlags run_;
};

}  // namespace calmframe
