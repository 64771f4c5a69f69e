#pragma once

#include <string>
#include <vector>

#include "apps/calmframe/command.h"
#include "apps/calmframe/stabilize_command.h"

namespace calmframe {

// `calmframe demo [DIR]`: makes a shaky sample of a procedural scene, steadies it, and writes both
// and a side-by-side.
class DemoCommand final : public Command {
 public:
  explicit DemoCommand(CLI::App& program);
  bool json() const override { return run_.json; }
  std::vector<std::string> Kept() const override;
  void Run() override;

 private:
  std::string directory_ = "calmframe-demo";
  int frames_ = 240;
  ControlFlags controls_;
  OutputFlags flags_;
  RunFlags run_;
};

}  // namespace calmframe
