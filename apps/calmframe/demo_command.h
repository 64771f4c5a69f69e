#pragma once

#include <CLI/CLI.hpp>
#include <string>

#include "apps/calmframe/stabilize_command.h"

namespace calmframe {

// `calmframe demo [DIR]`: makes a shaky sample of a procedural scene, steadies it, and writes both
// and a side-by-side.
class DemoCommand {
 public:
  explicit DemoCommand(CLI::App& program);
  bool chosen() const { return command_->parsed(); }
  bool json() const { return run_.json; }
  void Run();

 private:
  CLI::App* const command_;
  std::string directory_ = "calmframe-demo";
  int frames_ = 240;
  ControlFlags controls_;
  OutputFlags flags_;
  RunFlags run_;
};

}  // namespace calmframe
