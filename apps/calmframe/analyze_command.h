#pragma once

#include <string>
#include <vector>

#include "apps/calmframe/command.h"
#include "apps/calmframe/controls.h"
#include "apps/calmframe/stabilize_command.h"
#include "host/stabilize/film.h"

namespace calmframe {

// `calmframe analyze IN`: what the effect makes of a clip, without rendering it.
class AnalyzeCommand final : public Command {
 public:
  explicit AnalyzeCommand(CLI::App& program);
  bool json() const override { return run_.json; }
  std::vector<std::string> Kept() const override { return {project_}; }
  void Run() override;

 private:
  void Analyze(host::Opening opening, ProgressLine& progress) const;

  std::string input_, project_;
  Stretch stretch_;
  host::ShotRequest shots_;
  ControlFlags controls_;
  host::WindowSettings window_;
  bool chooses_ = false;
  RunFlags run_;
};

}  // namespace calmframe
