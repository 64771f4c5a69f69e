#pragma once

#include <CLI/CLI.hpp>
#include <string>

#include "pipeline/stabilize.h"

namespace calmframe {

// Adds the controls, each under its own name, to a command.
void AddControlFlags(CLI::App& command, kelp::effect::Controls& controls);

// Adds how the result is written.
struct OutputFlags {
  pipeline::Output output;
  int threads = 0;  // 0: all processors
  bool quiet = false;
};
void AddOutputFlags(CLI::App& command, OutputFlags& flags);

// `calmframe stabilize IN OUT`. Added to the program's parser; runs when that has chosen it.
class StabilizeCommand {
 public:
  explicit StabilizeCommand(CLI::App& program);
  bool chosen() const { return command_->parsed(); }
  void Run();

 private:
  CLI::App* const command_;
  std::string input_;
  kelp::effect::Controls controls_;
  OutputFlags flags_;
};

}  // namespace calmframe
