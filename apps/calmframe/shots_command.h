#pragma once

#include <string>

#include "apps/calmframe/command.h"
#include "apps/calmframe/stabilize_command.h"

namespace calmframe {

// `calmframe shots CLIP`: where the shots of a film begin, in one of several forms.
class ShotsCommand final : public Command {
 public:
  explicit ShotsCommand(CLI::App& program);
  bool json() const override { return run_.json; }
  void Run() override;

 private:
  void List(host::Opening opening, ProgressLine& progress) const;

  std::string input_, form_ = "text";
  Stretch stretch_;
  RunFlags run_;
};

}  // namespace calmframe
