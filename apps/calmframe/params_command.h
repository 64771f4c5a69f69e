#pragma once

#include <CLI/CLI.hpp>
#include <string>

#include "apps/calmframe/controls.h"

namespace calmframe {

// `calmframe params`: what the effect can be told, with ranges, defaults and present values.
class ParamsCommand {
 public:
  explicit ParamsCommand(CLI::App& program);
  bool chosen() const { return command_->parsed(); }
  void Run();

 private:
  CLI::App* const command_;
  std::string project_;
  ControlFlags controls_;
  bool json_ = false;
};

}  // namespace calmframe
