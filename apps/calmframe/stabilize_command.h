#pragma once

#include <string>
#include <vector>

#include "apps/calmframe/command.h"
#include "apps/calmframe/controls.h"
#include "apps/calmframe/progress_line.h"
#include "host/media/clip.h"
#include "host/stabilize/steady_clip.h"

namespace calmframe {

// How much a command tells, and how many processors it uses.
struct RunFlags {
  int threads = 0;  // 0: all processors
  bool quiet = false;
  bool json = false;

  ProgressLine::Form progress_form() const {
    if (json) return quiet ? ProgressLine::Form::json_end : ProgressLine::Form::json;
    return quiet ? ProgressLine::Form::none : ProgressLine::Form::line;
  }
};
void AddRunFlags(CLI::App& command, RunFlags& flags);

// What of each frame is shown.
struct WindowFlags {
  // The effect's own crop window, or one that follows the picture. By the controls: the latter
  // where all that shape the path and its window are as they come.
  enum class Kind { by_controls, steady, follow } kind = Kind::by_controls;
  double most_zoom = 0;  // 0: as the control Maximum Scale has it
};

// How the result is framed and written.
struct OutputFlags {
  WindowFlags window;
  media::EncodeSettings encode;
  int depth = 0;  // see RenderClip
};
void AddOutputFlags(CLI::App& command, OutputFlags& flags);

// From a file to a file. `project`: where saved work is taken up, if it is there, and left; empty
// for none. Throws media::Failure, UsageFailure, SolveFailure, host::ProjectFailure, Interrupted.
void Stabilize(const std::string& input, const std::string& output, const std::string& project,
               const ControlFlags& controls, const OutputFlags& flags, int threads,
               ProgressLine& progress);

// What a user should know of the crop: that much is lost, or all. No line where all is well.
struct CropTrouble {
  std::string line;
  bool nothing_seen = false;
};
CropTrouble CropTroubleOf(host::SteadyClip& clip);

// After the clip's work: chooses what is shown of it, tells what there is to tell of that, and
// refuses a clip of which nothing would be seen. Throws SolveFailure, UsageFailure, Interrupted.
void Frame(host::SteadyClip& clip, const WindowFlags& flags, ProgressLine& progress);

// What came out of it, behind all else that a run says.
void TellOutcome(host::SteadyClip& clip, ProgressLine& progress);

// Refuses a clip of which nothing would be seen, and tells of one that loses much.
void CheckCrop(host::SteadyClip& clip, ProgressLine& progress);

// `calmframe stabilize IN OUT`. Added to the program's parser; runs when that has chosen it.
class StabilizeCommand final : public Command {
 public:
  explicit StabilizeCommand(CLI::App& program);
  bool json() const override { return run_.json; }
  std::vector<std::string> Kept() const override { return {project_}; }
  void Run() override;

 private:
  std::string input_, output_, project_;
  ControlFlags controls_;
  OutputFlags flags_;
  RunFlags run_;
};

}  // namespace calmframe
