#pragma once

#include <string>
#include <vector>

#include "apps/calmframe/command.h"
#include "apps/calmframe/stabilize_command.h"

namespace calmframe {

// `calmframe render --project P OUT`: draws saved work, or a range of its frames.
class RenderCommand final : public Command {
 public:
  explicit RenderCommand(CLI::App& program);
  bool json() const override { return run_.json; }
  std::vector<std::string> Kept() const override { return {project_}; }
  void Run() override;

 private:
  // Of the clip's frames. Throws UsageFailure where not all of them were worked.
  media::FrameRange RangeOf(const host::Film& film) const;

  std::string project_, output_;
  Stretch stretch_;
  OutputFlags flags_;
  RunFlags run_;
};

// `calmframe info P`: what a project holds, and whether it still fits its clip.
class InfoCommand final : public Command {
 public:
  explicit InfoCommand(CLI::App& program);
  void Run() override;

 private:
  std::string project_;
  bool json_ = false;
};

// `calmframe tracks P OUT.trk`: the tracks, through the effect's own button.
class TracksCommand final : public Command {
 public:
  explicit TracksCommand(CLI::App& program);
  void Run() override;

 private:
  std::string project_, output_;
  int shot_ = 1;
  bool overwrite_ = false;
};

}  // namespace calmframe
