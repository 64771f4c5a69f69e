#pragma once

#include <string>
#include <vector>

#include "apps/calmframe/command.h"
#include "apps/calmframe/stabilize_command.h"

namespace calmframe {

// `calmframe gather PROJECT...` makes the saved work of a film from that of its stretches. Added to
// the program's parser; runs when that has chosen it.
class GatherCommand final : public Command {
 public:
  explicit GatherCommand(CLI::App& program);
  void Run() override;

 private:
  std::string project_;
  std::vector<std::string> parts_;
  bool overwrite_ = false;
};

// `calmframe join OUT SEGMENT...` writes a film from segments of it.
class JoinCommand final : public Command {
 public:
  explicit JoinCommand(CLI::App& program);
  bool json() const override { return run_.json; }
  void Run() override;

 private:
  std::string output_, project_;
  std::vector<std::string> segments_;
  bool overwrite_ = false;
  RunFlags run_;
};

}  // namespace calmframe
