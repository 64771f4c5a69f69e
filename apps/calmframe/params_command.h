#pragma once

#include <string>

#include "apps/calmframe/command.h"
#include "apps/calmframe/controls.h"

namespace calmframe {

// `calmframe params`: what the effect can be told, with ranges, defaults and present values.
class ParamsCommand final : public Command {
 public:
  explicit ParamsCommand(CLI::App& program);
  void Run() override;

 private:
  std::string project_;
  ControlFlags controls_;
  bool json_ = false;
};

}  // namespace calmframe
