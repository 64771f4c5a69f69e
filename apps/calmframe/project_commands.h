#pragma once

#include <CLI/CLI.hpp>
#include <cstddef>
#include <string>

#include "apps/calmframe/stabilize_command.h"

namespace calmframe {

// `calmframe render --project P OUT`: draws saved work, or a range of its frames.
class RenderCommand {
 public:
  explicit RenderCommand(CLI::App& program);
  bool chosen() const { return command_->parsed(); }
  bool json() const { return run_.json; }
  void Run();

 private:
  CLI::App* const command_;
  std::string project_, output_;
  std::size_t from_ = 0, to_ = 0;  // to_ 0: to the end
  OutputFlags flags_;
  RunFlags run_;
};

// `calmframe info P`: what a project holds, and whether it still fits its clip.
class InfoCommand {
 public:
  explicit InfoCommand(CLI::App& program);
  bool chosen() const { return command_->parsed(); }
  void Run();

 private:
  CLI::App* const command_;
  std::string project_;
  bool json_ = false;
};

// `calmframe tracks P OUT.trk`: the tracks, through the effect's own button.
class TracksCommand {
 public:
  explicit TracksCommand(CLI::App& program);
  bool chosen() const { return command_->parsed(); }
  void Run();

 private:
  CLI::App* const command_;
  std::string project_, output_;
  bool overwrite_ = false;
};

}  // namespace calmframe
