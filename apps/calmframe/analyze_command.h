#pragma once

#include <CLI/CLI.hpp>
#include <string>

#include "apps/calmframe/controls.h"
#include "apps/calmframe/stabilize_command.h"
#include "apps/calmframe/steady_clip.h"

namespace calmframe {

// `calmframe analyze IN`: what the effect makes of a clip, without rendering it.
class AnalyzeCommand {
 public:
  explicit AnalyzeCommand(CLI::App& program);
  bool chosen() const { return command_->parsed(); }
  bool json() const { return run_.json; }
  void Run();

 private:
  void Analyze(Opening opening, ProgressLine& progress) const;

  CLI::App* const command_;
  std::string input_, project_;
  ControlFlags controls_;
  RunFlags run_;
};

}  // namespace calmframe
