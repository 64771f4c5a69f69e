#pragma once

#include <chrono>
#include <string>

#include "pipeline/stabilize.h"

namespace calmframe {

// Shows a stage's share, speed and time left: on a terminal one line that is written over,
// elsewhere a line at the start and the end of each stage. Watches Ctrl-C.
class ProgressLine final : public pipeline::Listener {
 public:
  explicit ProgressLine(bool quiet);
  ~ProgressLine() override;

  void Progress(const char* stage, double done, double total, const char* unit) override;
  bool Cancelled() override;
  void Warn(const std::string& line) override;

 private:
  void Show(const std::string& text, bool last);

  const bool quiet_;
  const bool terminal_;
  std::string stage_;
  std::chrono::steady_clock::time_point stage_begin_;
  std::chrono::steady_clock::time_point last_shown_;
  bool line_open_ = false;
};

// One line of a stage, without a newline: "rendering   42 %  126/300 frames  18.3 frames/s  0:09
// left".
std::string ProgressText(const std::string& stage, double done, double total,
                         const std::string& unit, double elapsed_seconds);

// From now on the first Ctrl-C (or SIGTERM) asks the running stage to end; a second one ends the
// program at once.
void CatchInterrupts();
bool InterruptAsked();

}  // namespace calmframe
